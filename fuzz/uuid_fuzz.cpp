// Any text gives an identifier, whose text is in the one form and gives the same identifier again.
// A text with its hyphens in place is told apart from what is refused, and keeps its digits.
#include <koru/uuid.h>

#include <algorithm>
#include <cctype>
#include <cstddef>
#include <cstdint>
#include <sstream>
#include <string>
#include <vector>

#include "check.h"

namespace {

bool isDigit(char c) { return std::isxdigit(static_cast<unsigned char>(c)) != 0; }

bool isHyphenPlace(std::size_t i) { return i == 8 || i == 13 || i == 18 || i == 23; }

/// Whether it is the text form, in either case.
bool isTextForm(std::string const& text) {
    if (text.size() != 36) return false;
    for (std::size_t i = 0; i < text.size(); ++i) {
        if (isHyphenPlace(i) ? text[i] != '-' : !isDigit(text[i])) return false;
    }
    return true;
}

std::string lowered(std::string text) {
    for (char& c : text) c = static_cast<char>(std::tolower(static_cast<unsigned char>(c)));
    return text;
}

void checkRefused(std::string const& text, Koru::Uuid const& uuid) {
    std::string const upToNul = text.substr(0, text.find('\0'));
    bool const digitsAndHyphens =
        std::all_of(upToNul.begin(), upToNul.end(), [](char c) { return c == '-' || isDigit(c); });
    if (upToNul.size() != 36 || !digitsAndHyphens) KORU_CHECK(uuid == Koru::Uuid());
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(std::uint8_t const* data, std::size_t size) {
    std::string const text(reinterpret_cast<char const*>(data), size);
    Koru::Uuid const uuid(text);
    checkRefused(text, uuid);

    std::string const written = uuid;
    KORU_CHECK(isTextForm(written));
    KORU_CHECK(written == lowered(written));
    KORU_CHECK(Koru::Uuid(written) == uuid);
    if (isTextForm(text)) KORU_CHECK(written == lowered(text));

    std::vector<unsigned char> const bytes = uuid;
    KORU_CHECK(bytes.size() == 16);
    KORU_CHECK(!(Koru::Uuid(bytes) != uuid));
    std::ostringstream out;
    out << uuid;
    KORU_CHECK(out.str() == written);

    // The input as the bytes themselves.
    std::vector<unsigned char> const raw(data, data + size);
    std::vector<unsigned char> const kept = Koru::Uuid(raw);
    KORU_CHECK(kept == (size == 16 ? raw : std::vector<unsigned char>(16)));
    if (size < 16) return 0;
    unsigned char array[16];
    std::copy_n(data, 16, array);
    KORU_CHECK(Koru::Uuid(array) == Koru::Uuid(std::vector<unsigned char>(array, array + 16)));
    return 0;
}
