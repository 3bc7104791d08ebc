// The conversions and the wide comparison take shortcuts: blocks of sixteen bytes, with the
// machine's shuffle instruction and without it. Here each shortcut is held against the plain rule,
// written down once more character by character. The sources of the conversions are compiled into
// this program, so that it reaches both ways whatever the machine has; the rest goes through the
// library.
#include <koru/string.h>

#include <dlfcn.h>
#include <sys/mman.h>
#include <unistd.h>
#include <wctype.h>

#include <algorithm>
#include <cstdint>
#include <cstring>
#include <limits>
#include <random>
#include <sstream>
#include <stdexcept>
#include <string>
#include <vector>

#include <doctest/doctest.h>

#include "text/convert.h"
#include "text/utf8.h"

namespace {

bool pairsDotlessI = false; ///< as a Turkish locale does

wint_t plainLower(wint_t c) {
    static auto const next = reinterpret_cast<wint_t (*)(wint_t)>(::dlsym(RTLD_NEXT, "towlower"));
    return next(c);
}

} // namespace

// Stands before that of the C library, also for the library under test: no machine has every
// locale.
extern "C" wint_t towlower(wint_t c) noexcept {
    if (pairsDotlessI && c == L'I') return 0x131;
    if (pairsDotlessI && c == 0x130) return L'i';
    return plainLower(c);
}

namespace {

// The plain rules.

std::wstring decodePlainly(std::string const& text) {
    std::size_t const n = std::strlen(text.c_str());
    auto const bits = [&text](std::size_t i, int mask) {
        return static_cast<std::int32_t>(static_cast<unsigned char>(text[i])) & mask;
    };
    std::wstring result;
    for (std::size_t i = 0; i < n;) {
        std::int32_t const b = bits(i, 0xFF);
        std::size_t size = 1;
        std::int32_t c = b;
        if (b >= 0x80) {
            if (i + 1 < n && (b & 0xE0) == 0xC0)
                size = 2, c = b & 0x1F;
            else if (i + 2 < n && (b & 0xF0) == 0xE0)
                size = 3, c = b & 0x0F;
            else if (i + 3 < n && (b & 0xF8) == 0xF0)
                size = 4, c = b & 0x07;
            else if (i + 4 < n && (b & 0xFC) == 0xF8)
                size = 5, c = b & 0x03;
            else if (i + 5 < n)
                size = 6, c = b & 0x01;
            else
                c = L'?';
        }
        for (std::size_t k = 1; k < size; ++k) c = c << 6 | bits(i + k, 0x3F);
        if (c == 0) break;
        result += c;
        i += size;
    }
    return result;
}

std::string encodePlainly(std::wstring const& text) {
    std::string result;
    for (wchar_t const c : text) {
        if (c == 0) break;
        std::size_t further = 0;
        for (std::int32_t const limit : {0x7F, 0x7FF, 0xFFFF, 0x1FFFFF, 0x3FFFFFF}) {
            if (c > limit) ++further;
        }
        static int const leads[] = {0, 0xC0, 0xE0, 0xF0, 0xF8, 0xFC};
        int const lead = further == 0 ? c & 0xFF : leads[further] | c >> (6 * further);
        if (lead == 0) break;
        result += static_cast<char>(lead);
        while (further != 0) result += static_cast<char>(0x80 | (c >> (6 * --further) & 0x3F));
    }
    return result;
}

int comparePlainly(std::wstring const& a, std::wstring const& b) {
    for (std::size_t i = 0;; ++i) {
        auto const x = towlower(static_cast<wint_t>(a.c_str()[i]));
        auto const y = towlower(static_cast<wint_t>(b.c_str()[i]));
        if (x != y) return static_cast<int>(x - y);
        if (x == 0) return 0;
    }
}

/// Text in memory of its own, ending where no byte may be read any more.
template <class Char>
class Guarded {
public:
    Guarded() : page_(static_cast<std::size_t>(::sysconf(_SC_PAGESIZE))), room_(page_ * 16) {
        memory_ = static_cast<char*>(::mmap(nullptr, room_ + page_, PROT_READ | PROT_WRITE,
                                            MAP_PRIVATE | MAP_ANONYMOUS, -1, 0));
        REQUIRE(memory_ != MAP_FAILED);
        REQUIRE(::mprotect(memory_ + room_, page_, PROT_NONE) == 0);
    }
    Guarded(Guarded const&) = delete;
    Guarded& operator=(Guarded const&) = delete;
    ~Guarded() { ::munmap(memory_, room_ + page_); }

