#include "storable.h"

#include "failure.h"
#include "text.h"

namespace tool {

namespace {

void _refuseIf(bool condition, std::string const& reason) {
    if (condition) throw Failure(REFUSED, reason);
}

bool _isBlank(char c) { return c == ' ' || c == '\t'; }

void _checkText(char const* what, std::string const& text) {
    (void)wide(text);
    _refuseIf(text.find('\n') != std::string::npos,
              std::string(what) + " with a line break cannot be stored");
}

} // namespace

void checkKey(std::string const& key, char const* beginnings) {
    _checkText("a key", key);
    _refuseIf(key.empty(), "an empty key cannot be stored");
    _refuseIf(_isBlank(key.front()), "a key that begins with a blank would lose it");
    _refuseIf(std::string(beginnings).find(key.front()) != std::string::npos,
              std::string("a key that begins with ") + key.front() + " would not be read as one");
    _refuseIf(key.find('=') != std::string::npos, "a key with = would be cut there");
}

void checkValue(std::string const& value) {
    _checkText("a value", value);
    _refuseIf(!value.empty() && _isBlank(value.back()),
              "a value that ends with a blank would lose it");
}

void checkSection(std::string const& section) {
    _checkText("a section", section);
    _refuseIf(section.empty(), "a section without a name cannot be stored");
    _refuseIf(section.front() == '[', "a section that begins with [ would lose it");
    _refuseIf(section.back() == ']', "a section that ends with ] would lose it");
}

} // namespace tool
