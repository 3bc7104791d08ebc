// The string functions. The two conversions are compared with a plain model written from their
// description, the comparisons with the C library's, and the inserters with a loop that inserts
// one character at a time.
#include <koru/string.h>

#include <doctest/doctest.h>

#include <locale.h>
#include <pthread.h>
#include <strings.h>
#include <sys/mman.h>
#include <sys/resource.h>
#include <unistd.h>
#include <wchar.h>
#include <wctype.h>

#include <algorithm>
#include <cctype>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <iomanip>
#include <locale>
#include <new>
#include <random>
#include <sstream>
#include <stdexcept>
#include <streambuf>
#include <string>
#include <thread>
#include <type_traits>
#include <vector>

#include "support/selfexec.h"
#include "support/subprocess.h"
#include "support/tempdir.h"

#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
#define KORU_TEST_SANITIZED true
#else
#define KORU_TEST_SANITIZED false
#endif

#if defined(__SANITIZE_ADDRESS__)
// The C library loses a copy of the search path whenever it loads a locale along LOCPATH.
extern "C" char const* __lsan_default_suppressions();
extern "C" char const* __lsan_default_suppressions() { return "leak:argz_add_sep\n"; }
#endif

namespace {

// ---------------------------------------------------------------------------------- shared helpers

wchar_t unit(std::uint32_t value) { return static_cast<wchar_t>(value); }
std::uint32_t valueOf(wchar_t c) { return static_cast<std::uint32_t>(c); }
char byte(unsigned value) { return static_cast<char>(value & 0xFF); }
unsigned valueOf(char c) { return static_cast<unsigned char>(c); }

std::wstring units(std::vector<std::uint32_t> const& values) {
    std::wstring text;
    for (std::uint32_t const value : values) text += unit(value);
    return text;
}

std::string bytes(std::vector<unsigned> const& values) {
    std::string text;
    for (unsigned const value : values) text += byte(value);
    return text;
}

/// Both widths in hexadecimal, for comparing and for messages.
template <class Char>
std::string hex(std::basic_string<Char> const& text) {
    std::ostringstream out;
    out << std::hex << std::uppercase;
    for (std::size_t i = 0; i < text.size() && i < 160; ++i) {
        out << (i == 0 ? "" : " ") << valueOf(text[i]);
    }
    if (text.size() > 160) out << " ... (" << std::dec << text.size() << ')';
    return out.str();
}

/// The bytes of a text like "C3 A9".
std::string fromHex(std::string const& text) {
    std::istringstream in(text);
    std::string out;
    unsigned value = 0;
    for (in >> std::hex; in >> value;) out += byte(value);
    return out;
}

template <class Char>
std::basic_string<Char> untilNul(std::basic_string<Char> const& text) {
    return text.substr(0, text.find(Char()));
}

/// Joins very many comparisons into one assertion: the first difference, and how many were made.
class Differences {
public:
    template <class Describe>
    void note(bool same, Describe describe) {
        ++compared_;
        if (!same && first_.empty()) first_ = describe();
    }
    template <class Char, class InputChar>
    void expect(std::basic_string<Char> const& actual, std::basic_string<Char> const& expected,
                std::basic_string<InputChar> const& input) {
        note(actual == expected,
             [&] { return hex(input) + " gave " + hex(actual) + " instead of " + hex(expected); });
    }
    std::string const& first() const { return first_; }
    std::size_t compared() const { return compared_; }

private:
    std::string first_;
    std::size_t compared_ = 0;
};

/// The same numbers in every run and on every machine.
class Random {
public:
    explicit Random(std::uint32_t seed) : engine_(seed) {}
    std::uint32_t next() { return static_cast<std::uint32_t>(engine_()); }
    std::uint32_t below(std::uint32_t limit) { return next() % limit; }

private:
    std::mt19937 engine_;
};

/// Readable memory between two pages that must not be touched.
class GuardedMemory {
public:
    GuardedMemory() : page_(static_cast<std::size_t>(::sysconf(_SC_PAGESIZE))) {
        void* const all = ::mmap(nullptr, 4 * page_, PROT_NONE, MAP_PRIVATE | MAP_ANONYMOUS, -1, 0);
        if (all == MAP_FAILED) throw std::runtime_error("mmap failed");
        begin_ = static_cast<char*>(all) + page_;
        if (::mprotect(begin_, 2 * page_, PROT_READ | PROT_WRITE) != 0) {
            throw std::runtime_error("mprotect failed");
        }
    }
    GuardedMemory(GuardedMemory const&) = delete;
    GuardedMemory& operator=(GuardedMemory const&) = delete;
    ~GuardedMemory() { ::munmap(begin_ - page_, 4 * page_); }

    /// The text with its NUL as the last thing before the page behind.
    template <class Char>
    Char const* atEnd(std::basic_string<Char> const& text) {
        return place(text, begin_ + 2 * page_ - (text.size() + 1) * sizeof(Char));
    }
    /// The text as the first thing behind the page before.
    template <class Char>
    Char const* atBegin(std::basic_string<Char> const& text) {
        return place(text, begin_);
    }

private:
    template <class Char>
    Char const* place(std::basic_string<Char> const& text, char* where) {
        std::memcpy(where, text.c_str(), (text.size() + 1) * sizeof(Char));
        return static_cast<Char const*>(static_cast<void*>(where));
    }

    std::size_t page_;
    char* begin_ = nullptr;
};

// --------------------------------------------------------------------- the model of the
// conversions

/// Wide to UTF-8 as described: one to six bytes by the size of the signed value.
std::string modelEncode(std::wstring const& stored) {
    std::string out;
    for (wchar_t const c : untilNul(stored)) {
        std::uint32_t const v = valueOf(c);
        if (static_cast<std::int32_t>(v) <= 0x7F) {
            out += byte(v);
        } else if (v <= 0x7FF) {
            out += bytes({0xC0 | v >> 6, 0x80 | (v & 0x3F)});
        } else if (v <= 0xFFFF) {
            out += bytes({0xE0 | v >> 12, 0x80 | (v >> 6 & 0x3F), 0x80 | (v & 0x3F)});
        } else if (v <= 0x1FFFFF) {
            out += bytes({0xF0 | v >> 18, 0x80 | (v >> 12 & 0x3F), 0x80 | (v >> 6 & 0x3F),
                          0x80 | (v & 0x3F)});
        } else if (v <= 0x3FFFFFF) {
            out += bytes({0xF8 | v >> 24, 0x80 | (v >> 18 & 0x3F), 0x80 | (v >> 12 & 0x3F),
                          0x80 | (v >> 6 & 0x3F), 0x80 | (v & 0x3F)});
        } else {
            out += bytes({0xFC | v >> 30, 0x80 | (v >> 24 & 0x3F), 0x80 | (v >> 18 & 0x3F),
                          0x80 | (v >> 12 & 0x3F), 0x80 | (v >> 6 & 0x3F), 0x80 | (v & 0x3F)});
        }
    }
    return untilNul(out);
}

/// The forms of a character of several bytes, in the order in which they are tried. Each one's
/// last byte has to exist; the last form takes any lead byte.
struct Form {
    std::size_t size;
    unsigned mask;
    unsigned pattern;
    unsigned leadBits;
};
Form const FORMS[] = {{2, 0xE0, 0xC0, 0x1F},
                      {3, 0xF0, 0xE0, 0x0F},
                      {4, 0xF8, 0xF0, 0x07},
                      {5, 0xFC, 0xF8, 0x03},
                      {6, 0x00, 0x00, 0x01}};

/// UTF-8 to wide as described.
std::wstring modelDecode(std::string const& stored) {
    std::string const s = untilNul(stored);
    std::wstring out;
    std::size_t i = 0;
    while (i < s.size()) {
        unsigned const b = valueOf(s[i]);
        std::uint32_t c = b < 0x80 ? b : '?';
        std::size_t taken = 1;
        for (Form const& form : FORMS) {
            if (b < 0x80 || i + form.size > s.size() || (b & form.mask) != form.pattern) continue;
            c = b & form.leadBits;
            for (taken = 1; taken < form.size; ++taken) c = c << 6 | (valueOf(s[i + taken]) & 0x3F);
            break;
        }
        out += unit(c);
        i += taken;
    }
    return untilNul(out);
}

void expectEncoded(Differences& differences, std::wstring const& text) {
    differences.expect(Koru::make_string(text), modelEncode(text), text);
}

void expectDecoded(Differences& differences, std::string const& text) {
    differences.expect(Koru::make_wstring(text), modelDecode(text), text);
}

/// Encoding and, for what is not negative, decoding back again.
void expectSurvives(Differences& differences, std::uint32_t value) {
    std::wstring const text(1, unit(value));
    std::string const encoded = Koru::make_string(text);
    differences.expect(encoded, modelEncode(text), text);
    differences.expect(Koru::make_wstring(encoded), text, encoded);
}

/// Text of every kind of byte: ASCII runs, whole and broken characters, bytes that are neither,
/// and NULs if wanted.
std::string randomBytes(Random& random, std::size_t size, bool withNuls) {
    std::string text;
    while (text.size() < size) {
        switch (random.below(withNuls ? 8 : 7)) {
        case 0:
        case 1:
            for (std::uint32_t n = random.below(40); n > 0; --n)
                text += byte(1 + random.below(127));
            break;
        case 2:
        case 3:
            text += modelEncode(std::wstring(1, unit(1 + (random.next() >> random.below(32)))));
            break;
        case 4:
            for (std::uint32_t n = random.below(9); n > 0; --n)
                text += byte(0x80 + random.below(64));
            break;
        case 5:
            text += byte(0xC0 + random.below(64));
            break;
        case 6:
            text += byte(1 + random.below(255));
            break;
        default:
            text += '\0';
        }
    }
    text.resize(size);
    return text;
}

std::wstring randomUnits(Random& random, std::size_t size, bool withNuls) {
    std::wstring text;
    while (text.size() < size) {
        switch (random.below(withNuls ? 6 : 5)) {
        case 0:
        case 1:
            for (std::uint32_t n = random.below(40); n > 0; --n)
                text += unit(1 + random.below(127));
            break;
        case 2:
        case 3:
            for (std::uint32_t n = random.below(20), shift = random.below(32); n > 0; --n) {
                text += unit((random.next() >> shift) | 1);
            }
            break;
        case 4:
            text += unit(0x80 + random.below(0x780));
            break;
        default:
            text += unit(random.below(2) == 0 ? 0 : 0x80000000U);
        }
    }
    text.resize(size);
    return text;
}

// ------------------------------------------------------------------------------------ C locales

/// The process's C locale for a scope.
class LocaleScope {
public:
    explicit LocaleScope(std::string const& name)
        : set_(::setlocale(LC_ALL, name.c_str()) != nullptr) {}
    LocaleScope(LocaleScope const&) = delete;
    LocaleScope& operator=(LocaleScope const&) = delete;
    ~LocaleScope() { ::setlocale(LC_ALL, "C"); }
    bool isSet() const { return set_; }

private:
    bool set_;
};

/// Names of locales to test in: "C" always, C.UTF-8, Turkish ones (where i and I are not a pair)
/// and a Latin one of single bytes (where bytes above 0x7F have case). What the machine lacks is
/// compiled, if it has the tool and its sources.
class Locales {
public:
    Locales() : names_{"C"} {
        struct Wanted {
            std::string name, source, charset;
        };
        Wanted const table[] = {{"C.UTF-8", "C", "UTF-8"},
                                {"tr_TR.UTF-8", "tr_TR", "UTF-8"},
                                {"tr_TR.ISO-8859-9", "tr_TR", "ISO-8859-9"},
                                {"de_DE.ISO-8859-1", "de_DE", "ISO-8859-1"}};
        for (Wanted const& wanted : table) {
            if (LocaleScope(wanted.name).isSet()) continue;
            compile(wanted.name, wanted.source, wanted.charset);
        }
        // The C library remembers what it did not find, so the path changes only now.
        ::setenv("LOCPATH", (directory_.path() + ":/usr/lib/locale").c_str(), 1);
        for (Wanted const& wanted : table) {
            if (LocaleScope(wanted.name).isSet()) {
                names_.push_back(wanted.name);
            } else {
                MESSAGE("not tested, as this machine lacks it: locale " << wanted.name);
            }
        }
    }

