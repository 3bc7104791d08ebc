// The three structured files behind one interface, for what they have in common: opened, loaded,
// changed and written back whole. Entries are numbers here: entry n has the key "key n".
#ifndef KORU_TESTS_STRUCTUREDFILE_H
#define KORU_TESTS_STRUCTUREDFILE_H

#include <algorithm>
#include <cstddef>
#include <cstdio>
#include <string>
#include <vector>

#include <koru/datafile.h>
#include <koru/initializationfile.h>
#include <koru/propertyfile.h>

#include "support/slots.h"
#include "support/tempdir.h"

namespace test {

/// An operation that takes the lock.
template <class File>
struct Operation {
    char const* label;
    void (*run)(File&);
};

inline std::wstring entryKey(int number) {
    char text[16];
    int const size = std::snprintf(text, sizeof text, "key %05d", number);
    return std::wstring(text, text + size);
}

inline std::string narrowKey(int number) {
    std::wstring const key = entryKey(number);
    return std::string(key.begin(), key.end());
}

/// ASCII as a wide string.
inline std::wstring wide(std::string const& text) { return std::wstring(text.begin(), text.end()); }

/// What is alike in the two settings files.
template <class Family, class SettingsFile>
struct SettingsFamily {
    using File = SettingsFile;
    static constexpr unsigned long ADDED_MODE = 0; ///< what `open` adds to the mode
    static constexpr bool CLOSES_ALWAYS = true;    ///< whether the destructor closes what is closed

    static std::string bytes(int first, int end, std::string const& value = "value") {
        std::string result = first == end ? "" : Family::header();
        for (int i = first; i < end; ++i) result += narrowKey(i) + "=" + value + "\n";
        return result;
    }
    /// A file with entry 0, but not as the library writes it.
    static std::string untidyBytes() { return "; comment\n\n" + bytes(0, 1); }

    static void set(File& file, int number, std::string const& value = "value") {
        Family::put(file, entryKey(number), wide(value));
    }
    static void add(File& file, int number) { set(file, number); }
    static void remove(File& file, int number) { Family::erase(file, entryKey(number)); }
    static std::wstring value(File& file, int number) {
        return Family::get(file, entryKey(number));
    }

    static std::vector<Operation<File>> ownOperations() {
        return {
            {"enumerateKeys", [](File& f) { Family::keys(f); }},
            {"createKey", [](File& f) { Family::create(f, L"n"); }},
            {"createKey that exists", [](File& f) { Family::create(f, entryKey(0)); }},
            {"removeKey", [](File& f) { remove(f, 0); }},
            {"removeKey of nothing", [](File& f) { remove(f, 1); }},
            {"getValue", [](File& f) { value(f, 0); }},
            {"getValue of nothing", [](File& f) { value(f, 1); }},
            {"setValue", [](File& f) { set(f, 0, "w"); }},
            {"setValue of a new key", [](File& f) { set(f, 1, "w"); }},
        };
    }
};

/// The sectioned settings file, with one section.
struct Sectioned : SettingsFamily<Sectioned, Koru::InitializationFile> {
    static char const* label() { return "initialization file"; }
    static char const* header() { return "[s]\n"; }
    static std::wstring get(File& f, std::wstring const& key) { return f.getValue(L"s", key); }
    static void put(File& f, std::wstring const& key, std::wstring const& value) {
        f.setValue(L"s", key, value);
    }
    static void create(File& f, std::wstring const& key) { f.createKey(L"s", key); }
    static void erase(File& f, std::wstring const& key) { f.removeKey(L"s", key); }
    static std::vector<std::wstring> keys(File& f) { return f.enumerateKeys(L"s"); }