    /// Copies characters; valid until the next call.
    Char* put(std::basic_string<Char> const& text) {
        std::size_t const size = text.size() * sizeof(Char);
        if (size > room_) throw std::length_error("text for a guarded page");
        return static_cast<Char*>(std::memcpy(memory_ + room_ - size, text.data(), size));
    }

private:
    std::size_t page_;
    std::size_t room_;
    char* memory_;
};

/// What the blocks are put together to, on the way with or without shuffles.
template <class Out, class In, class Convert>
std::basic_string<Out> joinBlocks(std::basic_string<In> const& text, Convert convert) {
    static Guarded<In> in;
    static Guarded<Out> out;
    In const* s = in.put(text);
    In const* const end = s + text.size();
    std::basic_string<Out> result;
    while (s != end) {
        Out* const block = out.put(std::basic_string<Out>(Koru::BLOCK, Out{'#'}));
        result.append(block, convert(s, end, block));
    }
    return result;
}

std::wstring decodeByBlocks(std::string const& text, bool shuffle) {
    return joinBlocks<wchar_t>(text, [shuffle](char const*& s, char const* end, wchar_t* to) {
        return Koru::decodeBlock(s, end, to, shuffle);
    });
}

std::string encodeByBlocks(std::wstring const& text, bool shuffle) {
    return joinBlocks<char>(text, [shuffle](wchar_t const*& s, wchar_t const* end, char* to) {
        return Koru::encodeBlock(s, end, to, shuffle);
    });
}

/// The ways of converting: plain ones everywhere, shuffles where the machine has them.
std::vector<bool> ways() {
    if (Koru::canShuffle()) return {false, true};
    MESSAGE("this machine has no SSSE3");
    return {false};
}

/// The code units in hexadecimal, to tell what failed.
template <class Char>
std::string dump(std::basic_string<Char> const& text) {
    static char const digits[] = "0123456789ABCDEF";
    std::string result;
    for (Char const c : text) {
        std::string number;
        auto rest = static_cast<std::uint32_t>(c) & (sizeof(Char) == 1 ? 0xFFU : ~0U);
        do number.insert(number.begin(), digits[rest % 16]);
        while ((rest /= 16) != 0);
        result += number + ' ';
    }
    return result;
}

/// Holds all ways of decoding a text without zero bytes against the plain one.
void checkDecoding(std::string const& text) {
    static std::vector<bool> const all = ways();
    std::wstring const expected = decodePlainly(text);
    for (bool const shuffle : all) {
        if (decodeByBlocks(text, shuffle) == expected) continue;
        CAPTURE(dump(text));
        FAIL_CHECK("decoding differs, with shuffles: " << shuffle);
    }
}

void checkEncoding(std::wstring const& text) {
    static std::vector<bool> const all = ways();
    std::string const expected = encodePlainly(text);
    for (bool const shuffle : all) {
        if (encodeByBlocks(text, shuffle) == expected) continue;
        CAPTURE(dump(text));
        FAIL_CHECK("encoding differs, with shuffles: " << shuffle);
    }
}

/// Calls a function with every text of three characters.
template <class Char, class Function>
void forEachTriple(std::basic_string<Char> const& alphabet, Function function) {
    for (Char const a : alphabet) {
        for (Char const b : alphabet) {
            for (Char const c : alphabet) function(std::basic_string<Char>{a, b, c});
        }
    }
}

template <class Char>
std::basic_string<Char> repeat(std::basic_string<Char> const& text, std::size_t times) {
    std::basic_string<Char> result;
    for (; times != 0; --times) result += text;
    return result;
}

/// A run of characters of one form after the other, at random.
std::wstring randomText(std::mt19937& random, std::size_t size) {
    static std::int32_t const limits[] = {
        0x80,    0x80,     0x80,     0x800,     0x10000,
        0x10000, 0x110000, 0x200000, 0x4000000, std::numeric_limits<std::int32_t>::max()};
    std::wstring text;
    while (text.size() < size) {
        // The last two are rare, or hardly a step would be without one.
        std::int32_t const limit = limits[random() % (random() % 64 == 0 ? 10 : 7)];
        for (std::size_t run = random() % 24 + 1; run != 0; --run) {
            text += 1 + static_cast<std::int32_t>(random() % static_cast<std::uint32_t>(limit - 1));
        }
    }
    text.resize(size);
    return text;
}

std::size_t randomSize(std::mt19937& random) {
    return random() % 16 == 0 ? random() % (3 * Koru::BLOCK) : random() % 80;
}

} // namespace

