// What a property file does, in the plainest way: a list, every operation a loop over all of it,
// and a file that is a string. Tests compare the library with it.
#ifndef KORU_TESTS_PROPERTYMODEL_H
#define KORU_TESTS_PROPERTYMODEL_H

#include <algorithm>
#include <cstddef>
#include <stdexcept>
#include <string>
#include <vector>

#include <koru/file.h>
#include <koru/string.h>

#include "support/shown.h"

namespace test {

struct Property {
    std::wstring key;
    std::wstring value;
};

inline bool operator==(Property const& a, Property const& b) {
    return a.key == b.key && a.value == b.value;
}

using Properties = std::vector<Property>;

/// Like "key/value | key/value".
inline std::string shown(Properties const& list) {
    std::string result;
    for (Property const& p : list) {
        if (!result.empty()) result += " | ";
        result += shown(p.key) + '/' + shown(p.value);
    }
    return result;
}

/// The lines that are written for entries in this order.
inline std::string textOf(Properties const& list) {
    std::string text;
    for (Property const& p : list) {
        text += Koru::make_string(p.key) + "=" + Koru::make_string(p.value) + "\n";
    }
    return text;
}

inline std::string untilZero(std::string const& bytes) { return bytes.substr(0, bytes.find('\0')); }

/// Parses one line; a key that stays empty means that it adds nothing.
inline Property parsePropertyLine(std::string line) {
    std::size_t const first = line.find_first_not_of("\t ");
    if (first != std::string::npos) line.erase(0, first);
    std::size_t const last = line.find_last_not_of("\t ");
    if (last != std::string::npos) line.erase(last + 1);

    if (!line.empty() && (line[0] == '#' || line[0] == ';')) return {};
    std::size_t const equals = line.find('=');
    if (equals == std::string::npos) return {L"", Koru::make_wstring(untilZero(line))};
    return {Koru::make_wstring(untilZero(line.substr(0, equals))),
            Koru::make_wstring(untilZero(line.substr(equals + 1)))};
}

inline Properties parseProperties(std::string const& bytes) {
    Properties list;
    for (std::size_t at = 0; at < bytes.size();) {
        std::size_t const end = std::min(bytes.find('\n', at), bytes.size());
        Property const property = parsePropertyLine(bytes.substr(at, end - at));
        if (!property.key.empty()) list.push_back(property);
        at = end + 1;
    }
    return list;
}

/// The list with its file, mode and life cycle.
class PropertyFileModel {
public:
    Properties list;
    bool exists = true; ///< whether the file is on the disk
    std::string bytes;  ///< what it holds then

    bool isOpen() const { return open_; }
    unsigned long getMode() const { return mode_; }
    void setMode(unsigned long mode) { mode_ = mode; }

    /// @throws std::runtime_error where the library does
    void open(unsigned long mode) {
        bool const reads = (mode & Koru::File::READ) != 0;
        bool const writes = (mode & Koru::File::WRITE) != 0;
        if (!open_) {
            if (!writes && !(reads && exists)) throw std::runtime_error("failed to open file.");
            if (!reads || !exists) bytes.clear();
            exists = true;
            open_ = true;
            readable_ = reads;
        }
        mode_ = mode;
        list = reads && readable_ ? parseProperties(bytes) : Properties();
    }

    void close() {
        exists = exists || (mode_ & Koru::File::WRITE) != 0;
        if ((mode_ & Koru::File::WRITE) != 0) bytes = textOf(list);
        list.clear();
        open_ = false;
        mode_ = 0;
    }

    void synchronize() {
        if (!open_) return;
        unsigned long const mode = mode_;
        close();
        open(mode);
    }

    void createKey(std::wstring const& key) {
        if (find(key) == list.end()) list.push_back({key, L""});
    }
    void removeKey(std::wstring const& key) {
        auto const at = find(key);
        if (at != list.end()) list.erase(at);
    }
    std::wstring getValue(std::wstring const& key) {
        auto const at = find(key);
        return at != list.end() ? at->value : L"";
    }
    void setValue(std::wstring const& key, std::wstring const& value) {
        createKey(key);
        find(key)->value = value;
    }

private:
    bool open_ = false;
    bool readable_ = false; // of the open stream, whatever mode was set since
    unsigned long mode_ = 0;

    Properties::iterator find(std::wstring const& key) {
        return std::find_if(list.begin(), list.end(),
                            [&](Property const& p) { return Koru::compare(p.key, key) == 0; });
    }
};

} // namespace test

#endif
