// A record file of any bytes is read up to what is wrong with it, and what was read survives every
// rewrite.
#include <koru/datafile.h>

#include <algorithm>
#include <cstdint>
#include <new>
#include <stdexcept>
#include <string>
#include <utility>
#include <vector>

#include "check.h"
#include "memoryfile.h"

namespace {

using Koru::DataFile;
using Koru::File;
using Bytes = std::vector<unsigned char>;
using Entries = std::vector<std::pair<std::wstring, Bytes>>;

/// The records by position.
Entries held(DataFile& file) {
    Entries entries;
    for (unsigned long i = 0; i < file.size(); ++i) {
        KORU_CHECK(i == 0 || &file[i - 1] < &file[i]);
        entries.emplace_back(file[i].getKey(), file[i].getData());
    }
    return entries;
}

Entries sorted(Entries entries) {
    std::sort(entries.begin(), entries.end());
    return entries;
}

std::string lengthField(std::size_t length) {
    std::string field;
    for (int shift = 0; shift < 32; shift += 8) field += static_cast<char>(length >> shift & 0xFFU);
    return field;
}

std::string bytesOf(Entries const& entries) {
    std::string bytes;
    for (auto const& entry : entries) {
        bytes += lengthField(2 * entry.first.size());
        for (wchar_t const c : entry.first) {
            bytes += '\0';
            bytes += static_cast<char>(static_cast<std::uint32_t>(c) & 0xFFU);
        }
        bytes += lengthField(entry.second.size());
        bytes.append(entry.second.begin(), entry.second.end());
    }
    return bytes;
}

/// Cuts a length and as many bytes off the front; false when they are not there.
bool cut(std::string& rest, std::string& field) {
    std::uint32_t length = 0;
    for (std::size_t i = 4; i-- > 0 && rest.size() >= 4;) {
        length = length << 8 | static_cast<unsigned char>(rest[i]);
    }
    if (rest.size() < 4 || rest.size() - 4 < length) return false;
    field = rest.substr(4, length);
    rest.erase(0, 4 + std::size_t{length});
    return true;
}

/// The complete entries that the bytes begin with; in the end `rest` tells what is wrong.
Entries completeEntries(std::string& rest) {
    Entries entries;
    std::string key;
    std::string data;
    for (std::string left = rest; cut(left, key) && cut(left, data); rest = left) {
        if (key.size() % 2 != 0) key += '\0';
        std::wstring wide;
        for (std::size_t i = 1; i < key.size(); i += 2) {
            wide += static_cast<wchar_t>(static_cast<signed char>(key[i]));
        }
        std::size_t const first = wide.find_first_not_of(L" \t\n");
        if (first != std::wstring::npos) {
            wide = wide.substr(first, wide.find_last_not_of(L" \t\n") + 1 - first);
        }
        if (wide.empty() || wide[0] == L'\0') return entries;
        entries.emplace_back(wide, Bytes(data.begin(), data.end()));
    }
    return entries;
}

/// Opens the file and tells whether all of it was read.
bool opens(DataFile& file) {
    try {
        file.open(File::READ | File::WRITE);
        return true;
    } catch (std::invalid_argument const& e) {
        KORU_CHECK(e.what() == std::string("zero length key"));
    } catch (std::runtime_error const& e) {
        KORU_CHECK(e.what() == std::string("failed to read from file"));
    } catch (std::bad_alloc const&) {
    }
    return false;
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(std::uint8_t const* data, std::size_t size) {
    static fuzz::MemoryFile const memory;
    memory.write(data, size);
    std::string rest(data, data + size);
    Entries const expected = completeEntries(rest);

    DataFile file(memory.path());
    KORU_CHECK(opens(file) == rest.empty());
    KORU_CHECK(file.is_open());
    KORU_CHECK(sorted(held(file)) == sorted(expected));
    for (int rewrite = 0; rewrite < 2; ++rewrite) {
        std::string const bytes = bytesOf(held(file));
        file.close();
        KORU_CHECK(memory.bytes() == bytes);
        KORU_CHECK(opens(file));
        KORU_CHECK(sorted(held(file)) == sorted(expected));
    }
    for (auto const& entry : expected) file.remove(DataFile::Record(entry.first, entry.second));
    KORU_CHECK(file.size() == 0);
    file.close();
    KORU_CHECK(memory.bytes().empty());
    return 0;
}