TEST_CASE("decoding any three odd bytes at any place of a step follows the plain rule") {
    std::string const odd("\x01\x41\x7F\x80\x81\xBF\xC0\xC3\xDF\xE0\xE2\xEF\xF0\xF4\xF8\xFD\xFF",
                          17);
    std::string const fillers[] = {"x", "\xC3\xA9", "\xE4\xB8\xAD", "\xF0\x9F\x98\x80"};
    for (std::string const& filler : fillers) {
        for (std::size_t before = 0; before <= 17; ++before) {
            std::string const left = repeat(filler, before).substr(0, before + filler.size());
            std::string const right = repeat(filler, 24 / filler.size());
            forEachTriple(odd, [&](std::string const& three) {
                if (before % 3 == 0) checkDecoding(left + three);
                checkDecoding(left + three + right);
                if (before % 3 == 1) checkDecoding(left + three + std::string(33, 'x') + filler);
            });
        }
    }
}

TEST_CASE("encoding any three odd characters at any place of a step follows the plain rule") {
    std::wstring const odd{0,
                           1,
                           0x41,
                           0x7F,
                           0x80,
                           0x7FF,
                           0x800,
                           0x7FFF,
                           0x8000,
                           0xFFFF,
                           0x10000,
                           0x1FFFFF,
                           0x200000,
                           0x3FFFFFF,
                           0x4000000,
                           0x7FFFFFFF,
                           -1,
                           -256,
                           std::numeric_limits<wchar_t>::min()};
    for (wchar_t const filler : {L'x', L'\u00E9', L'\u4E2D', L'\U0001F600'}) {
        for (std::size_t before = 0; before <= 8; ++before) {
            std::wstring const left(before, filler);
            std::wstring const right(20, filler);
            forEachTriple(odd, [&](std::wstring const& three) {
                if (before % 3 == 0) checkEncoding(left + three);
                checkEncoding(left + three + right);
                if (before % 3 == 1) checkEncoding(left + three + std::wstring(17, L'x') + right);
            });
        }
    }
}

TEST_CASE("every code point is converted by the plain rule in both directions") {
    for (std::int32_t first = 1; first < 0x110000; first += 0x1000) {
        std::wstring text;
        for (std::int32_t c = first; c < first + 0x1000; ++c) text += c;
        checkEncoding(text);
        std::string const bytes = encodePlainly(text);
        checkDecoding(bytes);
        CHECK((decodePlainly(bytes) == text));
    }
}

TEST_CASE(
    "any lead among characters of four bytes, complete or cut short, follows the plain rule") {
    // Once failed: D0 to DF before three continuation bytes passed for leads of four bytes.
    std::string const four = "\xF0\x9F\x98\x80";
    for (int lead = 0x01; lead <= 0xFF; ++lead) {
        for (std::size_t tails = 0; tails <= 5; ++tails) {
            std::string const odd = static_cast<char>(lead) + std::string(tails, '\xA5');
            for (std::size_t before = 0; before <= 17; ++before) {
                checkDecoding(repeat(four, before) + odd + repeat(four, 9));
                checkDecoding(std::string(before, 'x') + odd + repeat(four, 9));
            }
        }
    }
}

TEST_CASE("an overlong zero ends the text wherever in a step it stands") {
    for (char const* zero : {"\xC0\x80", "\xE0\x80\x80", "\xF0\x80\x80\x80", "\xC0@", "\xE0@@"}) {
        for (std::size_t before = 0; before <= 40; ++before) {
            checkDecoding(std::string(before, 'x') + zero + std::string(40, 'y'));
            checkDecoding(repeat<char>("\xC3\xA9", before) + zero + std::string(40, 'y'));
            checkDecoding(repeat<char>("\xF0\x9F\x98\x80", before) + zero +
                          repeat<char>("\xF0\x9F\x98\x80", 8));
        }
    }
}