    std::vector<std::string> const& names() const { return names_; }

private:
    void compile(std::string const& name, std::string const& source, std::string const& charset) {
        std::string const target = directory_ / name;
        test::inChild([&] {
            if (std::freopen("/dev/null", "w", stderr) == nullptr) return 1;
            ::execlp("localedef", "localedef", "-i", source.c_str(), "-f", charset.c_str(),
                     target.c_str(), nullptr);
            return 127;
        });
    }

    test::TempDir directory_;
    std::vector<std::string> names_;
};

std::vector<std::string> const& localeNames() {
    static Locales const locales;
    return locales.names();
}

// ------------------------------------------------------------------------------------- compare

int sign(int value) { return (value > 0) - (value < 0); }

int libraryOrder(char const* a, char const* b) { return ::strcasecmp(a, b); }
int libraryOrder(wchar_t const* a, wchar_t const* b) { return ::wcscasecmp(a, b); }

template <class Char>
void expectOrder(Differences& differences, std::basic_string<Char> const& a,
                 std::basic_string<Char> const& b) {
    int const expected = sign(libraryOrder(a.c_str(), b.c_str()));
    bool const same = sign(Koru::compare(a, b)) == expected &&
                      sign(Koru::compare(a.c_str(), b.c_str())) == expected;
    differences.note(same, [&] { return hex(a) + " against " + hex(b); });
}

char swappedCase(char c) { return static_cast<char>(std::isalpha(c & 0x7F) ? c ^ 0x20 : c); }
wchar_t swappedCase(wchar_t c) {
    std::uint32_t const other = ::towlower(static_cast<wint_t>(c));
    return unit(other != valueOf(c) ? other : ::towupper(static_cast<wint_t>(c)));
}

void randomCharacter(Random& random, char& c) {
    c = byte(random.below(3) == 0 ? 1 + random.below(255) : 'A' + random.below(58));
}
void randomCharacter(Random& random, wchar_t& c) {
    std::uint32_t const kind = random.below(8);
    if (kind == 0) c = unit(0x80000000U | random.next());
    if (kind == 1) c = unit(1 + (random.next() >> random.below(31)));
    if (kind == 2) c = unit(0x80 + random.below(0x800));
    if (kind > 2) c = unit('A' + random.below(58));
}

/// A pair of strings as they meet in comparisons: equal but for case, but for one character, but
/// for the length, or with an end marked by NUL inside.
template <class Char>
void expectOrderOfRandomPair(Differences& differences, Random& random) {
    std::basic_string<Char> a(random.below(71), Char());
    for (Char& c : a) randomCharacter(random, c);
    std::basic_string<Char> b = a;
    std::uint32_t const one = 1 + random.below(4);
    for (Char& c : b) {
        if (random.below(one) == 0) c = swappedCase(c);
    }
    std::size_t const where = a.empty() ? 0 : random.below(static_cast<std::uint32_t>(a.size()));
    std::uint32_t const change = random.below(5);
    if (change == 1 && !b.empty()) randomCharacter(random, b[where]);
    if (change == 2) b.resize(where);
    if (change == 3) b += Char('x');
    if (change == 4 && !b.empty()) {
        b[where] = Char();
        if (random.below(2) == 0) a[where] = Char();
    }
    expectOrder(differences, a, b);
    expectOrder(differences, b, a);
}

// ------------------------------------------------------------------------------- stream inserters

struct SinkFailure {};

/// How a stream and its buffer are prepared before something is inserted.
struct Setup {
    explicit Setup(std::string const& name) : label(name) {}

    Setup& width(std::streamsize n, char character = ' ') {
        return fieldWidth = n, fill = character, *this;
    }
    Setup& flags(std::ios_base::fmtflags more) { return format |= more, *this; }
    Setup& unitbuf() { return flags(std::ios_base::unitbuf); }
    Setup& left() { return flags(std::ios_base::left); }
    Setup& room(std::size_t n) { return characters = n, *this; }
    Setup& throwAt(std::size_t n) { return throwingCharacter = n, *this; }
    Setup& syncs(std::size_t n) { return synchronisations = n, *this; }
    Setup& area(std::size_t n) { return putArea = n, *this; }
    Setup& before(std::ios_base::iostate s) { return state = s, *this; }
    Setup& tie() { return tied = true, *this; }
    Setup& failingTie() { return tied = tieFails = true, *this; }
    Setup& noBuffer() { return unbuffered = true, *this; }
    Setup& unwind() { return unwinding = true, *this; }

    std::string label;
    std::size_t characters = SIZE_MAX;        ///< that the sink takes before it refuses
    std::size_t throwingCharacter = SIZE_MAX; ///< at which the sink throws
    std::size_t synchronisations = SIZE_MAX;  ///< before one fails
    std::size_t putArea = 0;
    std::streamsize fieldWidth = 0;
    char fill = ' ';
    std::ios_base::fmtflags format = std::ios_base::fmtflags();
    std::ios_base::iostate state = std::ios_base::goodbit;
    std::ios_base::iostate mask = std::ios_base::goodbit; ///< what exceptions() is given
    bool tied = false;
    bool tieFails = false;
    bool unbuffered = false;
    bool unwinding = false; ///< the insertion happens while an exception is under way
};

/// A buffer that logs every character that reaches it and every synchronisation, in order.
class Sink : public std::streambuf {
public:
    Sink(std::string& log, Setup const& setup)
        : log_(log), setup_(setup), area_(setup.putArea, '\0') {
        if (!area_.empty()) setp(&area_[0], &area_[0] + area_.size());
    }
    std::string pending() const { return std::string(pbase(), pptr()); }

protected:
    int_type overflow(int_type c) override {
        for (char const* p = pbase(); p != pptr(); ++p) {
            if (!take(*p)) return traits_type::eof();
        }
        setp(pbase(), epptr());
        if (traits_type::eq_int_type(c, traits_type::eof())) return traits_type::not_eof(c);
        return take(traits_type::to_char_type(c)) ? c : traits_type::eof();
    }
    int sync() override {
        log_ += "<sync>";
        return syncs_++ < setup_.synchronisations ? 0 : -1;
    }

private:
    bool take(char c) {
        if (taken_ == setup_.throwingCharacter) throw SinkFailure();
        if (taken_ >= setup_.characters) return false;
        ++taken_;
        log_ += c;
        return true;
    }

