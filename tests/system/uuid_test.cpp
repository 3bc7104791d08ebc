// Identifiers: 16 bytes and their text.
#include <koru/uuid.h>

#include <algorithm>
#include <cstddef>
#include <cstring>
#include <iomanip>
#include <locale>
#include <random>
#include <sstream>
#include <string>
#include <type_traits>
#include <vector>

#include <doctest/doctest.h>

using Bytes = std::vector<unsigned char>;
using Koru::Uuid;

namespace {

/// Bytes as a test's output and the expectations show them: "01 23 ab".
std::string shown(Bytes const& bytes) {
    std::string result;
    for (unsigned char const b : bytes) {
        if (!result.empty()) result += ' ';
        result += "0123456789abcdef"[b >> 4];
        result += "0123456789abcdef"[b & 15];
    }
    return result;
}

} // namespace

template <>
struct doctest::StringMaker<Bytes> {
    static String convert(Bytes const& bytes) { return shown(bytes).c_str(); }
};

namespace {

Bytes bytesOf(Uuid const& uuid) { return uuid; }
std::string textOf(Uuid const& uuid) { return uuid; }
Bytes parsed(std::string const& text) { return Uuid(text); }

Bytes const ZERO(16, 0);
std::string const ZERO_TEXT = "00000000-0000-0000-0000-000000000000";

std::string const TEXT = "0123abcd-4567-89ab-cdef-0123456789ab";
unsigned char const BYTES[16] = {0x01, 0x23, 0xab, 0xcd, 0x45, 0x67, 0x89, 0xab,
                                 0xcd, 0xef, 0x01, 0x23, 0x45, 0x67, 0x89, 0xab};
Bytes const VECTOR(BYTES, BYTES + 16);

int digitValue(char c) {
    if (c >= '0' && c <= '9') return c - '0';
    if (c >= 'a' && c <= 'f') return c - 'a' + 10;
    if (c >= 'A' && c <= 'F') return c - 'A' + 10;
    return -1;
}

/// What a text is read as, in the plainest way: 36 characters up to the first NUL; a second copy of
/// them with the hyphens taken out and, to make up for those, as many of the text's last characters
/// added; all of that digits; 32 of it used.
Bytes modelOf(std::string const& stored) {
    std::string const text = stored.substr(0, stored.find('\0'));
    if (text.size() != 36) return ZERO;
    std::string buffer;
    for (char const c : text) {
        if (c != '-') buffer += c;
    }
    buffer += text.substr(buffer.size());
    for (char const c : buffer) {
        if (digitValue(c) < 0) return ZERO;
    }
    Bytes bytes;
    for (std::size_t i = 0; i < 32; i += 2) {
        int const value = digitValue(buffer[i]) * 16 + digitValue(buffer[i + 1]);
        bytes.push_back(static_cast<unsigned char>(value));
    }
    return bytes;
}

/// These bytes are written digit by digit, and read back from that.
void checkBothWays(Bytes const& bytes) {
    std::string text;
    for (std::size_t i = 0; i < bytes.size(); ++i) {
        if (i == 4 || i == 6 || i == 8 || i == 10) text += '-';
        text += shown({bytes[i]});
    }
    CHECK(textOf(Uuid(bytes)) == text);
    CHECK(parsed(text) == bytes);
}

void checkAsModel(std::string const& text) {
    CAPTURE(text);
    CHECK(parsed(text) == modelOf(text));
}

} // namespace

TEST_CASE("an identifier is a plain value of 16 bytes") {
    CHECK(sizeof(Uuid) == 16);
    CHECK(alignof(Uuid) == 1);
    CHECK(!std::is_polymorphic_v<Uuid>);
    CHECK(std::is_trivially_copyable_v<Uuid>);
    CHECK(std::is_standard_layout_v<Uuid>);
    Uuid const uuid(BYTES);
    CHECK(std::memcmp(&uuid, BYTES, sizeof uuid) == 0);
}

TEST_CASE("an identifier is made from nothing, 16 bytes, a vector or text") {
    CHECK(std::is_default_constructible_v<Uuid>);
    CHECK(std::is_constructible_v<Uuid, unsigned char const(&)[16]>);
    CHECK(std::is_constructible_v<Uuid, unsigned char(&)[16]>);
    CHECK(std::is_constructible_v<Uuid, Bytes>);
    CHECK(std::is_constructible_v<Uuid, std::string>);
    CHECK(!std::is_constructible_v<Uuid, unsigned char const(&)[15]>);
    CHECK(!std::is_constructible_v<Uuid, unsigned char const(&)[17]>);
    CHECK(!std::is_constructible_v<Uuid, std::wstring>);
}

