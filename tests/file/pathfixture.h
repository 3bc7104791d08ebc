// What the tests of paths share: paths as text, and how a text is parsed. To be included by one source
// file of an executable.
#ifndef KORU_TESTS_PATHFIXTURE_H
#define KORU_TESTS_PATHFIXTURE_H

#include <koru/file.h>
#include <koru/string.h>

#include <sys/resource.h>

#include <cstddef>
#include <stdexcept>
#include <string>
#include <utility>
#include <vector>

#include <doctest/doctest.h>

#include "support/throws.h"

namespace test {

using Path = Koru::File::Path;
using Strings = std::vector<std::string>;

char const* const EMPTY = "null or empty string passed as file path";
char const* const UNDETERMINED = "cannot determine path";

/// The parts with bars between them, without that of the volume where it is empty.
inline std::string shown(Path const& path) {
    std::string const volume = Koru::make_string(path.getVolume());
    return (volume.empty() ? "" : volume + "|") + Koru::make_string(path.getDirectory()) + "|" +
           Koru::make_string(path.getName());
}

inline bool filesAreRefused = false;

/// The path of a text. Meanwhile no file can be opened, if that was asked for, so nothing says
/// where the executable is. (The sanitizers open some themselves before and after.)
template <class Text>
Path made(Text const& text) {
    struct Limit {
        Limit() {
            ::getrlimit(RLIMIT_NOFILE, &before);
            rlimit const none{0, before.rlim_max};
            if (filesAreRefused) ::setrlimit(RLIMIT_NOFILE, &none);
        }
        ~Limit() { ::setrlimit(RLIMIT_NOFILE, &before); }
        rlimit before{};
    } const limit;
    return Path(text);
}

/// How a text is parsed: the parts, or the message of the exception.
template <class Text>
std::string parsed(Text const& text) {
    std::string parts;
    std::string const message =
        messageOf<std::invalid_argument>([&] { parts = shown(made(text)); });
    return parts.empty() ? message : parts;
}

/// The same of a text in each kind of string.
inline std::string parsedInEveryKind(std::string const& text) {
    std::wstring const wide = Koru::make_wstring(text);
    std::string const parts = parsed(wide);
    CHECK(parsed(wide.c_str()) == parts);
    CHECK(parsed(text) == parts);
    CHECK(parsed(text.c_str()) == parts);
    return parts;
}

/// A row of a table: a text, an arrow and how the text is parsed.
inline std::pair<std::string, std::string> cells(std::string const& row) {
    std::size_t const arrow = row.find(" -> ");
    return {row.substr(0, arrow), row.substr(arrow + 4)};
}

/// Every text of one piece up to this many, with the separator between them.
template <class Text>
std::vector<Text> combine(std::vector<Text> const& pieces, int most, Text const& separator) {
    std::vector<Text> texts = pieces;
    std::size_t begin = 0;
    for (int count = 2; count <= most; ++count) {
        for (std::size_t const end = texts.size(); begin < end; ++begin) {
            for (Text const& piece : pieces) texts.push_back(texts[begin] + separator + piece);
        }
    }
    return texts;
}

/// The parts of an absolute path by the plain rule: every segment before a separator that is not
/// empty, and what comes after the last separator.
inline std::string plainly(std::string const& text) {
    std::string directory = "/";
    std::string segment;
    for (char const c : text) {
        segment += c;
        if (c != '/' && c != '\\') continue;
        segment.pop_back();
        if (!segment.empty()) directory += segment + "/";
        segment.clear();
    }
    return directory == "/" ? UNDETERMINED : directory + "|" + segment;
}

} // namespace test

#endif