    std::string& log_;
    Setup const& setup_;
    std::string area_;
    std::size_t taken_ = 0;
    std::size_t syncs_ = 0;
};

/// The buffer of a tied stream: its flushes appear in the same log.
class TiedSink : public std::streambuf {
public:
    TiedSink(std::string& log, bool fails) : log_(log), fails_(fails) {}

protected:
    int sync() override {
        log_ += "<tie>";
        return fails_ ? -1 : 0;
    }

private:
    std::string& log_;
    bool fails_;
};

/// The log as text, with what is not printable in hexadecimal.
std::string readable(std::string const& log) {
    std::ostringstream out;
    for (char const c : log) {
        if (c >= ' ' && c <= '~')
            out << c;
        else
            out << "\\x" << std::hex << valueOf(c) << ' ';
    }
    return out.str();
}

void setState(std::ostream& os, std::ios_base::iostate state, std::ios_base::iostate mask) {
    try {
        os.clear(os.rdstate() | state);
        os.exceptions(mask);
    } catch (std::ios_base::failure const&) {
        // The mask is set all the same, and the stream fails from the start.
    }
}

template <class Insert>
std::string thrownBy(std::ostream& os, Insert insert) {
    try {
        return &insert(os) == &os ? "nothing" : "nothing, but gave another stream";
    } catch (SinkFailure const&) {
        return "the sink's exception";
    } catch (std::ios_base::failure const& failure) {
        return failure.what();
    }
}

template <class Insert>
std::string thrownWhileUnwinding(std::ostream& os, Insert insert) {
    struct InsertsWhenDestroyed {
        std::ostream& os;
        Insert& insert;
        std::string& thrown;
        ~InsertsWhenDestroyed() { thrown = thrownBy(os, insert); }
    };
    std::string thrown;
    try {
        InsertsWhenDestroyed const object{os, insert, thrown};
        throw 1;
    } catch (int) {
    }
    return thrown;
}

/// Everything that can be seen of an insertion: what reached the sink in which order, the stream's
/// state afterwards and what was thrown.
template <class Insert>
std::string observed(Setup const& setup, Insert insert) {
    std::string log;
    Sink sink(log, setup);
    TiedSink tiedSink(log, setup.tieFails);
    std::ostream tied(&tiedSink);
    if (setup.tieFails) tied.exceptions(std::ios_base::badbit);
    std::ostream os(setup.unbuffered ? nullptr : &sink);
    if (setup.tied) os.tie(&tied);
    os.width(setup.fieldWidth);
    os.fill(setup.fill);
    os.flags(os.flags() | setup.format);
    setState(os, setup.state, setup.mask);
    std::string const thrown =
        setup.unwinding ? thrownWhileUnwinding(os, insert) : thrownBy(os, insert);
    std::ostringstream all;
    all << "wrote [" << readable(log) << "] pending [" << readable(sink.pending()) << "] state "
        << static_cast<int>(os.rdstate()) << " width " << os.width() << " fill "
        << static_cast<int>(os.fill()) << " threw " << thrown;
    os.exceptions(std::ios_base::goodbit);
    return all.str();
}

/// The number of bytes that the narrow inserter writes of a string of this stored size.
std::size_t narrowCount(std::size_t size) {
    std::size_t const low = size % 256;
    return low < 128 ? low : 0;
}

// The literal loops that the two inserters are described by.
std::ostream& insertOneByOne(std::ostream& os, std::string const& s) {
    for (std::size_t i = 0; i < narrowCount(s.size()); ++i) os << static_cast<signed char>(s[i]);
    return os;
}
std::ostream& insertOneByOne(std::ostream& os, std::wstring const& s) {
    for (std::size_t i = 0; i < s.size(); ++i) {
        os << static_cast<signed char>(byte(valueOf(s[i])));
    }
    return os;
}

template <class String>
std::string written(String const& s) {
    std::ostringstream os;
    Koru::operator<<(os, s);
    return os.str();
}

/// Bytes that tell where they come from.
std::string pattern(std::size_t size) {
    std::string text;
    for (std::size_t i = 0; i < size; ++i) text += byte(static_cast<unsigned>(33 + i % 223));
    return text;
}

std::wstring widePattern(std::size_t size) {
    std::wstring text;
    for (std::size_t i = 0; i < size; ++i) text += unit(static_cast<std::uint32_t>(33 + i * 257));
    return text;
}

auto const BAD = std::ios_base::badbit;
auto const FAIL = std::ios_base::failbit;
auto const END = std::ios_base::eofbit;

/// The preparations under which the inserters are compared with their loops.
std::vector<Setup> const& setups() {
    static std::vector<Setup> const all = {
        Setup("nothing special"),
        Setup("width 1").width(1),
        Setup("width 6 and fill").width(6, '*'),
        Setup("width 6, left").width(6, '*').left(),
        Setup("width 5, internal").width(5).flags(std::ios_base::internal),
        Setup("width 300, right").width(300).flags(std::ios_base::right),
        Setup("negative width").width(-4),
        Setup("unitbuf").unitbuf(),
        Setup("unitbuf and width").unitbuf().width(4),
        Setup("unitbuf whose third flush fails").unitbuf().syncs(2),
        Setup("tied stream").tie(),
        Setup("tied stream and unitbuf").tie().unitbuf(),
        Setup("tied stream and width").tie().width(3, '.'),
        Setup("tied stream that throws").failingTie().width(3),
        Setup("put area of 3").area(3),
        Setup("put area of 64 and room for 80").area(64).room(80),
        Setup("room for nothing").room(0),
        Setup("room for nothing and width").room(0).width(2),
        Setup("room for 1").room(1),
        Setup("room for 2 and width").room(2).width(5),
        Setup("room for 2 and width, left").room(2).width(5).left(),
        Setup("room for 43").room(43),
        Setup("room for 5, tied").room(5).tie(),
        Setup("room for 5, unitbuf").room(5).unitbuf(),
        Setup("sink throws at once").throwAt(0),
        Setup("sink throws at the third").throwAt(2),
        Setup("sink throws while padding").throwAt(2).width(9),
        Setup("sink throws, tied").throwAt(2).tie(),
        Setup("sink throws, unitbuf").throwAt(2).unitbuf(),
        Setup("sink throws, put area").throwAt(2).area(8),
        Setup("bad before").before(BAD),
        Setup("bad before, with width").before(BAD).width(7),
        Setup("failed before, with width").before(FAIL).width(7),
        Setup("failed before, tied").before(FAIL).tie(),
        Setup("failed before, unitbuf").before(FAIL).unitbuf(),
        Setup("at the end before").before(END),
        Setup("at the end and bad before").before(END | BAD),
        Setup("no buffer").noBuffer().before(BAD),
        Setup("unwinding").unwind(),
        Setup("unwinding, unitbuf").unwind().unitbuf(),
        Setup("unwinding, sink throws").unwind().throwAt(2),
    };
    return all;
}

template <class Text>
void expectInsertedAsOneByOne(Differences& differences, Setup const& setup, Text const& text) {
    std::string const expected = observed(
        setup, [&](std::ostream& os) -> std::ostream& { return insertOneByOne(os, text); });
    std::string const actual = observed(
        setup, [&](std::ostream& os) -> std::ostream& { return Koru::operator<<(os, text); });
    differences.note(actual == expected, [&] {
        return std::to_string(text.size()) + " characters, exceptions " +
               std::to_string(static_cast<int>(setup.mask)) + ":\n" + actual + "\ninstead of\n" +
               expected;
    });
}

/// Every text under every preparation with every mask of exceptions, one assertion for each
/// preparation.
template <class Text>
void expectEveryInsertionAsOneByOne(std::vector<Text> const& texts) {
    for (Setup setup : setups()) {
        CAPTURE(setup.label);
        Differences differences;
        for (unsigned bits = 0; bits < 8; ++bits) {
            setup.mask = (bits & 1 ? BAD : std::ios_base::goodbit) |
                         (bits & 2 ? FAIL : std::ios_base::goodbit) |
                         (bits & 4 ? END : std::ios_base::goodbit);
            // The C++ library ends the process when a flush fails that would have to throw.
            if (setup.synchronisations != SIZE_MAX) setup.mask &= ~BAD;
            for (Text const& text : texts) expectInsertedAsOneByOne(differences, setup, text);
        }
        CHECK(differences.first() == "");
        CHECK(differences.compared() == 8 * texts.size());
    }
}

// -------------------------------------------------------------------------- exhausted memory

/// Leaves the process with less memory than any conversion of the long texts needs, and converts.
int exhaustMemory(int, char**) {
    std::size_t const SIZE = 16U << 20;
    std::string const narrow(SIZE, 'a');
    std::wstring const wide(SIZE, L'a');
    unsigned long pages = 0;
    std::ifstream("/proc/self/statm") >> pages;
    rlimit limit = {};
    limit.rlim_cur = pages * static_cast<unsigned long>(::sysconf(_SC_PAGESIZE)) + (8U << 20);
    limit.rlim_max = limit.rlim_cur;
    if (::setrlimit(RLIMIT_AS, &limit) != 0) return 1;
    int failures = 0;
    auto const attempt = [&](auto operation) {
        try {
            operation();
        } catch (std::bad_alloc const&) {
            ++failures;
        }
    };
    attempt([&] { Koru::make_string(wide); });
    attempt([&] { Koru::make_string(wide.c_str()); });
    attempt([&] { Koru::make_wstring(narrow); });
    attempt([&] { Koru::make_wstring(narrow.c_str()); });
    attempt([&] { Koru::make_string(narrow.c_str()); });
    attempt([&] { Koru::make_wstring(wide.c_str()); });
    bool const usable = Koru::make_string(L"\u00E9") == "\xC3\xA9" &&
                        Koru::make_wstring("\xC3\xA9") == L"\u00E9" &&
                        Koru::length(narrow) == SIZE && Koru::compare(wide, wide) == 0;
    std::printf("bad_alloc %d times, %s\n", failures, usable ? "usable" : "unusable");
    return 0;
}

test::RegisterSelf const registerExhaustMemory("exhaust-memory", exhaustMemory);

// -------------------------------------------------------------------- before main and after it

/// What a static constructor of an application sees.
struct Early {
    bool constantsEmpty = Koru::_null_string.empty() && Koru::_null_wstring.empty();
    std::string narrowOfNull = Koru::make_string(static_cast<char const*>(nullptr));
    std::wstring wideOfNull = Koru::make_wstring(static_cast<wchar_t const*>(nullptr));
    std::string copied = Koru::_null_string;
    std::wstring wideCopied = Koru::_null_wstring;
    std::string encoded = Koru::make_string(L"\u00E9");
};
// The smallest number an application may use: constructed before all its other static objects.
Early const early __attribute__((init_priority(101)));

/// What a static destructor of an application sees; told on standard output when asked for.
struct Late {
    bool asked = false;
    ~Late() {
        if (!asked) return;
        bool const usable = Koru::_null_string.empty() && Koru::_null_wstring.empty() &&
                            Koru::make_string(L"") == "" && Koru::make_wstring("a") == L"a";
        char const answer = usable ? 'y' : 'n';
        if (::write(STDOUT_FILENO, &answer, 1) != 1) ::_exit(1);
    }
};
Late late __attribute__((init_priority(101)));

test::RegisterSelf const registerLate("use-strings-at-exit", [](int, char**) {
    late.asked = true;
    return 0;
});

} // namespace