TEST_CASE("a default identifier is all zero") {
    CHECK(bytesOf(Uuid()) == ZERO);
    CHECK(textOf(Uuid()) == ZERO_TEXT);
}

TEST_CASE("a copy has the bytes of the original and a life of its own") {
    Uuid original(BYTES);
    Uuid const copy(original);
    Uuid assigned;
    assigned = original;
    original = Uuid();
    CHECK(bytesOf(copy) == VECTOR);
    CHECK(bytesOf(assigned) == VECTOR);
    CHECK(bytesOf(original) == ZERO);
    Uuid& self = assigned;
    assigned = self;
    CHECK(bytesOf(assigned) == VECTOR);
}

TEST_CASE("16 bytes are kept in the order given") {
    CHECK(bytesOf(Uuid(BYTES)) == VECTOR);
    CHECK(bytesOf(Uuid(VECTOR)) == VECTOR);
}

TEST_CASE("an identifier does not change with the array or the vector it was made from") {
    unsigned char array[16];
    std::copy(VECTOR.begin(), VECTOR.end(), array);
    Bytes vector = VECTOR;
    Uuid const fromArray(array);
    Uuid const fromVector(vector);
    std::fill(array, array + 16, static_cast<unsigned char>(0xEE));
    std::fill(vector.begin(), vector.end(), static_cast<unsigned char>(0xEE));
    CHECK(bytesOf(fromArray) == VECTOR);
    CHECK(bytesOf(fromVector) == VECTOR);
}

TEST_CASE("a vector of any size but 16 gives the identifier of zeros") {
    for (std::size_t size = 0; size <= 40; ++size) {
        CAPTURE(size);
        Bytes const bytes(size, 0xA5);
        CHECK(bytesOf(Uuid(bytes)) == (size == 16 ? bytes : ZERO));
    }
    CHECK(bytesOf(Uuid(Bytes(1U << 16, 1))) == ZERO);
}

TEST_CASE("the vector of an identifier is new each time and always of 16 bytes") {
    for (Uuid const& uuid : {Uuid(), Uuid(BYTES), Uuid(Bytes(17, 1))})
        CHECK(bytesOf(uuid).size() == 16);
    Uuid const uuid(BYTES);
    bytesOf(uuid).clear();
    CHECK(bytesOf(uuid) == VECTOR);
}

TEST_CASE("the text has groups of 8, 4, 4, 4 and 12 lower-case digits in the order of the bytes") {
    CHECK(textOf(Uuid(BYTES)) == TEXT);
    CHECK(textOf(Uuid(Bytes(16, 0xFF))) == "ffffffff-ffff-ffff-ffff-ffffffffffff");
    CHECK(textOf(Uuid(Bytes(16, 0x0A))) == "0a0a0a0a-0a0a-0a0a-0a0a-0a0a0a0a0a0a");
}

TEST_CASE("every value of every byte is two digits of the text") {
    for (std::size_t at = 0; at < 16; ++at) {
        for (unsigned value = 0; value < 256; ++value) {
            Bytes bytes = ZERO;
            bytes[at] = static_cast<unsigned char>(value);
            checkBothWays(bytes);
        }
    }
}

TEST_CASE("the text is the same when streams are given a locale that separates digits") {
    struct SeparatingNumbers : std::numpunct<char> {
        char do_thousands_sep() const override { return '.'; }
        std::string do_grouping() const override { return "\1"; }
    };
    std::locale const before =
        std::locale::global(std::locale(std::locale::classic(), new SeparatingNumbers));
    std::ostringstream separated;
    separated << 1234;
    CHECK(separated.str() == "1.2.3.4");
    CHECK(textOf(Uuid(BYTES)) == TEXT);
    CHECK(parsed(TEXT) == VECTOR);
    std::locale::global(before);
}

TEST_CASE("text is read with upper and lower case digits and hyphens anywhere but near the end") {
    struct Row {
        char const* label;
        std::string text;
    };
    Row const rows[] = {
        {"as it is written", "0123abcd-4567-89ab-cdef-0123456789ab"},
        {"mixed case", "0123ABCD-4567-89ab-CDEF-0123456789AB"},
        {"upper case", "0123ABCD-4567-89AB-CDEF-0123456789AB"},
        {"hyphens elsewhere", "0123-ABCD4567-89ab-CDEF0123-456789AB"},
        {"hyphens first", "----0123abcd456789abcdef0123456789ab"},
        {"hyphens side by side", "0123abcd--456789abcdef--0123456789ab"},
        {"hyphens as late as they may be", "0123abcd456789abcdef01234567----89ab"},
        {"no hyphens, the last four digits ignored", "0123abcd456789abcdef0123456789abFFFF"},
        {"one hyphen, the last three digits ignored", "0123abcd-456789abcdef0123456789ab012"},
        {"two hyphens", "-0123abcd-456789abcdef0123456789ab99"},
        {"three hyphens", "-0123abcd-4567-89abcdef0123456789ab7"},
    };
    for (Row const& row : rows) {
        CAPTURE(row.label);
        CHECK(parsed(row.text) == VECTOR);
        CHECK(textOf(Uuid(row.text)) == TEXT);
    }
}