    static std::vector<std::size_t> ownSlots() {
        return {slotOf(&File::enumerateSections), slotOf(&File::createSection),
                slotOf(&File::removeSection),     slotOf(&File::enumerateKeys),
                slotOf(&File::createKey),         slotOf(&File::removeKey),
                slotOf(&File::getValue),          slotOf(&File::setValue)};
    }
    static std::vector<Operation<File>> ownOperations() {
        std::vector<Operation<File>> result = SettingsFamily::ownOperations();
        result.push_back({"enumerateSections", [](File& f) { f.enumerateSections(); }});
        result.push_back({"createSection", [](File& f) { f.createSection(L"n"); }});
        result.push_back({"createSection that exists", [](File& f) { f.createSection(L"s"); }});
        result.push_back({"removeSection", [](File& f) { f.removeSection(L"s"); }});
        return result;
    }
};

/// The flat settings file.
struct Flat : SettingsFamily<Flat, Koru::PropertyFile> {
    static char const* label() { return "property file"; }
    static char const* header() { return ""; }
    static std::wstring get(File& f, std::wstring const& key) { return f.getValue(key); }
    static void put(File& f, std::wstring const& key, std::wstring const& value) {
        f.setValue(key, value);
    }
    static void create(File& f, std::wstring const& key) { f.createKey(key); }
    static void erase(File& f, std::wstring const& key) { f.removeKey(key); }
    static std::vector<std::wstring> keys(File& f) { return f.enumerateKeys(); }

    static std::vector<std::size_t> ownSlots() {
        return {slotOf(&File::enumerateKeys), slotOf(&File::createKey), slotOf(&File::removeKey),
                slotOf(&File::getValue), slotOf(&File::setValue)};
    }
};

/// The record file. What a file of several records holds is known but for their order.
struct Records {
    using File = Koru::DataFile;
    using Record = Koru::DataFile::Record;
    static char const* label() { return "data file"; }
    static constexpr unsigned long ADDED_MODE = Koru::File::BINARY;
    static constexpr bool CLOSES_ALWAYS = false;

    static std::string field(std::string const& bytes) {
        std::string result;
        for (int shift = 0; shift < 32; shift += 8)
            result += static_cast<char>(bytes.size() >> shift);
        return result + bytes;
    }
    static std::string keyField(std::string const& key) {
        std::string result;
        for (char const c : key) result += {'\0', c};
        return field(result);
    }
    static std::string bytes(int first, int end, std::string const& value = "value") {
        std::string result;
        for (int i = first; i < end; ++i) result += keyField(narrowKey(i)) + field(value);
        return result;
    }
    static std::string untidyBytes() { return keyField(" " + narrowKey(0)) + field("value"); }

    static Record record(int number, std::string const& value = "value") {
        return {entryKey(number), {value.begin(), value.end()}};
    }
    static void set(File& file, int number, std::string const& value = "value") {
        remove(file, number);
        file.insert(record(number, value));
    }
    static void add(File& file, int number) { file.insert(record(number)); }
    static void remove(File& file, int number) { file.remove(record(number)); }
    static std::vector<std::wstring> keys(File& file) {
        std::vector<std::wstring> result;
        for (unsigned long i = 0; i < file.size(); ++i) result.push_back(file[i].getKey());
        return result;
    }
    static std::wstring value(File& file, int number) {
        for (unsigned long i = 0; i < file.size(); ++i) {
            Record const& held = file[i];
            if (held.getKey() != entryKey(number)) continue;
            return std::wstring(held.getData().begin(), held.getData().end());
        }
        return L"";
    }

    static std::vector<std::size_t> ownSlots() { return {}; }
    static std::vector<Operation<File>> ownOperations() {
        return {
            {"size", [](File& f) { static_cast<void>(f.size()); }},
            {"operator[]", [](File& f) { static_cast<void>(f[0]); }},
            {"insert", [](File& f) { add(f, 1); }},
            {"insert of an equal key", [](File& f) { add(f, 0); }},
            {"remove", [](File& f) { remove(f, 0); }},
            {"remove of nothing", [](File& f) { remove(f, 1); }},
        };
    }
};

template <class Family>
std::size_t sizeOf(typename Family::File& file) {
    return Family::keys(file).size();
}

/// Whether the file holds the entries from `first` up to `end` and no others, in whatever order,
/// and the last one has this value.
template <class Family>
bool holds(typename Family::File& file, int first, int end, std::string const& value = "value") {
    std::vector<std::wstring> keys = Family::keys(file);
    std::sort(keys.begin(), keys.end());
    std::vector<std::wstring> expected;
    for (int i = first; i < end; ++i) expected.push_back(entryKey(i));
    return keys == expected && (first == end || Family::value(file, end - 1) == wide(value));
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
