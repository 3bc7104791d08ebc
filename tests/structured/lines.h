// What the tests of the two settings files share: files of key=value lines, in one section where
// there are sections, and the entries that they give.
#ifndef KORU_TESTS_STRUCTURED_LINES_H
#define KORU_TESTS_STRUCTURED_LINES_H

#include <doctest/doctest.h>

#include <cstddef>
#include <string>
#include <vector>

#include "structured/fixture.h"
#include "support/propertymodel.h"
#include "support/shown.h"

namespace structured {

using test::Properties;
using test::Property;
using test::textOf;

/// A settings file of these lines in a place of its own, open.
template <class Family>
class Lines : public OwnFile<Family> {
public:
    explicit Lines(std::string const& lines, unsigned long mode = READ)
        : OwnFile<Family>(Family::header() + lines, mode) {}

    std::wstring get(std::wstring const& key) { return Family::get(*this, key); }
    void put(std::wstring const& key, std::wstring const& value) { Family::put(*this, key, value); }
    void create(std::wstring const& key) { Family::create(*this, key); }
    void erase(std::wstring const& key) { Family::erase(*this, key); }
    std::vector<std::wstring> keys() { return Family::keys(*this); }

    /// Takes the list apart from its front and returns it, each entry exactly as it is held: when
    /// an entry's turn comes, those before it are gone.
    Properties drain() {
        Properties all;
        for (std::wstring const& key : keys()) {
            all.push_back({key, get(key)});
            erase(key);
        }
        return all;
    }
    std::string drained() { return shown(drain()); }

    /// The lines that the file is closed with.
    std::string written() {
        this->setMode(WRITE);
        this->close();
        std::string const bytes = this->bytes();
        return bytes.empty() ? "" : bytes.substr(std::string(Family::header()).size());
    }
};

struct Row {
    char const* label;
    std::string lines;
    char const* expected; ///< as `shown` shows it
};

/// Each row's lines are read as the entries expected, and these are written.
template <class Family>
void checkRows(std::vector<Row> const& rows) {
    for (Row const& row : rows) {
        CAPTURE(row.label);
        Lines<Family> file(row.lines);
        CHECK(file.rdstate() == std::ios::eofbit);
        file.clear();
        CHECK(static_cast<std::size_t>(file.tellg()) == file.bytes().size());
        Properties const list = file.drain();
        CHECK(shown(list) == row.expected);
        CHECK(test::shown(Lines<Family>(row.lines).written()) == test::shown(textOf(list)));
    }
}

} // namespace structured

#endif
