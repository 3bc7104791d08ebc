// What a sectioned settings file does, in the plainest way: three wide strings per entry, every
// operation a loop over all of them, and a file that is a string. Tests compare the library with
// it.
#ifndef KORU_TESTS_SETTINGSMODEL_H
#define KORU_TESTS_SETTINGSMODEL_H

#include <algorithm>
#include <cstddef>
#include <sstream>
#include <string>
#include <vector>

#include <koru/file.h>
#include <koru/string.h>

#include "support/shown.h"

namespace test {

/// An entry of the table.
struct Setting {
    std::wstring section;
    std::wstring key;
    std::wstring value;
};

inline bool operator==(Setting const& a, Setting const& b) {
    return a.section == b.section && a.key == b.key && a.value == b.value;
}

using Settings = std::vector<Setting>;

/// Like "section/key=value | section/key=value".
inline std::string shown(Settings const& settings) {
    std::string result;
    for (Setting const& s : settings) {
        if (!result.empty()) result += " | ";
        result += shown(s.section) + '/' + shown(s.key) + '=' + shown(s.value);
    }
    return result;
}

/// Whether two names differ in case at most.
inline bool sameName(std::wstring const& a, std::wstring const& b) {
    return Koru::compare(a, b) == 0;
}

/// Parses one line: a header sets the section, a key line sets key and value, any other line
/// nothing.
inline void parseSettingsLine(std::string line, std::wstring& section, std::wstring& key,
                              std::wstring& value) {
    auto const eraseAtEnds = [&line](char const* atStart, char const* atEnd) {
        std::size_t const last = line.find_last_not_of(atEnd);
        if (last != std::string::npos) line.erase(last + 1);
        std::size_t const first = line.find_first_not_of(atStart);
        if (first != std::string::npos) line.erase(0, first);
    };
    eraseAtEnds("\t ", "\t ");
    if (line.empty() || line[0] == '#' || line[0] == ';') return;
    if (line[0] == '[') {
        eraseAtEnds("[", "]");
        section = Koru::make_wstring(line);
        return;
    }
    std::size_t const equals = line.find('=');
    if (equals == std::string::npos) return;
    key = Koru::make_wstring(line.substr(0, equals));
    value = Koru::make_wstring(line.substr(equals + 1));
}

/// The entries of a file's bytes in the order of its lines.
inline Settings parseSettings(std::string const& bytes) {
    Settings settings;
    std::wstring section;
    std::istringstream in(bytes);
    for (std::string line; std::getline(in, line);) {
        std::wstring key;
        std::wstring value;
        parseSettingsLine(line, section, key, value);
        if (!section.empty() && !key.empty()) settings.push_back({section, key, value});
    }
    return settings;
}

/// Sorts by section and key; entries with equal names keep their order.
inline void sortSettings(Settings& settings) {
    std::stable_sort(settings.begin(), settings.end(), [](Setting const& a, Setting const& b) {
        int const bySection = Koru::compare(a.section, b.section);
        if (bySection != 0) return bySection < 0;
        return Koru::compare(a.key, b.key) < 0;
    });
}

/// The table that a file of these bytes is read into.
inline Settings sortedSettings(std::string const& bytes) {
    Settings settings = parseSettings(bytes);
    sortSettings(settings);
    return settings;
}

/// A section is written once, as its first entry spells it.
inline Settings spelledOnce(Settings sorted) {
    for (std::size_t i = 1; i < sorted.size(); ++i) {
        std::wstring const& before = sorted[i - 1].section;
        if (sameName(sorted[i].section, before)) sorted[i].section = before;
    }
    return sorted;
}

/// The bytes that a table in this order is written as.
inline std::string settingsText(Settings const& settings) {
    std::string text;
    for (std::size_t i = 0; i < settings.size(); ++i) {
        if (i == 0 || !sameName(settings[i].section, settings[i - 1].section)) {
            text += "[" + Koru::make_string(settings[i].section) + "]\n";
        }
        text += Koru::make_string(settings[i].key) + "=" + Koru::make_string(settings[i].value);
        text += "\n";
    }
    return text;
}

/// The table and its operations.
class SettingsTableModel {
public:
    Settings settings;

    std::vector<std::wstring> enumerateSections() const {
        std::vector<std::wstring> names;
        for (std::size_t i = 0; i < settings.size(); ++i) {
            if (i == 0 || !sameName(settings[i].section, settings[i - 1].section)) {
                names.push_back(settings[i].section);
            }
        }
        return names;
    }

    void createSection(std::wstring const& section) {
        if (enumerateKeys(section).empty()) settings.push_back({section, L"", L""});
    }

    void removeSection(std::wstring const& section) {
        for (std::size_t i = 0; i < settings.size(); ++i) {
            if (!sameName(settings[i].section, section)) continue;
            settings.erase(settings.begin() + static_cast<std::ptrdiff_t>(i));
        }
    }

    std::vector<std::wstring> enumerateKeys(std::wstring const& section) const {
        std::vector<std::wstring> keys;
        for (Setting const& entry : settings) {
            if (sameName(entry.section, section)) keys.push_back(entry.key);
        }
        return keys;
    }

    void createKey(std::wstring const& section, std::wstring const& key) {
        if (find(section, key) == nullptr) settings.push_back({section, key, L""});
    }

    void removeKey(std::wstring const& section, std::wstring const& key) {
        Setting const* const found = find(section, key);
        if (found != nullptr) settings.erase(settings.begin() + (found - settings.data()));
    }

    std::wstring getValue(std::wstring const& section, std::wstring const& key) {
        Setting const* const found = find(section, key);
        return found != nullptr ? found->value : std::wstring();
    }

    void setValue(std::wstring const& section, std::wstring const& key, std::wstring const& value) {
        createKey(section, key);
        find(section, key)->value = value;
    }

private:
    Setting* find(std::wstring const& section, std::wstring const& key) {
        for (Setting& s : settings) {
            if (sameName(s.section, section) && sameName(s.key, key)) return &s;
        }
        return nullptr;
    }
};

/// The table with its file, mode and life cycle.
class SettingsFileModel : public SettingsTableModel {
public:
    bool exists = false; ///< whether the file is on the disk
    std::string bytes;   ///< what it holds then

    bool isOpen() const { return open_; }
    unsigned long getMode() const { return mode_; }
    void setMode(unsigned long mode) { mode_ = mode; }

    /// False where the library throws "failed to open file.".
    bool open(unsigned long mode) {
        if (!open_ && !openStream(mode)) return false;
        mode_ = mode;
        settings.clear();
        if (reads(mode) && readable_) settings = sortedSettings(bytes);
        return true;
    }

    void close() {
        sortSettings(settings);
        if (writes(mode_)) {
            exists = true;
            bytes = settingsText(settings);
        }
        settings.clear();
        open_ = false;
        mode_ = 0;
    }

    bool synchronize() {
        if (!open_) return true;
        unsigned long const mode = mode_;
        close();
        return open(mode);
    }

private:
    bool open_ = false;
    bool readable_ = false; // of the open stream, whatever mode was set since
    unsigned long mode_ = 0;

    static bool reads(unsigned long mode) { return (mode & Koru::File::READ) != 0; }
    static bool writes(unsigned long mode) { return (mode & Koru::File::WRITE) != 0; }

    bool openStream(unsigned long mode) {
        if (!reads(mode) && !writes(mode)) return false;
        if (!writes(mode) && !exists) return false;
        if (!reads(mode) || !exists) bytes.clear();
        exists = true;
        open_ = true;
        readable_ = reads(mode);
        return true;
    }
};

} // namespace test

#endif