// ================================================================================ the constants

TEST_CASE("the null strings are constant and empty") {
    static_assert(std::is_same<decltype(Koru::_null_string), std::string const>::value, "");
    static_assert(std::is_same<decltype(Koru::_null_wstring), std::wstring const>::value, "");
    CHECK(Koru::_null_string.size() == 0);
    CHECK(Koru::_null_wstring.size() == 0);
}

TEST_CASE("the null strings serve the static constructors of an application") {
    CHECK(early.constantsEmpty);
    CHECK(early.narrowOfNull == "");
    CHECK(early.wideOfNull.empty());
    CHECK(early.copied == "");
    CHECK(early.wideCopied.empty());
    CHECK(hex(early.encoded) == "C3 A9");
}

TEST_CASE("the null strings serve the static destructors of an application") {
    test::Outcome const outcome =
        test::execute(test::ownExecutable(), {"string_test", "--self=use-strings-at-exit"});
    CHECK(outcome.exitCode == 0);
    CHECK(outcome.out == "y");
}

TEST_CASE("changing what came from a null string leaves the null string empty") {
    std::string narrow = Koru::make_string(static_cast<char const*>(nullptr));
    std::wstring wide = Koru::make_wstring(static_cast<char const*>(nullptr));
    narrow += "changed";
    wide += L"changed";
    CHECK(Koru::_null_string == "");
    CHECK(Koru::_null_wstring.empty());
    CHECK(Koru::make_string(L"") == "");
    CHECK(Koru::make_wstring("").empty());
}

// ======================================================================================= length

TEST_CASE("length of a null pointer is 0 in both widths") {
    CHECK(Koru::length(static_cast<char const*>(nullptr)) == 0);
    CHECK(Koru::length(static_cast<wchar_t const*>(nullptr)) == 0);
}

TEST_CASE("length counts bytes and wide characters, not letters or bytes of wide characters") {
    CHECK(Koru::length("") == 0);
    CHECK(Koru::length(L"") == 0);
    CHECK(Koru::length("abc") == 3);
    CHECK(Koru::length(L"abc") == 3);
    CHECK(Koru::length("\xC3\xA9") == 2);
    CHECK(Koru::length(L"\u00E9\U0001F600") == 2);
    CHECK(Koru::length("\xFF\x80") == 2);
    CHECK(Koru::length(units({0xFFFFFFFFU, 0x80000000U, 0x100, 0x10000}).c_str()) == 4);
}

TEST_CASE("length of a string object ends at its first NUL whatever its stored size") {
    CHECK(Koru::length(std::string()) == 0);
    CHECK(Koru::length(std::wstring()) == 0);
    CHECK(Koru::length(std::string("a\0b", 3)) == 1);
    CHECK(Koru::length(std::wstring(L"a\0b", 3)) == 1);
    CHECK(Koru::length(std::string(5, '\0')) == 0);
    CHECK(Koru::length(std::wstring(5, L'\0')) == 0);
    CHECK(Koru::length(std::string("abc\0", 4)) == 3);
    CHECK(Koru::length(std::string(100000, 'x')) == 100000);
    CHECK(Koru::length(std::wstring(100000, L'x')) == 100000);
}

TEST_CASE("length finds the first NUL at every distance and alignment") {
    Differences differences;
    for (std::size_t offset = 0; offset < 40; ++offset) {
        for (std::size_t size = 0; size < 140; ++size) {
            std::string narrow(offset + size, '\x80');
            narrow += std::string("\0\xFF\0z", 4);
            std::wstring wide(offset + size, unit(0x80000000U));
            wide += std::wstring(L"\0z", 2);
            bool const same = Koru::length(narrow.c_str() + offset) == size &&
                              Koru::length(wide.c_str() + offset) == size &&
                              Koru::length(narrow.substr(offset)) == size &&
                              Koru::length(wide.substr(offset)) == size;
            differences.note(same, [&] { return std::to_string(size) + " characters"; });
        }
    }
    CHECK(differences.first() == "");
    CHECK(differences.compared() == 40 * 140);
}

TEST_CASE("length, compare and conversions read nothing outside the text they are given") {
    GuardedMemory first;
    GuardedMemory second;
    Random random(1);
    Differences differences;
    for (std::size_t size = 0; size < 300; ++size) {
        std::string const narrow = randomBytes(random, size, false);
        std::wstring const wide = randomUnits(random, size, false);
        for (bool const atEnd : {true, false}) {
            auto const note = [&](bool same, char const* what) {
                differences.note(same, [&] { return what + (": " + std::to_string(size)); });
            };
            char const* const n = atEnd ? first.atEnd(narrow) : first.atBegin(narrow);
            note(Koru::length(n) == size, "narrow length");
            note(Koru::make_string(n) == narrow, "narrow copy");
            note(Koru::make_wstring(n) == modelDecode(narrow), "decoding");
            note(Koru::compare(n, second.atEnd(narrow)) == 0, "narrow compare");
            wchar_t const* const w = atEnd ? first.atEnd(wide) : first.atBegin(wide);
            note(Koru::length(w) == untilNul(wide).size(), "wide length");
            note(Koru::make_wstring(w) == untilNul(wide), "wide copy");
            note(Koru::make_string(w) == modelEncode(wide), "encoding");
            note(Koru::compare(w, second.atEnd(wide)) == 0, "wide compare");
        }
    }
    CHECK(differences.first() == "");
    CHECK(differences.compared() == 300 * 2 * 8);
}

// ====================================================================================== compare

TEST_CASE("compare ignores case and folds to small letters before it orders") {
    struct Row {
        std::string a;
        std::string b;
        int expected;
    };
    Row const rows[] = {
        {"", "", 0},          {"ABC", "abc", 0}, {"abc", "ABC", 0}, {"aBcDe", "AbCdE", 0},
        {"a", "b", -1},       {"B", "a", 1},     {"a", "B", -1},    {"ab", "abc", -1},
        {"ABC", "ab", 1},     {"", "a", -1},     {"a", "", 1},      {"a_b", "a-b", 1},
        {"_", "A", -1},       {"A", "_", 1},     {"[", "Z", -1},    {"@", "a", -1},
        {"`", "A", -1},       {"{", "Z", 1},     {"0", "A", -1},    {"a b", "aB", -1},
        {"key1", "KEY2", -1}, {"k e", "K E", 0}, {"~", "Z", 1},
    };
    for (Row const& row : rows) {
        CAPTURE(row.a);
        CAPTURE(row.b);
        std::wstring const wideA(row.a.begin(), row.a.end());
        std::wstring const wideB(row.b.begin(), row.b.end());
        CHECK(sign(Koru::compare(row.a, row.b)) == row.expected);
        CHECK(sign(Koru::compare(row.a.c_str(), row.b.c_str())) == row.expected);
        CHECK(sign(Koru::compare(wideA.c_str(), wideB.c_str())) == row.expected);
        CHECK(sign(Koru::compare(wideA, wideB)) == row.expected);
    }
}

TEST_CASE("compare takes bytes as unsigned, and only ASCII letters have case in the C locale") {
    CHECK(Koru::compare("\x80", "z") > 0);
    CHECK(Koru::compare("z", "\xFF") < 0);
    CHECK(Koru::compare("\xC9", "\xE9") < 0);
    CHECK(Koru::compare("\xC3\x89", "\xC3\xA9") < 0);
    CHECK(Koru::compare(L"\u00C9", L"\u00E9") < 0);
    CHECK(Koru::compare(L"\u0416", L"\u0436") < 0);
}

TEST_CASE("compare of string objects ends at their first NUL") {
    CHECK(Koru::compare(std::string("abc\0x", 5), std::string("ABC\0y", 5)) == 0);
    CHECK(Koru::compare(std::string("abc\0x", 5), std::string("abc")) == 0);
    CHECK(Koru::compare(std::string("\0x", 2), std::string()) == 0);
    CHECK(Koru::compare(std::string("ab\0z", 4), std::string("abc")) < 0);
    CHECK(Koru::compare(std::wstring(L"abc\0x", 5), std::wstring(L"ABC\0y", 5)) == 0);
    CHECK(Koru::compare(std::wstring(L"abc\0x", 5), std::wstring(L"abc")) == 0);
    CHECK(Koru::compare(std::wstring(L"\0x", 2), std::wstring()) == 0);
    CHECK(Koru::compare(std::wstring(L"ab\0z", 4), std::wstring(L"abc")) < 0);
}

TEST_CASE("compare of a text with itself is 0") {
    std::string const narrow = pattern(300);
    std::wstring const wide = units({0xFFFFFFFFU, 'a', 0x80000000U, 0x10FFFF});
    CHECK(Koru::compare(narrow, narrow) == 0);
    CHECK(Koru::compare(narrow.c_str(), narrow.c_str()) == 0);
    CHECK(Koru::compare(wide, wide) == 0);
    CHECK(Koru::compare(wide.c_str(), wide.c_str()) == 0);
}

TEST_CASE("compare finds a difference at every position of texts of every length") {
    Differences differences;
    for (std::size_t size = 1; size < 70; ++size) {
        for (std::size_t at = 0; at < size; ++at) {
            for (unsigned const c : {0x40U, 0x4BU, 0x5BU, 0x6BU, 0x6CU, 0x7FU, 0x80U, 0xCBU}) {
                std::string const a(size, 'K');
                std::string b(size, 'k');
                b[at] = byte(c);
                std::wstring const wideA(size, L'K');
                std::wstring wideB(size, L'k');
                wideB[at] = unit(c | (c & 0x80) << 24);
                expectOrder(differences, a, b);
                expectOrder(differences, b, a);
                expectOrder(differences, wideA, wideB);
                expectOrder(differences, wideB, wideA);
            }
        }
    }
    CHECK(differences.first() == "");
    CHECK(differences.compared() == 69 * 70 / 2 * 8 * 4);
}

