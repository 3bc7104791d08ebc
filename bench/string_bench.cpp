// The text functions: UTF-8 in both directions, comparison, and the stream inserters.
#include <koru/string.h>

#include <iconv.h>
#include <strings.h>
#include <wchar.h>

#include <clocale>
#include <cstring>
#include <ostream>
#include <random>
#include <string>
#include <vector>

#include "fixedbuffer.h"
#include "harness.h"
#include "qt.h"

#ifdef KORU_BENCH_HAS_BOOST
#include <boost/locale/encoding_utf.hpp>
#endif
#ifdef KORU_BENCH_HAS_ICU
#include <unicode/ustring.h>
#endif
#ifdef KORU_BENCH_HAS_UTFCPP
#include <utf8.h>
#endif

namespace {

using bench::FixedBuffer;
using bench::Peer;
using bench::Work;

/// Words of one script, strung together to any size.
struct Script {
    char const* name;
    std::vector<std::wstring> words;
};

/// Plain words, nineteen in twenty, so that one character in a hundred is not ASCII.
std::vector<std::wstring> _oneInAHundred() {
    std::vector<std::wstring> words(19, L"word ");
    words.push_back(L"café ");
    return words;
}

std::vector<Script> _scripts() {
    return {
        {"ASCII",
         {L"the ", L"quick ", L"brown ", L"fox ", L"jumps ", L"over ", L"lazy ", L"dog. "}},
        {"European",
         {L"Größe ", L"über ",    L"naïve ",     L"façade ",  L"señor ", L"mañana ", L"zażółć ",
          L"gęślą ", L"příliš ",  L"žluťoučký ", L"smörgås ", L"crème ", L"the ",    L"and ",
          L"Preis ", L"12,50 € ", L"été ",       L"für ",     L"niño ",  L"kůň "}},
        {"1% accents", _oneInAHundred()},
        {"CJK",
         {L"設定", L"檔案", L"讀取", L"日本語", L"文字列", L"변환", L"한국어", L"路徑", L"，",
          L"。"}},
        {"emoji", {L"😀", L"🚀", L"🎉", L"👍", L"🌍", L"🔥", L"🧪", L"📦"}},
    };
}

std::size_t _encodedSize(wchar_t c) {
    return c < 0x80 ? 1U : c < 0x800 ? 2U : c < 0x10000 ? 3U : 4U;
}

/// Text of at most this many UTF-8 bytes and characters, as much as fits. Which word comes next
/// cannot be foreseen, or branch prediction would learn the text by heart.
std::wstring _text(Script const& script, std::size_t maxBytes, std::size_t maxCharacters) {
    std::mt19937 random(1);
    std::wstring text;
    std::size_t bytes = 0;
    for (;;) {
        for (wchar_t const c : script.words[random() % script.words.size()]) {
            bytes += _encodedSize(c);
            if (bytes > maxBytes || text.size() == maxCharacters) return text;
            text += c;
        }
    }
}

/// A conversion of the C library's iconv, opened once and used for all of the text.
class Iconv {
public:
    Iconv(char const* to, char const* from) : handle_(::iconv_open(to, from)) {}
    Iconv(Iconv const&) = delete;
    Iconv& operator=(Iconv const&) = delete;
    ~Iconv() { ::iconv_close(handle_); }

    /// Converts into the buffer and makes a string of what is there.
    template <class Out, class In>
    std::basic_string<Out> convert(std::basic_string<In> const& text, std::vector<Out>& buffer) {
        char* in = reinterpret_cast<char*>(const_cast<In*>(text.data()));
        std::size_t inLeft = text.size() * sizeof(In);
        char* const begin = reinterpret_cast<char*>(buffer.data());
        char* out = begin;
        std::size_t outLeft = buffer.size() * sizeof(Out);
        ::iconv(handle_, &in, &inLeft, &out, &outLeft);
        return std::basic_string<Out>(buffer.data(),
                                      static_cast<std::size_t>(out - begin) / sizeof(Out));
    }

private:
    iconv_t handle_;
};

/// The functions of the C library that convert by locale see one that says UTF-8; no other
/// function does.
Work _inUtf8Locale(Work const& work) {
    return work.within([] { std::setlocale(LC_CTYPE, "C.UTF-8"); },
                       [] { std::setlocale(LC_CTYPE, "C"); });
}

bool _hasUtf8Locale() {
    bool const has = std::setlocale(LC_CTYPE, "C.UTF-8") != nullptr;
    std::setlocale(LC_CTYPE, "C");
    return has;
}

/// One text in both forms, and buffers that hold either.
struct Sample {
    std::wstring wide;
    std::string narrow;
    std::vector<wchar_t> wideBuffer;
    std::vector<char> narrowBuffer;
    std::vector<char16_t> utf16;