TEST_CASE("with more than four hyphens the last digits are read twice") {
    struct Row {
        char const* label;
        char const* text;
        char const* expected;
    };
    Row const rows[] = {
        {"31 digits, and of the last five repeated the first is used",
         "-----0123456789abcdef0123456789abcde", "01 23 45 67 89 ab cd ef 01 23 45 67 89 ab cd ea"},
        {"30 digits, and of the last six repeated two are used",
         "------0123456789abcdef0123456789abcd", "01 23 45 67 89 ab cd ef 01 23 45 67 89 ab cd 89"},
        {"19 digits, and 13 of the last 17", "-----------------0123456789abcdef012",
         "01 23 45 67 89 ab cd ef 01 22 34 56 78 9a bc de"},
        {"half of it hyphens: 18 digits, and 14 of them once more",
         "------------------0123456789abcdef01", "01 23 45 67 89 ab cd ef 01 01 23 45 67 89 ab cd"},
    };
    for (Row const& row : rows) {
        CAPTURE(row.label);
        CHECK(shown(parsed(row.text)) == row.expected);
    }
}

TEST_CASE("text with a hyphen among the last characters is refused, counted as its hyphens are") {
    for (std::size_t hyphens = 1; hyphens <= 36; ++hyphens) {
        CAPTURE(hyphens);
        // Of a run of k hyphens none is among the last k characters when it ends k before the end.
        for (std::size_t after = 0; after + hyphens <= 36; ++after) {
            CAPTURE(after);
            std::string text(36, 'a');
            text.replace(36 - hyphens - after, hyphens, hyphens, '-');
            CHECK(parsed(text) == (after >= hyphens ? Bytes(16, 0xAA) : ZERO));
        }
    }
}

TEST_CASE("text of any length but 36 is refused") {
    for (std::size_t size = 0; size <= 80; ++size) {
        CAPTURE(size);
        CHECK(parsed(std::string(size, '7')) == (size == 36 ? Bytes(16, 0x77) : ZERO));
    }
    for (std::string const& text :
         {std::string(), "{" + TEXT + "}", "urn:uuid:" + TEXT, TEXT + "\n", " " + TEXT,
          std::string("0123abcd456789abcdef0123456789ab"), std::string(36 + 256, '7'),
          std::string(36 + 65536, '7')}) {
        CAPTURE(text);
        CHECK(parsed(text) == ZERO);
    }
}

TEST_CASE("text ends at its first NUL") {
    std::string const nul(1, '\0');
    CHECK(parsed(TEXT + nul) == VECTOR);
    CHECK(parsed(TEXT + nul + "and more") == VECTOR);
    CHECK(parsed(nul + TEXT) == ZERO);
    CHECK(parsed(nul) == ZERO);
    for (std::size_t at = 0; at < 36; ++at) {
        CAPTURE(at);
        std::string text(36, 'b');
        text[at] = '\0';
        CHECK(parsed(text) == ZERO);
        CHECK(parsed(text + std::string(36, 'b')) == ZERO);
    }
}

TEST_CASE("any character but digits and hyphens is refused, wherever it is") {
    for (std::size_t at = 0; at < 36; ++at) {
        CAPTURE(at);
        for (int value = 1; value < 256; ++value) {
            CAPTURE(value);
            char const c = static_cast<char>(value);
            if (c == '-' || digitValue(c) >= 0) continue;
            for (std::string text : {TEXT, std::string(36, 'c')}) {
                text[at] = c;
                CHECK(parsed(text) == ZERO);
            }
        }
    }
}

TEST_CASE("a refused text leaves nothing of itself behind") {
    for (char const* text : {
             "0123abcd-4567-89ab-cdef-0123456789aG", // the last of them decides
             "0123abcd456789abcdef0123456789ab012x",
             "0x23abcd-4567-89ab-cdef-0123456789ab",
             "+123abcd-4567-89ab-cdef-0123456789ab",
             " 123abcd-4567-89ab-cdef-0123456789ab",
         }) {
        CAPTURE(text);
        CHECK(parsed(text) == ZERO);
    }
}