TEST_CASE("compare orders random texts as strcasecmp and wcscasecmp do in every locale") {
    for (std::string const& name : localeNames()) {
        CAPTURE(name);
        LocaleScope const scope(name);
        REQUIRE(scope.isSet());
        Random random(2);
        Differences differences;
        for (int i = 0; i < 8000; ++i) {
            expectOrderOfRandomPair<char>(differences, random);
            expectOrderOfRandomPair<wchar_t>(differences, random);
        }
        CHECK(differences.first() == "");
        CHECK(differences.compared() == 32000);
    }
}

TEST_CASE("compare agrees with the C library on every pair of bytes in every locale") {
    for (std::string const& name : localeNames()) {
        CAPTURE(name);
        LocaleScope const scope(name);
        Differences differences;
        for (unsigned a = 0; a < 256; ++a) {
            for (unsigned b = 0; b < 256; ++b) {
                expectOrder(differences, std::string(1, byte(a)), std::string(1, byte(b)));
            }
        }
        CHECK(differences.first() == "");
        CHECK(differences.compared() == 65536);
    }
}

TEST_CASE("compare agrees with the C library on pairs of wide characters in every locale") {
    std::vector<std::uint32_t> others = {
        0xD800,     0x1E9E,     0x1EA0,     0x2126,     0x212A,     0x212B,     0x2C2F,
        0x2C5F,     0xA64A,     0xFF21,     0xFF41,     0xFFFF,     0x10000,    0x10400,
        0x10428,    0x10FFFF,   0x110000,   0x3FFFFFF,  0x7FFFFFFF, 0x80000000, 0x80000041,
        0x80000061, 0xFFFFFF80, 0xFFFFFFC1, 0xFFFFFFE1, 0xFFFFFFFF};
    std::uint32_t const LATIN_TO_ARABIC = 0x800;
    std::size_t const selected = others.size();
    for (std::uint32_t c = 0; c < LATIN_TO_ARABIC; ++c) others.push_back(c);
    for (std::string const& name : localeNames()) {
        CAPTURE(name);
        LocaleScope const scope(name);
        Differences differences;
        wchar_t a[2] = {};
        wchar_t b[2] = {};
        auto const expect = [&](std::uint32_t left, std::uint32_t right) {
            a[0] = unit(left);
            b[0] = unit(right);
            differences.note(sign(Koru::compare(a, b)) == sign(::wcscasecmp(a, b)), [&] {
                return hex(std::wstring(a)) + " against " + hex(std::wstring(b));
            });
        };
        for (std::uint32_t const left : others) {
            for (std::size_t i = 0; i < selected; ++i) {
                expect(left, others[i]);
                expect(others[i], left);
            }
            if (left >= LATIN_TO_ARABIC) continue;
            for (std::uint32_t right = 0; right < LATIN_TO_ARABIC; ++right) expect(left, right);
        }
        CHECK(differences.first() == "");
        CHECK(differences.compared() > 4194304);
    }
}

TEST_CASE("compare finds every wide character equal to its other case where the locale does") {
    for (std::string const& name : localeNames()) {
        CAPTURE(name);
        LocaleScope const scope(name);
        Differences differences;
        for (std::uint32_t c = 1; c <= 0x10FFFF; ++c) {
            wchar_t const self[] = {unit(c), 0};
            wchar_t const other[] = {swappedCase(unit(c)), 0};
            wchar_t const next[] = {unit(c + 1), 0};
            bool const same = sign(Koru::compare(self, other)) == sign(::wcscasecmp(self, other)) &&
                              sign(Koru::compare(self, next)) == sign(::wcscasecmp(self, next));
            differences.note(same, [&] { return hex(std::wstring(self)); });
        }
        CHECK(differences.first() == "");
    }
}

TEST_CASE("compare follows each change of the C locale") {
    std::vector<std::string> const& names = localeNames();
    std::vector<std::string> order(names.begin(), names.end());
    order.insert(order.end(), names.rbegin(), names.rend());
    std::string const narrowUpper = "I\xC9\xDD";
    std::string const narrowLower = "i\xE9\xFD";
    for (std::string const& name : order) {
        CAPTURE(name);
        LocaleScope const scope(name);
        Differences differences;
        for (std::size_t i = 0; i < narrowUpper.size(); ++i) {
            std::string const upper(40, narrowUpper[i]);
            std::string const lower(40, narrowLower[i]);
            expectOrder(differences, upper, lower);
            expectOrder(differences, lower, upper);
        }
        for (std::wstring const upper : {L"I", L"\u0130", L"\u00C9", L"\u0416"}) {
            for (std::wstring const lower : {L"i", L"\u0131", L"\u00E9", L"\u0436"}) {
                expectOrder(differences, upper, lower);
                expectOrder(differences, lower, upper);
            }
        }
        CHECK(differences.first() == "");
        bool const unicode = name == "C.UTF-8";
        if (unicode || name == "C") {
            CHECK((Koru::compare(L"\u00C9", L"\u00E9") == 0) == unicode);
            CHECK(Koru::compare(L"I", L"i") == 0);
        }
        if (name == "tr_TR.UTF-8") {
            CHECK(Koru::compare(L"I", L"i") != 0);
            CHECK(Koru::compare(L"I", L"\u0131") == 0);
        }
        if (name == "de_DE.ISO-8859-1") {
            CHECK(Koru::compare("\xC9t\xC9", "\xE9T\xE9") == 0);
        }
    }
}

TEST_CASE("compare follows the locale of the calling thread") {
    for (std::string const& name : localeNames()) {
        CAPTURE(name);
        ::locale_t const locale = ::newlocale(LC_ALL_MASK, name.c_str(), nullptr);
        REQUIRE(locale != nullptr);
        Differences differences;
        std::thread other([&] {
            ::uselocale(locale);
            Random random(3);
            for (int i = 0; i < 1000; ++i) {
                expectOrderOfRandomPair<char>(differences, random);
                expectOrderOfRandomPair<wchar_t>(differences, random);
            }
            expectOrder(differences, std::wstring(L"\u00C9I"), std::wstring(L"\u00E9i"));
            expectOrder(differences, std::string("\xC9I"), std::string("\xE9i"));
            ::uselocale(LC_GLOBAL_LOCALE);
        });
        other.join();
        ::freelocale(locale);
        CHECK(differences.first() == "");
        CHECK(Koru::compare(L"\u00C9", L"\u00E9") < 0);
    }
}

// ============================================================================= copies up to NUL

TEST_CASE("every make function gives an empty string for a null pointer and for empty text") {
    CHECK(Koru::make_string(static_cast<char const*>(nullptr)) == "");
    CHECK(Koru::make_string(static_cast<wchar_t const*>(nullptr)) == "");
    CHECK(Koru::make_wstring(static_cast<char const*>(nullptr)).empty());
    CHECK(Koru::make_wstring(static_cast<wchar_t const*>(nullptr)).empty());
    CHECK(Koru::make_string("") == "");
    CHECK(Koru::make_string(L"") == "");
    CHECK(Koru::make_wstring("").empty());
    CHECK(Koru::make_wstring(L"").empty());
    CHECK(Koru::make_string(std::wstring()) == "");
    CHECK(Koru::make_wstring(std::string()).empty());
    CHECK(Koru::make_string(std::wstring(3, L'\0')) == "");
    CHECK(Koru::make_wstring(std::string(3, '\0')).empty());
}

TEST_CASE("make_string of narrow text copies its bytes, valid UTF-8 or not, up to the first NUL") {
    CHECK(Koru::make_string("abc") == "abc");
    CHECK(Koru::make_string("ab\0c") == "ab");
    CHECK(hex(Koru::make_string("\xC3\x80\xFF\xFEz")) == "C3 80 FF FE 7A");
    std::string const text = untilNul(pattern(100000));
    CHECK(Koru::make_string(text.c_str()) == text);
}

TEST_CASE("make_wstring of wide text copies its characters, whatever they are, up to the NUL") {
    CHECK(hex(Koru::make_wstring(L"abc")) == "61 62 63");
    CHECK(hex(Koru::make_wstring(L"ab\0c")) == "61 62");
    std::wstring const odd = units({0xFFFFFFFFU, 0xD800, 0x80000000U, 0x7FFFFFFF, 0x100, 0xDC00});
    CHECK(hex(Koru::make_wstring(odd.c_str())) == hex(odd));
    std::wstring const text = widePattern(100000);
    CHECK((Koru::make_wstring(text.c_str()) == text));
}

// ===================================================================================== encoding

TEST_CASE("make_string encodes a wide character by its size") {
    struct Row {
        std::uint32_t value;
        std::string expected;
    };
    Row const rows[] = {
        {0x1, "1"},
        {0x41, "41"},
        {0x7F, "7F"},
        {0x80, "C2 80"},
        {0xE9, "C3 A9"},
        {0x7FF, "DF BF"},
        {0x800, "E0 A0 80"},
        {0x20AC, "E2 82 AC"},
        {0xD800, "ED A0 80"},
        {0xDFFF, "ED BF BF"},
        {0xFFFD, "EF BF BD"},
        {0xFFFF, "EF BF BF"},
        {0x10000, "F0 90 80 80"},
        {0x1F600, "F0 9F 98 80"},
        {0x10FFFF, "F4 8F BF BF"},
        {0x110000, "F4 90 80 80"},
        {0x1FFFFF, "F7 BF BF BF"},
        {0x200000, "F8 88 80 80 80"},
        {0x3FFFFFF, "FB BF BF BF BF"},
        {0x4000000, "FC 84 80 80 80 80"},
        {0x12345678, "FC 92 8D 85 99 B8"},
        {0x3FFFFFFF, "FC BF BF BF BF BF"},
        {0x40000000, "FD 80 80 80 80 80"},
        {0x7FFFFFFF, "FD BF BF BF BF BF"},
        {0x80000000, ""},
        {0x80000001, "1"},
        {0x80000041, "41"},
        {0xDEADBE00, ""},
        {0xFFFFFF80, "80"},
        {0xFFFFFFE9, "E9"},
        {0xFFFFFFFF, "FF"},
    };
    for (Row const& row : rows) {
        CAPTURE(row.value);
        std::wstring const text(1, unit(row.value));
        CHECK(hex(Koru::make_string(text)) == row.expected);
        CHECK(hex(Koru::make_string(text.c_str())) == row.expected);
    }
}

