// A settings file in a directory of its own, and ways to see all that an InitializationFile holds.
#ifndef KORU_TESTS_SETTINGSFIXTURE_H
#define KORU_TESTS_SETTINGSFIXTURE_H

#include <doctest/doctest.h>

#include <cstddef>
#include <initializer_list>
#include <stdexcept>
#include <string>
#include <vector>

#include <koru/initializationfile.h>

#include "support/settingsmodel.h"
#include "support/tempdir.h"

namespace test {

unsigned long const READ = Koru::File::READ;
unsigned long const WRITE = Koru::File::WRITE;
unsigned long const READ_WRITE = Koru::File::READ | Koru::File::WRITE;

/// A settings file of its own. Given bytes, it exists and is open; otherwise neither.
class SettingsFile : public HasPlace, public Koru::InitializationFile {
public:
    SettingsFile() : InitializationFile(place.path()) {}
    explicit SettingsFile(std::string const& bytes, unsigned long mode = READ) : SettingsFile() {
        place.write(bytes);
        open(mode);
    }
};

/// Takes the table apart from its front and returns it, each entry exactly as it is held: the first
/// section enumerated and its first key are those of the first entry.
inline Settings drain(Koru::InitializationFile& file) {
    Settings all;
    for (;;) {
        std::vector<std::wstring> const sections = file.enumerateSections();
        if (sections.empty()) return all;
        std::wstring const section = sections[0];
        std::wstring const key = file.enumerateKeys(section).at(0);
        all.push_back({section, key, file.getValue(section, key)});
        file.removeKey(section, key);
        if (all.size() > 100000) throw std::runtime_error("the table does not get smaller");
    }
}

/// The table that a file of these bytes is read into.
inline Settings loaded(Place const& place, std::string const& bytes) {
    place.write(bytes);
    Koru::InitializationFile file(place.path());
    file.open(READ);
    return drain(file);
}

/// The bytes that a table, filled in this order, is written as.
inline std::string written(Settings const& settings) {
    SettingsFile file("", WRITE);
    for (Setting const& s : settings) file.setValue(s.section, s.key, s.value);
    file.close();
    return file.place.bytes();
}

/// What a file of these bytes holds after it was opened and closed.
inline std::string rewritten(std::string const& bytes) {
    SettingsFile file(bytes, READ_WRITE);
    file.close();
    return file.place.bytes();
}

/// Checks that both are the same, and shows them if not.
template <class T>
void checkSame(T const& actual, T const& expected) {
    bool const same = actual == expected;
    INFO("actual:\n", shown(actual), "\nexpected:\n", shown(expected));
    CHECK(same);
}

inline void checkSame(std::wstring const& actual, wchar_t const* expected) {
    checkSame(actual, std::wstring(expected));
}

inline void checkSame(std::vector<std::wstring> const& actual,
                      std::initializer_list<wchar_t const*> expected) {
    checkSame(actual, std::vector<std::wstring>(expected.begin(), expected.end()));
}

/// The entries in order, in a form like "section/key=value | section/key=value".
inline void checkEntries(Settings const& actual, char const* expected) {
    CHECK(shown(actual) == expected);
}

inline void checkEntries(Koru::InitializationFile& file, char const* expected) {
    checkEntries(drain(file), expected);
}

/// Every section, key and value that the library gives is the model's.
inline void checkTable(Koru::InitializationFile& file, SettingsTableModel& model) {
    std::vector<std::wstring> const sections = model.enumerateSections();
    checkSame(file.enumerateSections(), sections);
    for (std::wstring const& section : sections) {
        checkSame(file.enumerateKeys(section), model.enumerateKeys(section));
    }
    for (Setting const& s : model.settings) {
        checkSame(file.getValue(s.section, s.key), model.getValue(s.section, s.key));
    }
}

/// A table of the library's and one of the model's, given the same changes.
template <class Model = SettingsTableModel>
struct Twins {
    SettingsFile file;
    Model model;

    template <class Change>
    void change(Change change) {
        change(file);
        change(model);
    }
    void check() { checkTable(file, model); }
};

} // namespace test

#endif