    explicit Sample(std::wstring text)
        : wide(std::move(text)), narrow(Koru::make_string(wide)), wideBuffer(wide.size() + 1),
          narrowBuffer(narrow.size() + 1), utf16(2 * wide.size() + 1) {}
};

/// A peer whose answer is ours. The function makes a string from the sample.
template <class Result, class Convert>
Peer _converter(char const* name, Result const& expected, Convert convert) {
    bench::require(convert() == expected, name);
    return bench::peer(name, Work::repeated(convert));
}

#ifdef KORU_BENCH_HAS_BOOST
struct Boost {
    static constexpr char const* name = "Boost.Locale utf_to_utf";
    static std::wstring decode(Sample const& s) {
        return boost::locale::conv::utf_to_utf<wchar_t>(s.narrow);
    }
    static std::string encode(Sample const& s) {
        return boost::locale::conv::utf_to_utf<char>(s.wide);
    }
};
#else
struct Boost : bench::Missing {
    static constexpr char const* name = "Boost.Locale utf_to_utf";
};
#endif

#ifdef KORU_BENCH_HAS_ICU
/// By way of UTF-16, which is what ICU converts from and to.
struct Icu {
    static constexpr char const* name = "ICU";
    static std::wstring decode(Sample& s) {
        UErrorCode error = U_ZERO_ERROR;
        std::int32_t units = 0;
        std::int32_t size = 0;
        u_strFromUTF8(s.utf16.data(), sizeOf(s.utf16), &units, s.narrow.data(), sizeOf(s.narrow),
                      &error);
        u_strToWCS(s.wideBuffer.data(), sizeOf(s.wideBuffer), &size, s.utf16.data(), units, &error);
        return std::wstring(s.wideBuffer.data(), static_cast<std::size_t>(size));
    }
    static std::string encode(Sample& s) {
        UErrorCode error = U_ZERO_ERROR;
        std::int32_t units = 0;
        std::int32_t size = 0;
        u_strFromWCS(s.utf16.data(), sizeOf(s.utf16), &units, s.wide.data(), sizeOf(s.wide),
                     &error);
        u_strToUTF8(s.narrowBuffer.data(), sizeOf(s.narrowBuffer), &size, s.utf16.data(), units,
                    &error);
        return std::string(s.narrowBuffer.data(), static_cast<std::size_t>(size));
    }

private:
    template <class Text>
    static std::int32_t sizeOf(Text const& text) {
        return static_cast<std::int32_t>(text.size());
    }
};
#else
struct Icu : bench::Missing {
    static constexpr char const* name = "ICU";
};
#endif

#ifdef KORU_BENCH_HAS_UTFCPP
struct Utfcpp {
    static constexpr char const* name = "utfcpp";
    static std::wstring decode(Sample const& s) {
        std::wstring result;
        result.reserve(s.narrow.size());
        utf8::utf8to32(s.narrow.begin(), s.narrow.end(), std::back_inserter(result));
        return result;
    }
    static std::string encode(Sample const& s) {
        std::string result;
        result.reserve(s.wide.size());
        utf8::utf32to8(s.wide.begin(), s.wide.end(), std::back_inserter(result));
        return result;
    }
};
#else
struct Utfcpp : bench::Missing {
    static constexpr char const* name = "utfcpp";
};
#endif

template <class Library>
Peer _decoder(Sample& s) {
    return bench::peerOf<Library>([&s](auto library) {
        bench::require(library.decode(s) == s.wide, library.name);
        return Work::repeated([&s, library] { return library.decode(s); });
    });
}

template <class Library>
Peer _encoder(Sample& s) {
    return bench::peerOf<Library>([&s](auto library) {
        bench::require(library.encode(s) == s.narrow, library.name);
        return Work::repeated([&s, library] { return library.encode(s); });
    });
}

Peer _libraryDecoder(Sample& s) {
    if (!_hasUtf8Locale()) return bench::missing("mbstowcs (C.UTF-8)");
    return bench::peer("mbstowcs (C.UTF-8)", _inUtf8Locale(Work::repeated([&s] {
                           std::size_t const n = std::mbstowcs(
                               s.wideBuffer.data(), s.narrow.c_str(), s.wideBuffer.size());
                           return std::wstring(s.wideBuffer.data(), n);
                       })));
}

Peer _libraryEncoder(Sample& s) {
    if (!_hasUtf8Locale()) return bench::missing("wcstombs (C.UTF-8)");
    return bench::peer("wcstombs (C.UTF-8)", _inUtf8Locale(Work::repeated([&s] {
                           std::size_t const n = std::wcstombs(
                               s.narrowBuffer.data(), s.wide.c_str(), s.narrowBuffer.size());
                           return std::string(s.narrowBuffer.data(), n);
                       })));
}

/// The wide side of the text, moved and nothing else.
Peer _move(Sample& s, double goal) {
    return bench::limit("memcpy of the wide text", Work::repeated([&s] {
                            bench::keep(s.wide);
                            std::memcpy(s.wideBuffer.data(), s.wide.data(),
                                        s.wide.size() * sizeof(wchar_t));
                            return s.wideBuffer.data();
                        }),
                        goal);
}

struct Goals {
    double peer = 0;
    double limit = 0;
};

void _decode(bench::Report& report, std::string const& row, Sample& s, Goals goals) {
    if (!report.wants(row)) return;
    Iconv converter("WCHAR_T", "UTF-8");
    report.compare(
        row, Work::repeated([&s] { return Koru::make_wstring(s.narrow); }),
        {_decoder<Boost>(s),
         _converter("iconv", s.wide, [&] { return converter.convert(s.narrow, s.wideBuffer); }),
         _decoder<Icu>(s), bench::peer("Qt", bench::qtDecode(s.narrow)), _decoder<Utfcpp>(s),
         _libraryDecoder(s), _move(s, goals.limit)},
        goals.peer);
}

void _encode(bench::Report& report, std::string const& row, Sample& s, Goals goals) {
    if (!report.wants(row)) return;
    Iconv converter("UTF-8", "WCHAR_T");
    report.compare(
        row, Work::repeated([&s] { return Koru::make_string(s.wide); }),
        {_encoder<Boost>(s),
         _converter("iconv", s.narrow, [&] { return converter.convert(s.wide, s.narrowBuffer); }),
         _encoder<Icu>(s), bench::peer("Qt", bench::qtEncode(s.wide)), _encoder<Utfcpp>(s),
         _libraryEncoder(s), _move(s, goals.limit)},
        goals.peer);
}

struct Size {
    char const* name;
    std::size_t bytes;
    std::size_t characters;
};

struct ConversionGoal {
    std::string text;
    Goals decode;
    Goals encode;
};

Goals _goalOf(std::string const& text, bool decoding) {
    static ConversionGoal const goals[] = {
        {"ASCII, 12 characters", {1.15, 0}, {0.85, 0}},
        {"ASCII, 64 B", {0.7, 0}, {0.6, 0}},
        {"ASCII, 4 KB", {0.30, 3.2}, {0.38, 3.8}},
        {"1% accents, 64 K characters", {0.48, 0}, {0.55, 0}},
        {"European, 64 K characters", {0.6, 0}, {0.25, 0}},
        {"CJK, 64 K characters", {0.75, 0}, {0.4, 0}},
    };
    for (ConversionGoal const& goal : goals) {
        if (goal.text == text) return decoding ? goal.decode : goal.encode;
    }
    return {};
}

void _conversions(bench::Report& report) {
    static std::size_t const any = static_cast<std::size_t>(-1);
    static Size const sizes[] = {{"12 characters", any, 12},
                                 {"64 B", 64, any},
                                 {"4 KB", 4096, any},
                                 {"64 K characters", any, 65536},
                                 {"1 MB", 1048576, any}};
    for (Script const& script : _scripts()) {
        for (Size const& size : sizes) {
            std::string const text = std::string(script.name) + ", " + size.name;
            Sample sample(_text(script, size.bytes, size.characters));
            _decode(report, "decode " + text, sample, _goalOf(text, true));
            _encode(report, "encode " + text, sample, _goalOf(text, false));
        }
    }
}

/// The peers are pure functions: without the barriers the compiler would call them once.
template <class String, class Compare>
Work _comparison(String const& a, String const& b, Compare compare) {
    return Work::repeated([&a, &b, compare] {
        bench::keep(a);
        bench::keep(b);
        return compare(a, b);
    });
}

/// @param goal   against the fastest peer
/// @param limit  against the C library, which is none
void _compareWide(bench::Report& report, std::string const& text, std::wstring const& a,
                  std::wstring const& b, double goal, double limit = 0) {
    auto const ours = [](std::wstring const& x, std::wstring const& y) {
        return Koru::compare(x, y);
    };
    auto const library = [](std::wstring const& x, std::wstring const& y) {
        return ::wcscasecmp(x.c_str(), y.c_str());
    };
    report.compare("compare wide, " + text, _comparison(a, b, ours),
                   {bench::peer("QString", bench::qtCompare(a, b)),
                    bench::limit("wcscasecmp", _comparison(a, b, library), limit)},
                   goal);
}

void _compareNarrow(bench::Report& report, std::string const& text, std::string const& a,
                    std::string const& b, double goal) {
    auto const ours = [](std::string const& x, std::string const& y) {
        return Koru::compare(x, y);
    };
    auto const library = [](std::string const& x, std::string const& y) {
        return ::strcasecmp(x.c_str(), y.c_str());
    };
    report.compare("compare narrow, " + text, _comparison(a, b, ours),
                   {bench::peer("strcasecmp", _comparison(a, b, library))}, goal);
}

void _comparisons(bench::Report& report) {
    _compareWide(report, "16, equal but for case", L"ConnectionLimits", L"cONNECTIONlIMITS", 0.27,
                 0.12);
    _compareWide(report, "16, identical", L"ConnectionLimits", L"ConnectionLimits", 0);
    _compareWide(report, "16, early difference", L"ConnectionLimits", L"CacheSizeMegaByt", 0.75);
    _compareWide(report, "16, late difference", L"ConnectionLimits", L"ConnectionLimitz", 0.27);
    _compareWide(report, "6, equal but for case", L"Height", L"hEIGHT", 0);
    _compareWide(report, "6, late difference", L"Height", L"Heighs", 0.5);
    _compareNarrow(report, "16, equal but for case", "ConnectionLimits", "cONNECTIONlIMITS", 1.35);
    _compareNarrow(report, "16, identical", "ConnectionLimits", "ConnectionLimits", 0);
    _compareNarrow(report, "16, early difference", "ConnectionLimits", "CacheSizeMegaByt", 1.35);
}

void _insertWide(bench::Report& report, FixedBuffer<char>& buffer, std::ostream& out) {
    std::wstring const wide(100, L'x');
    auto const ours = [&] {
        buffer.rewind();
        Koru::operator<<(out, wide);
        return out.good();
    };
    auto const converted = [&] {
        buffer.rewind();
        out << std::string(wide.begin(), wide.end());
        return out.good();
    };
    FixedBuffer<wchar_t> wideBuffer;
    std::wostream wideOut(&wideBuffer);
    auto const sputn = [&] {
        wideBuffer.rewind();
        return wideOut.rdbuf()->sputn(wide.data(), 100);
    };
    report.compare("insert wide, 100", Work::repeated(ours),
                   {bench::peer("<< of a std::string", Work::repeated(converted)),
                    bench::limit("sputn to a wide stream", Work::repeated(sputn), 0.6)},
                   0.4);
}

void _insertNarrow(bench::Report& report, FixedBuffer<char>& buffer, std::ostream& out) {
    std::string const narrow(100, 'x');
    auto const ours = [&] {
        buffer.rewind();
        Koru::operator<<(out, narrow);
        return out.good();
    };
    auto const standard = [&] {
        buffer.rewind();
        std::operator<<(out, narrow);
        return out.good();
    };
    auto const sputn = [&] {
        buffer.rewind();
        return out.rdbuf()->sputn(narrow.data(), 100);
    };
    report.compare("insert narrow, 100", Work::repeated(ours),
                   {bench::peer("std::operator<<", Work::repeated(standard)),
                    bench::limit("sputn", Work::repeated(sputn), 1.9)});
}

} // namespace

int main(int argc, char** argv) {
    bench::Report report("strings", bench::Options(argc, argv));
    _conversions(report);
    _comparisons(report);
    FixedBuffer<char> buffer;
    std::ostream out(&buffer);
    _insertWide(report, buffer, out);
    _insertNarrow(report, buffer, out);
}