TEST_CASE("make_string does not join surrogates to one character") {
    CHECK(hex(Koru::make_string(units({0xD83D, 0xDE00}))) == "ED A0 BD ED B8 80");
}

TEST_CASE("make_string ends at a NUL and at a negative character with a zero low byte") {
    CHECK(Koru::make_string(std::wstring(L"a\0b", 3)) == "a");
    CHECK(Koru::make_string(units({'a', 'b', 0x80000000U, 'c'})) == "ab");
    CHECK(Koru::make_string(units({'a', 0xFFFFFF00U, 'c'}).c_str()) == "a");
    CHECK(hex(Koru::make_string(units({0xE9, 0x80000000U, 0xE9, 0, 'x'}))) == "C3 A9");
    CHECK(hex(Koru::make_string(units({0x80000061U, 0xFFFFFFFFU, 0x62}))) == "61 FF 62");
    CHECK(Koru::make_string(units({0x80000000U})).size() == 0);
}

TEST_CASE("every value from 1 to 0x10FFFF survives the way to UTF-8 and back") {
    Differences differences;
    for (std::uint32_t value = 1; value <= 0x10FFFF; ++value) expectSurvives(differences, value);
    CHECK(differences.first() == "");
    CHECK(differences.compared() == 2 * 0x10FFFF);
    CHECK(Koru::make_string(std::wstring(1, L'\0')) == "");
}

TEST_CASE("values of the four-, five- and six-byte forms survive the way to UTF-8 and back") {
    Differences differences;
    for (std::uint32_t value = 0x10FFFF; value < 0x80000000U; value += 4099) {
        expectSurvives(differences, value);
    }
    for (std::uint32_t const edge : {0x110000U, 0x200000U, 0x4000000U, 0x40000000U, 0x7FFFFFFFU}) {
        for (std::uint32_t value = edge - 600; value <= std::min(edge + 600, 0x7FFFFFFFU);
             ++value) {
            expectSurvives(differences, value);
        }
    }
    for (unsigned shift = 0; shift < 31; ++shift) {
        expectSurvives(differences, 1U << shift);
        expectSurvives(differences, 0x7FFFFFFFU ^ 1U << shift);
    }
    CHECK(differences.first() == "");
    CHECK(differences.compared() > 1000000);
}

TEST_CASE("a negative value becomes its low byte") {
    Differences differences;
    for (std::uint32_t value = 0x80000000U; value < 0xFFFFF000U; value += 8191) {
        expectEncoded(differences, units({'a', value, 'b'}));
    }
    for (std::uint32_t i = 0; i < 1024; ++i) {
        expectEncoded(differences, units({0x80000000U + i}));
        expectEncoded(differences, units({'a', 0xFFFFFFFFU - i, 'b'}));
    }
    CHECK(differences.first() == "");
}

TEST_CASE("make_string converts values of all forms next to each other") {
    Differences differences;
    std::wstring text;
    for (std::uint32_t value = 1; value < 0x110000; ++value) {
        text += unit(value);
        if (text.size() < 1021) continue;
        expectEncoded(differences, text);
        std::string const encoded = Koru::make_string(text);
        differences.expect(Koru::make_wstring(encoded), text, encoded);
        text.clear();
    }
    CHECK(differences.first() == "");
}

TEST_CASE("make_string sees an odd character at every position of an ASCII run") {
    Differences differences;
    for (std::size_t size = 1; size <= 130; ++size) {
        for (std::size_t at = 0; at < size; ++at) {
            for (std::uint32_t const odd :
                 {0U, 0x80U, 0xFFU, 0x100U, 0x7FFU, 0x800U, 0x8041U, 0xFFFFU, 0x10000U, 0x200000U,
                  0x7FFFFFFFU, 0x80000000U, 0x80000041U, 0xFFFFFF80U, 0xFFFFFFFFU}) {
                std::wstring text(size, L'a');
                text[at] = unit(odd);
                expectEncoded(differences, text);
                differences.expect(Koru::make_string(text.c_str()), modelEncode(text), text);
            }
        }
    }
    CHECK(differences.first() == "");
    CHECK(differences.compared() == 130 * 131 / 2 * 15 * 2);
}

TEST_CASE("make_string agrees with the model on random text of every length up to 600") {
    Random random(4);
    Differences differences;
    for (std::size_t size = 0; size <= 600; ++size) {
        for (std::size_t round = 0; round < 16; ++round) {
            std::wstring const text = randomUnits(random, size, round % 4 == 0);
            expectEncoded(differences, text);
            std::wstring const shifted = std::wstring(round, L'x') + text;
            differences.expect(Koru::make_string(shifted.c_str() + round), modelEncode(text), text);
        }
    }
    CHECK(differences.first() == "");
    CHECK(differences.compared() == 601 * 16 * 2);
}

TEST_CASE("make_string agrees with the model on long text") {
    Random random(5);
    Differences differences;
    for (std::size_t const size : {1023U, 1024U, 1025U, 2047U, 4096U, 4097U, 65537U, 100000U}) {
        for (int round = 0; round < 4; ++round) {
            expectEncoded(differences, randomUnits(random, size, false));
        }
        expectEncoded(differences, std::wstring(size, L'a'));
        expectEncoded(differences, std::wstring(size, L'\u00E9'));
        expectEncoded(differences, std::wstring(size, L'\u20AC'));
        expectEncoded(differences, std::wstring(size, L'\U0001F600'));
        expectEncoded(differences, std::wstring(size, unit(0x7FFFFFFF)));
        expectEncoded(differences, std::wstring(size, unit(0xFFFFFFFFU)));
    }
    CHECK(differences.first() == "");
}

// ===================================================================================== decoding

TEST_CASE("make_wstring takes the first form that the lead byte and the rest of the text allow") {
    struct Row {
        std::string label;
        std::string input;
        std::string expected;
    };
    Row const rows[] = {
        {"ASCII", "41 7F 1", "41 7F 1"},
        {"two bytes", "C3 A9", "E9"},
        {"three bytes", "E2 82 AC", "20AC"},
        {"four bytes", "F0 9F 98 80", "1F600"},
        {"five bytes", "FB BF BF BF BF", "3FFFFFF"},
        {"six bytes", "FD BF BF BF BF BF", "7FFFFFFF"},
        {"six bytes, low lead bit 0", "FC BF BF BF BF BF", "3FFFFFFF"},
        {"surrogate", "ED A0 80", "D800"},
        {"beyond Unicode", "F7 BF BF BF", "1FFFFF"},
        {"two-byte lead at the end", "C3", "3F"},
        {"two-byte lead at the end of text", "61 C3", "61 3F"},
        {"three-byte lead at the end", "E2", "3F"},
        {"three bytes cut short", "E2 82", "3F 3F"},
        {"four bytes cut short", "F0 9F 98", "3F 3F 3F"},
        {"five bytes cut short", "FB BF BF BF", "3F 3F 3F 3F"},
        {"six bytes cut short", "FD BF BF BF BF", "3F 3F 3F 3F 3F"},
        {"cut short before ASCII", "E2 41", "3F 41"},
        {"cut short before two bytes", "F0 C3 A9", "3F E9"},
        {"continuation before five ASCII", "80 61 62 63 64 65", "218A3925"},
        {"odd continuation before five", "BF 40 40 40 40 41", "40000001"},
        {"continuation before four", "80 61 62 63 64", "3F 61 62 63 64"},
        {"continuation and what follows", "80 61 62 63 64 65 66", "218A3925 66"},
        {"continuation alone", "BF", "3F"},
        {"FE before five", "FE 80 80 80 80 81", "1"},
        {"FF before five", "FF 80 80 80 80 81", "40000001"},
        {"FE before four", "FE 61 62 63 64", "3F 61 62 63 64"},
        {"FF alone", "FF", "3F"},
        {"three bytes before two more", "E2 82 AC C3 A9", "20AC E9"},
        {"ASCII in the place of a continuation", "C3 29", "E9"},
        {"lead in the place of a continuation", "C3 E9", "E9"},
        {"three-byte lead over ASCII", "E2 42 6C", "20AC"},
        {"overlong slash of two", "C0 AF", "2F"},
        {"overlong slash of three", "E0 80 AF", "2F"},
        {"overlong slash of six", "FC 80 80 80 80 AF", "2F"},
        {"overlong zero of two", "61 C0 80 62", "61"},
        {"overlong zero of ASCII", "61 C0 40 62", "61"},
        {"overlong zero of three", "E0 80 80 62", ""},
        {"overlong zero of four", "61 F0 80 80 80 62", "61"},
        {"overlong zero of five", "61 F8 80 80 80 80 62", "61"},
        {"overlong zero of six", "61 FC 80 80 80 80 80 62", "61"},
        {"zero of a stray continuation", "61 80 80 80 80 80 80 62", "61"},
        {"NUL", "61 00 62", "61"},
        {"NUL in the place of a continuation", "C3 00 A9", "3F"},
        {"NUL within six bytes", "80 61 62 00 64 65 66", "3F 61 62"},
        {"byte order mark", "EF BB BF 61", "FEFF 61"},
        {"Latin-1 word", "63 61 66 E9", "63 61 66 3F"},
        {"Latin-1 within text", "E9 74 75 64 65", "9D35 64 65"},
    };
    for (Row const& row : rows) {
        CAPTURE(row.label);
        std::string const input = fromHex(row.input);
        CHECK(hex(modelDecode(input)) == row.expected);
        CHECK(hex(Koru::make_wstring(input)) == row.expected);
        CHECK(hex(Koru::make_wstring(input.c_str())) == row.expected);
    }
}

