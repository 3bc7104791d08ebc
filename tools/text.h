// Text between the program's surroundings, where it is UTF-8, and the library, where it is wide.
#ifndef KORU_TOOLS_TEXT_H
#define KORU_TOOLS_TEXT_H

#include <string>
#include <vector>

namespace tool {

/// The text for the library.
/// @throws Failure when the library would not give the same text back: not UTF-8, or with a NUL
std::wstring wide(std::string const& text);

/// The library's text, in UTF-8.
/// @throws Failure for a text with a NUL, which would end there
std::string narrow(std::wstring const& text);

/// Whether every character of the text is one of Unicode, and in its shortest form.
bool isUtf8(std::string const& text);

/// The text in quotes and without control characters, for messages.
std::string quoted(std::string const& text);

/// Two digits for every byte, and back.
std::string hex(std::vector<unsigned char> const& bytes);
/// @throws Failure when the text is anything but pairs of hexadecimal digits
std::vector<unsigned char> unhex(std::string const& digits);

/// All bytes of a file; of standard input for "-".
std::string readAll(std::string const& file);

} // namespace tool

#endif