TEST_CASE("random text is converted by the plain rule, well-formed or damaged") {
    std::mt19937 random(1);
    for (int i = 0; i < 6000; ++i) {
        std::wstring text = randomText(random, randomSize(random));
        checkEncoding(text);
        std::string bytes = encodePlainly(text);
        checkDecoding(bytes);
        for (int damage = 0; damage < 3 && !bytes.empty(); ++damage) {
            bytes[random() % bytes.size()] = static_cast<char>(random() % 255 + 1);
            checkDecoding(bytes);
        }
        if (text.empty()) continue;
        text[random() % text.size()] = static_cast<wchar_t>(random());
        checkEncoding(text);
    }
}

TEST_CASE("text around the size of a block is converted by the plain rule") {
    for (std::wstring const& character : {std::wstring(L"x"), std::wstring(L"\u00E9"),
                                          std::wstring(L"\u4E2D"), std::wstring(L"\U0001F600")}) {
        for (std::size_t size = Koru::BLOCK - 100; size <= Koru::BLOCK + 20; ++size) {
            std::wstring const text(size, L'x');
            checkEncoding(text + repeat(character, 40));
            checkDecoding(encodePlainly(text + repeat(character, 40)));
            checkEncoding(std::wstring(size, character[0]));
            checkDecoding(encodePlainly(std::wstring(size, character[0])));
        }
    }
}

TEST_CASE("the public conversions follow the plain rule at every size up to three blocks") {
    std::mt19937 random(2);
    for (std::size_t size = 0; size <= 3 * Koru::BLOCK; size += size < 100 ? 1 : 29) {
        std::wstring const text = randomText(random, size);
        std::string const bytes = encodePlainly(text);
        CHECK((Koru::make_string(text) == bytes));
        CHECK((Koru::make_wstring(bytes) == decodePlainly(bytes)));
        CHECK((Koru::make_wstring(bytes.c_str()) == decodePlainly(bytes)));
        CHECK((Koru::make_string(std::wstring(size, L'x')) == std::string(size, 'x')));
        CHECK((Koru::make_wstring(std::string(size, 'x')) == std::wstring(size, L'x')));
    }
}

TEST_CASE("a short name with an odd unit at any place is converted by the plain rule") {
    for (std::size_t size = 1; size <= 18; ++size) {
        for (std::size_t place = 0; place < size; ++place) {
            for (wchar_t c = -300; c <= 300; ++c) {
                std::wstring text(size, L'x');
                text[place] = c;
                CHECK((Koru::make_string(text) == encodePlainly(text)));
                std::string bytes(size, 'x');
                bytes[place] = static_cast<char>(c);
                CHECK((Koru::make_wstring(bytes) == decodePlainly(bytes)));
            }
        }
    }
}

TEST_CASE("a NUL ends the text in any step and any block") {
    for (std::size_t before = 0; before <= 2 * Koru::BLOCK; before += before < 70 ? 1 : 37) {
        for (wchar_t const filler : {L'x', L'\u00E9', L'\u4E2D', L'\U0001F600'}) {
            std::wstring const text = std::wstring(before, filler);
            std::string const bytes = encodePlainly(text);
            CHECK((Koru::make_string(text + L'\0' + text + L'y') == bytes));
            CHECK((Koru::make_wstring(bytes + '\0' + bytes + 'y') == text));
        }
    }
}

TEST_CASE("the bound is the size of the encoded text, or more where it ends early") {
    std::mt19937 random(3);
    for (int i = 0; i < 3000; ++i) {
        std::wstring text = randomText(random, randomSize(random));
        CHECK(Koru::encodedBound(text.data(), text.size()) == encodePlainly(text).size());
        if (text.empty()) continue;
        text[random() % text.size()] = static_cast<wchar_t>(random() % 3 << 30);
        CHECK(Koru::encodedBound(text.data(), text.size()) >= encodePlainly(text).size());
    }
}