TEST_CASE("make_wstring agrees with the model on every one and two bytes before every tail") {
    Differences differences;
    std::string const tails[] = {"abcdefg", bytes({0x80, 0xBF, 0x81, 0x82, 0x83, 0x84, 0x85})};
    for (unsigned first = 0; first < 256; ++first) {
        expectDecoded(differences, bytes({first}));
        for (unsigned second = 0; second < 256; ++second) {
            for (std::string const& tail : tails) {
                for (std::size_t size = 0; size <= tail.size(); ++size) {
                    expectDecoded(differences, bytes({first, second}) + tail.substr(0, size));
                }
            }
        }
    }
    CHECK(differences.first() == "");
    CHECK(differences.compared() == 256 + 65536 * 16);
}

TEST_CASE("make_wstring agrees with the model on three bytes") {
    Differences differences;
    for (unsigned value = 0; value < 0x1000000; value += 47) {
        std::string const three = bytes({value >> 16, value >> 8, value});
        expectDecoded(differences, three);
        expectDecoded(differences, "ab" + three + "cd\xC3\xA9");
    }
    CHECK(differences.first() == "");
    CHECK(differences.compared() > 700000);
}

TEST_CASE("make_wstring sees an odd byte at every position of an ASCII run") {
    Differences differences;
    for (std::size_t size = 1; size <= 130; ++size) {
        for (std::size_t at = 0; at < size; ++at) {
            for (unsigned const odd :
                 {0x00U, 0x7FU, 0x80U, 0xBFU, 0xC0U, 0xC3U, 0xE2U, 0xF0U, 0xFBU, 0xFDU, 0xFFU}) {
                std::string text(size, 'a');
                text[at] = byte(odd);
                expectDecoded(differences, text);
                differences.expect(Koru::make_wstring(text.c_str()), modelDecode(text), text);
            }
        }
    }
    CHECK(differences.first() == "");
    CHECK(differences.compared() == 130 * 131 / 2 * 11 * 2);
}

TEST_CASE("make_wstring sees a whole and a cut character at every position of an ASCII run") {
    Differences differences;
    for (std::uint32_t const value : {0xE9U, 0x20ACU, 0x1F600U, 0x3FFFFFFU, 0x7FFFFFFFU}) {
        std::string const whole = modelEncode(std::wstring(1, unit(value)));
        for (std::size_t before = 0; before <= 130; ++before) {
            for (std::size_t size = 1; size <= whole.size(); ++size) {
                for (std::size_t const after : {0U, 1U, 4U, 5U, 40U}) {
                    expectDecoded(differences, std::string(before, 'a') + whole.substr(0, size) +
                                                   std::string(after, 'z'));
                }
            }
        }
    }
    CHECK(differences.first() == "");
}

TEST_CASE("make_wstring agrees with the model on random bytes at every alignment") {
    Random random(6);
    Differences differences;
    for (std::size_t size = 0; size <= 600; ++size) {
        for (std::size_t offset = 0; offset < 32; ++offset) {
            std::string const text = randomBytes(random, size, offset % 4 == 0);
            expectDecoded(differences, text);
            std::string const shifted = std::string(offset, 'x') + text;
            differences.expect(Koru::make_wstring(shifted.c_str() + offset), modelDecode(text),
                               text);
        }
    }
    CHECK(differences.first() == "");
    CHECK(differences.compared() == 601 * 32 * 2);
}

TEST_CASE("make_wstring agrees with the model on long text") {
    Random random(7);
    Differences differences;
    for (std::size_t const size : {1023U, 1024U, 1025U, 2047U, 4096U, 4097U, 65537U, 100000U}) {
        for (int round = 0; round < 4; ++round) {
            expectDecoded(differences, randomBytes(random, size, false));
        }
        for (std::uint32_t const value :
             {0x61U, 0xE9U, 0x20ACU, 0x1F600U, 0x3FFFFFFU, 0x7FFFFFFFU}) {
            std::string const text = modelEncode(std::wstring(size, unit(value)));
            expectDecoded(differences, text);
            expectDecoded(differences, text.substr(0, text.size() - 1));
        }
        expectDecoded(differences, std::string(size, '\x80'));
        expectDecoded(differences, std::string(size, '\xBF'));
        expectDecoded(differences, std::string(size, '\xFF'));
    }
    CHECK(differences.first() == "");
}

// ====================================================== what conversions do not depend on

TEST_CASE("conversions and inserters give the same in every C locale") {
    Random random(8);
    std::vector<std::string> narrow;
    std::vector<std::wstring> wide;
    for (std::size_t size = 0; size < 200; ++size) {
        narrow.push_back(randomBytes(random, size, false));
        wide.push_back(randomUnits(random, size, false));
    }
    for (std::string const& name : localeNames()) {
        CAPTURE(name);
        LocaleScope const scope(name);
        Differences differences;
        for (std::string const& text : narrow) {
            expectDecoded(differences, text);
            differences.expect(written(text), text.substr(0, narrowCount(text.size())), text);
        }
        for (std::wstring const& text : wide) {
            expectEncoded(differences, text);
            std::string low;
            for (wchar_t const c : text) low += byte(valueOf(c));
            differences.expect(written(text), low, text);
        }
        CHECK(differences.first() == "");
        CHECK(differences.compared() == 800);
    }
}

TEST_CASE("conversions, inserters and compare do not depend on the global C++ locale") {
    // Facets that turn every character into '#' and find no two characters of one case.
    struct Narrow : std::ctype<char> {
        char do_widen(char) const override { return '#'; }
        char do_narrow(char, char) const override { return '#'; }
        char do_tolower(char) const override { return '#'; }
    };
    struct Wide : std::ctype<wchar_t> {
        wchar_t do_widen(char) const override { return L'#'; }
        char do_narrow(wchar_t, char) const override { return '#'; }
        wchar_t do_tolower(wchar_t) const override { return L'#'; }
    };
    struct Convert : std::codecvt<wchar_t, char, std::mbstate_t> {
        result do_out(std::mbstate_t&, wchar_t const*, wchar_t const*, wchar_t const*&, char*,
                      char*, char*&) const override {
            return error;
        }
        result do_in(std::mbstate_t&, char const*, char const*, char const*&, wchar_t*, wchar_t*,
                     wchar_t*&) const override {
            return error;
        }
    };
    struct Restore {
        std::locale previous;
        ~Restore() { std::locale::global(previous); }
    };
    std::locale odd(std::locale::classic(), new Narrow);
    odd = std::locale(odd, new Wide);
    odd = std::locale(odd, new Convert);
    std::string encoded;
    std::wstring decoded;
    std::string narrowWritten;
    std::string wideWritten;
    int order[4] = {};
    {
        Restore const restore{std::locale::global(odd)};
        encoded = Koru::make_string(L"a\u00E9\u20AC\U0001F600");
        decoded = Koru::make_wstring("a\xC3\xA9\xE2\x82\xAC");
        narrowWritten = written(std::string("a\0\xE9", 3));
        wideWritten = written(std::wstring(L"a\0\u00E9\u20AC", 4));
        order[0] = Koru::compare("ABC", "abc");
        order[1] = Koru::compare(L"ABC", L"abc");
        order[2] = Koru::compare("a", "b");
        order[3] = Koru::compare(L"b", L"a");
    }
    CHECK(hex(encoded) == "61 C3 A9 E2 82 AC F0 9F 98 80");
    CHECK(hex(decoded) == "61 E9 20AC");
    CHECK(hex(narrowWritten) == "61 0 E9");
    CHECK(hex(wideWritten) == "61 0 E9 AC");
    CHECK(order[0] == 0);
    CHECK(order[1] == 0);
    CHECK(order[2] < 0);
    CHECK(order[3] > 0);
}

TEST_CASE("the string functions may be called from several threads at once") {
    std::vector<Differences> differences(4);
    std::vector<std::thread> threads;
    for (std::size_t i = 0; i < differences.size(); ++i) {
        threads.emplace_back([&differences, i] {
            Random random(static_cast<std::uint32_t>(100 + i));
            for (std::size_t size = 0; size < 300; ++size) {
                std::string const narrow = randomBytes(random, size, true);
                std::wstring const wide = randomUnits(random, size, true);
                expectDecoded(differences[i], narrow);
                expectEncoded(differences[i], wide);
                expectOrderOfRandomPair<char>(differences[i], random);
                expectOrderOfRandomPair<wchar_t>(differences[i], random);
                differences[i].expect(written(narrow), narrow.substr(0, narrowCount(size)), narrow);
                differences[i].expect(Koru::make_string(narrow.c_str()), untilNul(narrow), narrow);
                differences[i].expect(Koru::make_string(L""), Koru::_null_string, narrow);
            }
        });
    }
    for (std::thread& thread : threads) thread.join();
    for (Differences const& each : differences) {
        CHECK(each.first() == "");
        CHECK(each.compared() == 300 * 9);
    }
}

// The sanitizers' allocators end the process where the usual one throws.
TEST_CASE("exhausted memory escapes as bad_alloc and leaves the functions usable" *
          doctest::skip(KORU_TEST_SANITIZED)) {
    test::Outcome const outcome =
        test::execute(test::ownExecutable(), {"string_test", "--self=exhaust-memory"});
    CHECK(outcome.exitCode == 0);
    CHECK(outcome.out == "bad_alloc 6 times, usable\n");
}

// ==================================================================================== inserters

