// The three structured files behind one face, for what they have in common: opened, loaded, changed
// and written back whole. Entries are numbers here: entry n has the key "key n".
#ifndef KORU_TESTS_STRUCTUREDFILE_H
#define KORU_TESTS_STRUCTUREDFILE_H

#include <algorithm>
#include <cstdio>
#include <string>
#include <vector>

#include <koru/datafile.h>
#include <koru/initializationfile.h>
#include <koru/propertyfile.h>

#include "support/tempdir.h"

namespace test {

inline std::wstring entryKey(int number) {
    char text[16];
    int const size = std::snprintf(text, sizeof text, "key %05d", number);
    return std::wstring(text, text + size);
}

inline std::string narrowKey(int number) {
    std::wstring const key = entryKey(number);
    return std::string(key.begin(), key.end());
}

/// The sectioned settings file, with one section.
struct Sectioned {
    using File = Koru::InitializationFile;
    static char const* label() { return "initialization file"; }
    static std::string bytes(int first, int end) {
        std::string result = first == end ? "" : "[s]\n";
        for (int i = first; i < end; ++i) result += narrowKey(i) + "=value\n";
        return result;
    }
    static void add(File& file, int number) { file.setValue(L"s", entryKey(number), L"value"); }
    static std::vector<std::wstring> keys(File& file) { return file.enumerateKeys(L"s"); }
    static std::wstring value(File& file, int number) {
        return file.getValue(L"s", entryKey(number));
    }
};

/// The flat settings file.
struct Flat {
    using File = Koru::PropertyFile;
    static char const* label() { return "property file"; }
    static std::string bytes(int first, int end) {
        std::string result;
        for (int i = first; i < end; ++i) result += narrowKey(i) + "=value\n";
        return result;
    }
    static void add(File& file, int number) { file.setValue(entryKey(number), L"value"); }
    static std::vector<std::wstring> keys(File& file) { return file.enumerateKeys(); }
    static std::wstring value(File& file, int number) { return file.getValue(entryKey(number)); }
};

/// The record file. What a file of several records holds is known but for their order.
struct Records {
    using File = Koru::DataFile;
    static char const* label() { return "data file"; }
    static std::string bytes(int first, int end) {
        std::string result;
        for (int i = first; i < end; ++i) {
            std::string const key = narrowKey(i);
            result += {static_cast<char>(2 * key.size()), 0, 0, 0};
            for (char const c : key) result += {'\0', c};
            result += std::string("\5\0\0\0value", 9);
        }
        return result;
    }
    static void add(File& file, int number) {
        file.insert({entryKey(number), {'v', 'a', 'l', 'u', 'e'}});
    }
    static std::vector<std::wstring> keys(File& file) {
        std::vector<std::wstring> result;
        for (unsigned long i = 0; i < file.size(); ++i) result.push_back(file[i].getKey());
        return result;
    }
    static std::wstring value(File& file, int number) {
        for (unsigned long i = 0; i < file.size(); ++i) {
            Koru::DataFile::Record const& record = file[i];
            if (record.getKey() != entryKey(number)) continue;
            return std::wstring(record.getData().begin(), record.getData().end());
        }
        return L"";
    }
};

template <class Family>
std::size_t sizeOf(typename Family::File& file) {
    return Family::keys(file).size();
}

/// Whether the file holds the entries from `first` up to `end` and no others, in whatever order.
template <class Family>
bool holds(typename Family::File& file, int first, int end) {
    std::vector<std::wstring> keys = Family::keys(file);
    std::sort(keys.begin(), keys.end());
    std::vector<std::wstring> expected;
    for (int i = first; i < end; ++i) expected.push_back(entryKey(i));
    return keys == expected && (first == end || Family::value(file, end - 1) == L"value");
}

/// Whether the bytes are a whole file of these entries.
template <class Family>
bool isWhole(std::string const& bytes, int first, int end) {
    if (bytes.size() != Family::bytes(first, end).size()) return false;
    TempDir const directory;
    writeFile(directory / "copy", bytes);
    typename Family::File file(directory / "copy");
    file.open(Koru::File::READ);
    return holds<Family>(file, first, end);
}

} // namespace test

#endif
