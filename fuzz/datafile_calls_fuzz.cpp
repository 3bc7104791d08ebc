// Any calls on a record file do what they do to a plain list of records; their places follow their
// addresses, so the lists are compared in the order of their keys.
#include <koru/datafile.h>
#include <koru/string.h>

#include <algorithm>
#include <cstdint>
#include <stdexcept>
#include <string>
#include <utility>
#include <vector>

#include "check.h"
#include "input.h"
#include "memoryfile.h"

namespace {

using Koru::DataFile;
using Koru::File;
using Bytes = std::vector<unsigned char>;
using Entries = std::vector<std::pair<std::wstring, Bytes>>;

Entries::iterator find(Entries& entries, std::wstring const& key) {
    return std::find_if(entries.begin(), entries.end(),
                        [&key](auto const& entry) { return Koru::compare(entry.first, key) == 0; });
}

/// What is read again: of each character the low byte, extended by its sign.
Entries reloaded(Entries entries) {
    for (auto& entry : entries) {
        for (wchar_t& c : entry.first) {
            c = static_cast<signed char>(static_cast<std::uint32_t>(c) & 0xFFU);
        }
    }
    return entries;
}

/// A key that is nothing but characters that reloading keeps or changes to others of the kind: the
/// blanks that setKey trims have no part in this.
std::wstring keyOf(fuzz::Input& input) {
    std::wstring key = input.name();
    for (wchar_t& c : key) {
        if (static_cast<signed char>(c) <= L' ') c = L'\u00E9';
    }
    return key.empty() ? L"none" : key;
}

void checkSame(DataFile& file, Entries expected) {
    Entries held;
    KORU_CHECK(file.size() == expected.size());
    for (unsigned long i = 0; i < file.size(); ++i) {
        KORU_CHECK(i == 0 || &file[i - 1] < &file[i]);
        held.emplace_back(file[i].getKey(), file[i].getData());
    }
    std::sort(held.begin(), held.end());
    std::sort(expected.begin(), expected.end());
    KORU_CHECK(held == expected);
}

void checkEnd(DataFile& file) {
    try {
        static_cast<void>(file[file.size()]);
        KORU_CHECK(false);
    } catch (std::out_of_range const& e) {
        KORU_CHECK(e.what() == std::string("object does not exist"));
    }
}

void callOne(fuzz::Input& input, DataFile& file, Entries& entries) {
    unsigned const what = input.below(8);
    if (what == 0) {
        file.synchronize();
        entries = reloaded(entries);
    } else if (what == 1) {
        file.close();
        file.open(File::READ | File::WRITE);
        entries = reloaded(entries);
    } else if (what == 2 && !entries.empty()) {
        DataFile::Record& record = file[input.below(static_cast<unsigned>(entries.size()))];
        auto const entry = find(entries, record.getKey());
        // Which of two with equal keys it is cannot be told here.
        if (std::count_if(entries.begin(), entries.end(), [&](auto const& other) {
                return Koru::compare(other.first, record.getKey()) == 0;
            }) != 1)
            return;
        std::string const data = input.bytes();
        record.setData(entry->second = Bytes(data.begin(), data.end()));
    } else if (what < 5) {
        std::wstring const key = keyOf(input);
        std::string const data = input.bytes();
        DataFile::Record const record(key, Bytes(data.begin(), data.end()));
        file.insert(record);
        if (find(entries, key) == entries.end()) entries.emplace_back(key, record.getData());
    } else {
        std::wstring const key = keyOf(input);
        auto const isKey = [&key](auto const& e) { return Koru::compare(e.first, key) == 0; };
        bool const isOne = std::count_if(entries.begin(), entries.end(), isKey) <= 1;
        if (!isOne) return;
        file.remove(DataFile::Record(key, {}));
        entries.erase(std::remove_if(entries.begin(), entries.end(), isKey), entries.end());
    }
    checkSame(file, entries);
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(std::uint8_t const* data, std::size_t size) {
    static fuzz::MemoryFile const memory;
    fuzz::Input input(data, size);
    memory.write("");
    DataFile file(memory.path());
    file.open(File::READ | File::WRITE);
    Entries entries;
    while (!input.isAtEnd()) callOne(input, file, entries);
    checkEnd(file);
    file.close();
    checkSame(file, {});
    file.open(File::READ);
    checkSame(file, reloaded(entries));
    return 0;
}