TEST_CASE("the narrow inserter counts with a signed number of 8 bits") {
    struct Row {
        std::size_t size;
        std::size_t written;
    };
    Row const rows[] = {{0, 0},      {1, 1},      {2, 2},     {44, 44},  {126, 126}, {127, 127},
                        {128, 0},    {129, 0},    {200, 0},   {255, 0},  {256, 0},   {257, 1},
                        {300, 44},   {383, 127},  {384, 0},   {385, 0},  {511, 0},   {512, 0},
                        {513, 1},    {639, 127},  {640, 0},   {1000, 0}, {65536, 0}, {65537, 1},
                        {65600, 64}, {100000, 0}, {100100, 4}};
    for (Row const& row : rows) {
        CAPTURE(row.size);
        std::string const text = pattern(row.size);
        CHECK(hex(written(text)) == hex(text.substr(0, row.written)));
    }
}

TEST_CASE("the narrow inserter follows its count for every size up to 1100") {
    Differences differences;
    for (std::size_t size = 0; size <= 1100; ++size) {
        std::string const text = pattern(size);
        differences.expect(written(text), text.substr(0, narrowCount(size)), text);
    }
    CHECK(differences.first() == "");
}

TEST_CASE("the narrow inserter counts the stored size and writes NULs") {
    CHECK(hex(written(std::string("a\0b", 3))) == "61 0 62");
    CHECK(hex(written(std::string(2, '\0'))) == "0 0");
    CHECK(hex(written(std::string("\xE9\xFF\x80\x7F"))) == "E9 FF 80 7F");
    std::string sized("short\0", 6);
    sized.resize(200);
    CHECK(written(sized) == "");
}

TEST_CASE("the wide inserter writes the low 8 bits of every stored character") {
    CHECK(written(std::wstring()) == "");
    CHECK(hex(written(std::wstring(L"a\u00E9\u20AC\U0001F600z"))) == "61 E9 AC 0 7A");
    CHECK(hex(written(std::wstring(L"a\0b\0", 4))) == "61 0 62 0");
    CHECK(hex(written(units({0xFFFFFFFFU, 0x80000000U, 0x7FFFFFFF, 0x12345678}))) == "FF 0 FF 78");
}

TEST_CASE("the wide inserter counts with its full width") {
    Differences differences;
    for (std::size_t const size : {1U, 44U, 127U, 128U, 129U, 255U, 256U, 257U, 300U, 384U, 511U,
                                   512U, 513U, 1024U, 65535U, 65536U, 65537U, 100000U}) {
        std::wstring const text = widePattern(size);
        std::string low;
        for (wchar_t const c : text) low += byte(valueOf(c));
        differences.expect(written(text), low, text);
    }
    CHECK(differences.first() == "");
    CHECK(differences.compared() == 18);
}

TEST_CASE("the inserters pad the first character only and then have used up the width") {
    struct Row {
        std::string label;
        std::ios_base& (*adjust)(std::ios_base&);
        int width;
        std::string expected;
    };
    Row const rows[] = {{"right", std::right, 6, ".....abc"},
                        {"left", std::left, 6, "a.....bc"},
                        {"internal", std::internal, 6, ".....abc"},
                        {"one", std::right, 1, "abc"},
                        {"two", std::right, 2, ".abc"},
                        {"none", std::right, 0, "abc"}};
    for (Row const& row : rows) {
        CAPTURE(row.label);
        std::ostringstream narrow;
        narrow << row.adjust << std::setfill('.') << std::setw(row.width);
        Koru::operator<<(narrow, std::string("abc"));
        CHECK(narrow.str() == row.expected);
        CHECK(narrow.width() == 0);
        CHECK(narrow.fill() == '.');
        std::ostringstream wide;
        wide << row.adjust << std::setfill('.') << std::setw(row.width);
        Koru::operator<<(wide, std::wstring(L"abc"));
        CHECK(wide.str() == row.expected);
        CHECK(wide.width() == 0);
    }
}

TEST_CASE("an insertion that writes nothing leaves the width for the next") {
    for (std::size_t const size : {0U, 128U, 255U, 256U, 512U}) {
        CAPTURE(size);
        std::ostringstream os;
        os << std::setw(5);
        Koru::operator<<(os, std::string(size, 'x'));
        CHECK(os.width() == 5);
        Koru::operator<<(os, std::wstring());
        CHECK(os.width() == 5);
        CHECK(os.str() == "");
    }
}

TEST_CASE("the inserters return their stream and can be chained") {
    using Koru::operator<<;
    std::ostringstream os;
    CHECK(&Koru::operator<<(os, std::string("a")) == &os);
    CHECK(&Koru::operator<<(os, std::wstring(L"b")) == &os);
    CHECK(&Koru::operator<<(os, std::string(128, 'x')) == &os);
    os << std::wstring(L"c") << std::string("d") << std::wstring(L"\u0165") << 1;
    CHECK(os.str() == "abcde1");
}

TEST_CASE("the narrow inserter is chosen over the standard one where it is imported") {
    std::string const text(200, 'x');
    std::ostringstream standard;
    standard << text;
    CHECK(standard.str().size() == 200);
    using Koru::operator<<;
    std::ostringstream os;
    os << text;
    CHECK(os.str().size() == 0);
}

TEST_CASE("the narrow inserter behaves on every stream as one character after another does") {
    expectEveryInsertionAsOneByOne<std::string>({"", "a", "abc", std::string("a\0b", 3),
                                                 pattern(44), pattern(127), pattern(128),
                                                 pattern(256), pattern(300), pattern(511)});
}

TEST_CASE("the wide inserter behaves on every stream as one character after another does") {
    expectEveryInsertionAsOneByOne<std::wstring>(
        {L"", L"a", L"\u0161\u20AC\U0001F600", std::wstring(L"a\0b\0\u0100", 5), widePattern(44),
         widePattern(128), widePattern(300), widePattern(2000)});
}

TEST_CASE("the inserters write as much as the sink takes, for every amount") {
    Differences differences;
    for (std::size_t const area : {0U, 1U, 7U, 64U}) {
        for (std::size_t room = 0; room <= 130; ++room) {
            Setup const setup = Setup("").room(room).area(area);
            expectInsertedAsOneByOne(differences, setup, pattern(127));
            expectInsertedAsOneByOne(differences, setup, widePattern(129));
        }
    }
    CHECK(differences.first() == "");
    CHECK(differences.compared() == 4 * 131 * 2);
}

TEST_CASE("an insertion into a stream that is already bad writes nothing") {
    std::ostringstream os;
    os.setstate(std::ios_base::badbit);
    Koru::operator<<(os, std::string("abc"));
    Koru::operator<<(os, std::wstring(L"abc"));
    CHECK(os.str() == "");
    CHECK(os.bad());
}

TEST_CASE("the inserters write to files, and a full device makes the stream bad") {
    test::TempDir const directory;
    {
        std::ofstream file(directory / "text", std::ios::binary);
        Koru::operator<<(file, pattern(127));
        Koru::operator<<(file, pattern(300));
        Koru::operator<<(file, std::wstring(L"a\0\u0141", 3));
        Koru::operator<<(file, std::wstring(50000, L'w'));
        CHECK(file.good());
    }
    std::string const expected =
        pattern(127) + pattern(44) + std::string("a\0A", 3) + std::string(50000, 'w');
    CHECK((test::readFile(directory / "text") == expected));
    std::ofstream full("/dev/full", std::ios::binary);
    REQUIRE(full.is_open());
    Koru::operator<<(full, std::wstring(100000, L'w'));
    CHECK(full.bad());
}

TEST_CASE("the inserters write where the stream stands") {
    std::ostringstream os("0123456789");
    os.seekp(2);
    Koru::operator<<(os, std::string("ab"));
    Koru::operator<<(os, std::wstring(L"cd"));
    CHECK(os.str() == "01abcd6789");
    CHECK(static_cast<long>(os.tellp()) == 6);
}

namespace {

/// A buffer that ends its thread when the third character arrives.
class EndsThread : public std::streambuf {
public:
    std::string taken;

protected:
    int_type overflow(int_type c) override {
        if (taken.size() == 2) ::pthread_exit(this);
        taken += traits_type::to_char_type(c);
        return c;
    }
};

/// "unwound" and the stream's state, when a thread that inserts the text into such a buffer ends
/// as it should: with its stack unwound through the insertion.
template <class Text, class Insert>
std::string endedWhileInserting(Text const& text, Insert insert) {
    struct Job {
        EndsThread buffer;
        std::ostream os{&buffer};
        bool unwound = false;
        Text const* text = nullptr;
        Insert* insert = nullptr;
    } job;
    job.text = &text;
    job.insert = &insert;
    pthread_t thread;
    auto const body = [](void* argument) -> void* {
        struct Unwinds {
            bool& flag;
            ~Unwinds() { flag = true; }
        };
        Job& own = *static_cast<Job*>(argument);
        Unwinds const unwinds{own.unwound};
        (*own.insert)(own.os, *own.text);
        return nullptr;
    };
    if (::pthread_create(&thread, nullptr, body, &job) != 0) return "no thread";
    void* result = nullptr;
    ::pthread_join(thread, &result);
    return job.buffer.taken + (result == &job.buffer ? " ended" : " returned") +
           (job.unwound ? " unwound " : " abandoned ") +
           std::to_string(static_cast<int>(job.os.rdstate()));
}

} // namespace

TEST_CASE("a thread that ends while it inserts is unwound, as with one character after another") {
    // In a child: an implementation that kept the unwinding inside would end the process.
    test::Outcome const outcome = test::inChild([] {
        ::alarm(60);
        auto const oneByOne = [](std::ostream& os, auto const& text) { insertOneByOne(os, text); };
        auto const inserter = [](std::ostream& os, auto const& text) {
            Koru::operator<<(os, text);
        };
        std::string const narrow = "abcdef";
        std::wstring const wide = L"abcdef";
        std::string const expected = endedWhileInserting(narrow, oneByOne);
        std::printf("%s", expected.c_str());
        if (endedWhileInserting(narrow, inserter) != expected) return 1;
        if (endedWhileInserting(wide, inserter) != expected) return 2;
        return 0;
    });
    CHECK(outcome.signal == 0);
    CHECK(outcome.exitCode == 0);
    CHECK(outcome.out == "ab ended unwound 1");
}
