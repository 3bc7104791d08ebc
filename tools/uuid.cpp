// Identifiers: a new one, or a given one in the form in which the library writes it.
#include <koru/string.h>
#include <koru/uuid.h>

#include <algorithm>

#include "commands.h"
#include "text.h"

namespace tool {

namespace {

std::string _digitsOf(std::string text) {
    text.erase(std::remove(text.begin(), text.end(), '-'), text.end());
    return text;
}

/// The library answers text that it refuses with zeros, and of some texts it leaves digits out. So
/// the digits have to be those of the text.
std::string _normalised(std::string const& text) {
    std::string result = Koru::Uuid(text);
    if (Koru::compare(_digitsOf(text), _digitsOf(result)) != 0)
        throw Failure(NOT_FOUND, quoted(text) + " is no identifier");
    return result;
}

} // namespace

void uuid(Arguments const& arguments) {
    if (arguments.value) return print(_normalised(*arguments.value) + "\n");
    std::string const source = "/proc/sys/kernel/random/uuid";
    std::string const line = about(source, [&] { return readAll(source); });
    print(_normalised(line.substr(0, line.find('\n'))) + "\n");
}

} // namespace tool
