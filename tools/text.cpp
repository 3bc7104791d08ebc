#include "text.h"

#include <koru/string.h>

#include <nlohmann/json.hpp>

#include <fstream>
#include <iostream>
#include <iterator>

#include "failure.h"

namespace tool {

namespace {

char const* const DIGITS = "0123456789abcdef";

unsigned _digit(char c) {
    if (c >= '0' && c <= '9') return static_cast<unsigned>(c - '0');
    if (c >= 'a' && c <= 'f') return static_cast<unsigned>(c - 'a' + 10);
    if (c >= 'A' && c <= 'F') return static_cast<unsigned>(c - 'A' + 10);
    throw Failure(REFUSED, "data are pairs of hexadecimal digits");
}

} // namespace

std::wstring wide(std::string const& text) {
    if (text.find('\0') != std::string::npos) throw Failure(REFUSED, "a NUL cannot be stored");
    std::wstring result = Koru::make_wstring(text);
    if (Koru::make_string(result) != text) throw Failure(REFUSED, "text has to be UTF-8");
    return result;
}

std::string narrow(std::wstring const& text) {
    if (text.find(L'\0') != std::wstring::npos)
        throw Failure(FAILED, "a name in it has a NUL, which this program cannot show");
    return Koru::make_string(text);
}

bool isUtf8(std::string const& text) {
    try {
        (void)nlohmann::json(text).dump(); // whose text has to be UTF-8
        return true;
    } catch (nlohmann::json::type_error const&) {
        return false;
    }
}

std::string quoted(std::string const& text) {
    return nlohmann::json(text).dump(-1, ' ', false, nlohmann::json::error_handler_t::replace);
}

std::string hex(std::vector<unsigned char> const& bytes) {
    std::string result;
    result.reserve(2 * bytes.size());
    for (unsigned char const byte : bytes) {
        result += DIGITS[byte >> 4U];
        result += DIGITS[byte & 15U];
    }
    return result;
}

std::vector<unsigned char> unhex(std::string const& digits) {
    std::vector<unsigned char> result;
    if (digits.size() % 2 != 0) throw Failure(REFUSED, "data are pairs of hexadecimal digits");
    for (std::size_t i = 0; i < digits.size(); i += 2)
        result.push_back(
            static_cast<unsigned char>(_digit(digits[i]) << 4U | _digit(digits[i + 1])));
    return result;
}

std::string readAll(std::string const& file) {
    // Unlike the stream's own operations the iterator lets the exception of a failure through.
    using Iterator = std::istreambuf_iterator<char>;
    if (file == "-") return {Iterator(std::cin), {}};
    std::ifstream in(file, std::ios::binary);
    if (!in) failBySystem("cannot open it");
    return {Iterator(in), {}};
}

} // namespace tool