TEST_CASE("text is read as a plain model reads it") {
    std::mt19937 random(20260131);
    auto const below = [&random](std::size_t n) { return static_cast<std::size_t>(random() % n); };
    std::string const digits = "0123456789abcdefABCDEF";
    std::string const others = std::string("\0", 1) + "gGxX +{}/:@`\x7f\x80\xff";
    int accepted = 0;
    for (int round = 0; round < 60000; ++round) {
        std::size_t const size = below(5) == 0 ? below(41) : 36;
        std::string text;
        for (std::size_t i = 0; i < size; ++i) text += digits[below(digits.size())];
        if (size > 0) {
            // Most hyphens keep clear of the end, or hardly any text would be accepted.
            std::size_t const reach = below(3) == 0 ? size : (size + 1) / 2;
            std::size_t const hyphens = below(4) == 0 ? below(37) : below(7);
            for (std::size_t i = 0; i < hyphens; ++i) text[below(reach)] = '-';
            if (below(8) == 0) text[below(size)] = others[below(others.size())];
        }
        if (below(16) == 0) text += std::string("\0tail", below(6));
        if (modelOf(text) != ZERO) ++accepted;
        checkAsModel(text);
    }
    CHECK(accepted > 10000);
    CHECK(accepted < 50000);
}

TEST_CASE("the usual form with any character in it, and any two, is read as the model reads it") {
    std::string const odd = std::string("\0", 1) + "-0/9:@AFG`afg\x10\x19\x7f\x80\xb0\xe1\xff";
    for (std::size_t at = 0; at < 36; ++at) {
        std::string text = TEXT;
        for (int value = 0; value < 256; ++value) {
            text[at] = static_cast<char>(value);
            checkAsModel(text);
        }
        for (std::size_t other = at + 1; other < 36; ++other) {
            text = TEXT;
            for (char const x : odd) {
                for (char const y : odd) {
                    text[at] = x;
                    text[other] = y;
                    checkAsModel(text);
                }
            }
        }
    }
}

TEST_CASE("16 bytes survive the way through the text and back") {
    std::mt19937 random(19680503);
    for (int round = 0; round < 5000; ++round) {
        Bytes bytes;
        for (int i = 0; i < 16; ++i) bytes.push_back(static_cast<unsigned char>(random() & 0xFF));
        checkBothWays(bytes);
    }
}

TEST_CASE("identifiers are equal exactly when all their bits are") {
    Uuid const uuid(BYTES);
    CHECK(uuid == uuid);
    CHECK(uuid == Uuid(BYTES));
    CHECK(!(uuid != Uuid(BYTES)));
    CHECK(uuid == Uuid(TEXT));
    CHECK(Uuid() == Uuid(ZERO_TEXT));
    for (unsigned bit = 0; bit < 128; ++bit) {
        CAPTURE(bit);
        Bytes bytes = VECTOR;
        bytes[bit / 8] = static_cast<unsigned char>(bytes[bit / 8] ^ (1U << bit % 8));
        Uuid const other(bytes);
        CHECK(!(uuid == other));
        CHECK(!(other == uuid));
        CHECK(uuid != other);
        CHECK(other != uuid);
    }
}

TEST_CASE("a refused text cannot be told from the text of the default identifier") {
    CHECK(Uuid(std::string("nonsense")) == Uuid(ZERO_TEXT));
}

TEST_CASE("the inserter writes the text and returns the stream") {
    std::ostringstream out;
    std::ostream& returned = out << Uuid(BYTES);
    CHECK(&returned == &out);
    out << '|' << Uuid();
    CHECK(out.str() == TEXT + "|" + ZERO_TEXT);
}

TEST_CASE("width and fill go to the first character, before or after it") {
    std::ostringstream out;
    out << std::setw(5) << std::setfill('*') << Uuid(BYTES);
    CHECK(out.width() == 0);
    out << std::left << std::setw(5) << Uuid(BYTES);
    out << std::right << std::setw(40) << std::setfill(' ') << Uuid(BYTES);
    CHECK(out.str() == "****" + TEXT + "0****" + TEXT.substr(1) + std::string(39, ' ') + TEXT);
}

TEST_CASE("the inserter takes no notice of the stream's number format and leaves it alone") {
    std::ostringstream out;
    out << std::oct << std::uppercase << std::showbase << std::setfill('#');
    std::ios_base::fmtflags const flags = out.flags();
    out << Uuid(BYTES);
    CHECK(out.str() == TEXT);
    CHECK(out.flags() == flags);
    CHECK(out.fill() == '#');
}

TEST_CASE("nothing is written to a stream that has failed") {
    std::ostringstream out;
    out.setstate(std::ios_base::failbit);
    out << Uuid(BYTES);
    CHECK(out.str().empty());
    CHECK(out.fail());
}