TEST_CASE("the bound leaves out what stands behind a NUL, but for less than a step") {
    for (wchar_t const c : {L'x', L'\u4E2D', wchar_t{-1}}) {
        for (std::size_t before = 0; before <= 40; ++before) {
            std::wstring const text(before, c);
            std::size_t const bound = encodePlainly(text).size();
            std::wstring const behind = L'\0' + std::wstring(500, L'\u4E2D');
            CHECK(Koru::encodedBound((text + behind).data(), before + 501) >= bound);
            CHECK(Koru::encodedBound((text + behind).data(), before + 501) < bound + 6 * 16);
        }
    }
}

TEST_CASE("the characters of well-formed text are counted") {
    std::mt19937 random(4);
    for (std::size_t size = 0; size <= 2000; size += size < 100 ? 1 : 61) {
        std::wstring const text = randomText(random, size);
        std::string const bytes = encodePlainly(text);
        CHECK(Koru::countLeads(bytes.data(), bytes.size()) == text.size());
    }
}

namespace {

/// Holds the comparison against the plain one, both ways round and with what the locale says of I.
void checkComparison(std::wstring const& a, std::wstring const& b) {
    for (bool const turkish : {false, true}) {
        pairsDotlessI = turkish;
        bool const same = Koru::compare(a, b) == comparePlainly(a, b) &&
                          Koru::compare(b, a) == comparePlainly(b, a) &&
                          Koru::compare(a.c_str(), b.c_str()) == comparePlainly(a, b);
        pairsDotlessI = false;
        if (same) continue;
        CAPTURE(dump(a));
        CAPTURE(dump(b));
        FAIL_CHECK("comparing differs, Turkish: " << turkish);
    }
}

/// The characters where folding has its corners.
std::wstring const corners{0,
                           1,
                           0x20,
                           L'@',
                           L'A',
                           L'I',
                           L'Z',
                           L'[',
                           L'`',
                           L'a',
                           L'i',
                           L'z',
                           L'{',
                           0x7F,
                           0xC9,
                           0xE9,
                           0x130,
                           0x131,
                           0x212A,
                           0x10041,
                           0x10061,
                           -1,
                           std::numeric_limits<wchar_t>::min() + L'a'};

} // namespace

TEST_CASE("comparing any two corner characters at any place follows the plain rule") {
    for (std::size_t before = 0; before <= 9; ++before) {
        std::wstring const left(before, L'Q');
        std::wstring const right(before, L'q');
        for (wchar_t const x : corners) {
            for (wchar_t const y : corners) {
                checkComparison(left + x, right + y);
                checkComparison(left + x + L"Item", right + y + L"ITEM");
                checkComparison(L"Ii" + left + x + L"name", L"iI" + right + y + L"NAME");
                checkComparison(left + x + L"abcdefgh", right + y);
            }
        }
    }
}

TEST_CASE("comparing random text that is equal but for case, or nearly, follows the plain rule") {
    std::mt19937 random(5);
    for (int i = 0; i < 20000; ++i) {
        std::wstring a;
        for (std::size_t size = random() % 40; size != 0; --size) {
            a += random() % 16 == 0 ? corners[random() % corners.size()]
                                    : static_cast<wchar_t>(L'A' + random() % 26);
        }
        std::wstring b = a;
        for (wchar_t& c : b) {
            if (random() % 2 == 0 && c >= L'A' && c <= L'Z') c += L'a' - L'A';
        }
        checkComparison(a, b);
        if (b.empty()) continue;
        b[random() % b.size()] = corners[random() % corners.size()];
        checkComparison(a, b);
        checkComparison(a, b.substr(0, random() % b.size()));
    }
}

TEST_CASE("the wide inserter writes the low 8 bits at every size up to three blocks") {
    std::mt19937 random(6);
    for (std::size_t size = 0; size <= 3 * Koru::BLOCK; size += size < 100 ? 1 : 29) {
        std::wstring text;
        std::string bytes;
        while (text.size() < size) {
            text += static_cast<wchar_t>(random());
            bytes += static_cast<char>(text.back() & 0xFF);
        }
        std::ostringstream out;
        Koru::operator<<(out, text);
        CHECK((out.str() == bytes));
    }
}
