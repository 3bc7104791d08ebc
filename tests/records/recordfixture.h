// A record file in a directory of its own, the records as plain values, and what reading and
// writing them does, in the plainest way. Tests compare the library with it.
#ifndef KORU_TESTS_RECORDFIXTURE_H
#define KORU_TESTS_RECORDFIXTURE_H

#include <doctest/doctest.h>

#include <pthread.h>
#include <sys/resource.h>
#include <unistd.h>
#include <wchar.h>

#include <algorithm>
#include <chrono>
#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <fstream>
#include <functional>
#include <future>
#include <new>
#include <stdexcept>
#include <string>
#include <thread>
#include <vector>

#include <koru/datafile.h>

#include "support/ownfile.h"
#include "support/sanitizers.h"
#include "support/shown.h"
#include "support/subprocess.h"
#include "support/tempdir.h"

namespace test {

unsigned long const READ = Koru::File::READ;
unsigned long const WRITE = Koru::File::WRITE;
unsigned long const BINARY = Koru::File::BINARY;
unsigned long const READ_WRITE = Koru::File::READ | Koru::File::WRITE;

char const* const NO_KEY = "zero length key";

using Bytes = std::vector<unsigned char>;

inline Bytes bytes(std::string const& text) { return {text.begin(), text.end()}; }

/// A record as a plain value.
struct Entry {
    std::wstring key;
    Bytes data;
};

inline bool operator==(Entry const& a, Entry const& b) {
    return a.key == b.key && a.data == b.data;
}
inline bool operator<(Entry const& a, Entry const& b) {
    return a.key != b.key ? a.key < b.key : a.data < b.data;
}

using Entries = std::vector<Entry>;

inline Entry entry(std::wstring const& key, std::string const& data = "") {
    return {key, bytes(data)};
}

inline Koru::DataFile::Record record(std::wstring const& key, std::string const& data = "") {
    return {key, bytes(data)};
}

inline Entry entryOf(Koru::DataFile::Record const& held) { return {held.getKey(), held.getData()}; }

/// Whether keys are equal: as the C library compares them, up to the first NUL.
inline bool sameKey(std::wstring const& a, std::wstring const& b) {
    return ::wcscasecmp(a.c_str(), b.c_str()) == 0;
}

/// The key that setting this one stores.
/// @throws std::invalid_argument for a key that is refused
inline std::wstring storedKey(std::wstring key) {
    wchar_t const* const blanks = L" \t\n";
    std::size_t const first = key.find_first_not_of(blanks);
    if (first != std::wstring::npos) key.erase(0, first);
    std::size_t const last = key.find_last_not_of(blanks);
    if (last != std::wstring::npos) key.erase(last + 1);
    if (key.empty() || key[0] == L'\0') throw std::invalid_argument(NO_KEY);
    return key;
}

inline std::string lengthField(std::uint32_t length) {
    std::string field;
    for (int shift = 0; shift < 32; shift += 8) field += static_cast<char>(length >> shift & 0xFFU);
    return field;
}

inline std::string fileBytes(Entry const& entry) {
    std::string result = lengthField(static_cast<std::uint32_t>(2 * entry.key.size()));
    for (wchar_t const c : entry.key) {
        result += '\0';
        result += static_cast<char>(static_cast<std::uint32_t>(c) & 0xFFU);
    }
    result += lengthField(static_cast<std::uint32_t>(entry.data.size()));
    result.append(entry.data.begin(), entry.data.end());
    return result;
}

inline std::string fileBytes(Entries const& entries) {
    std::string result;
    for (Entry const& entry : entries) result += fileBytes(entry);
    return result;
}

/// How reading a file ends ("<nothing>" is thrown where all is well), and what is held then.
struct Loaded {
    std::string message;
    Entries entries;
};

/// Cuts a length and as many bytes off the front. A length that no object can have is not looked
/// for in the file.
inline std::string cutField(std::string& rest) {
    if (rest.size() < 4) throw std::runtime_error("failed to read from file");
    std::uint32_t length = 0;
    for (std::size_t i = 4; i-- > 0;) length = length << 8 | static_cast<unsigned char>(rest[i]);
    if (length > Bytes().max_size()) throw std::bad_alloc();
    if (rest.size() - 4 < length) throw std::runtime_error("failed to read from file");
    std::string const field = rest.substr(4, length);
    rest.erase(0, 4 + std::size_t{length});
    return field;
}

/// What a file of these bytes is read as.
inline Loaded load(std::string rest) {
    Loaded result{"<nothing>", {}};
    try {
        while (!rest.empty()) {
            std::string keyField = cutField(rest);
            if (keyField.size() % 2 != 0) keyField += '\0';
            std::wstring key;
            for (std::size_t i = 1; i < keyField.size(); i += 2) {
                key += static_cast<wchar_t>(static_cast<signed char>(keyField[i]));
            }
            Bytes const data = bytes(cutField(rest));
            result.entries.push_back({storedKey(key), data});
        }
    } catch (std::exception const& e) {
        result.message = e.what();
    }
    return result;
}

using OwnDataFile = OwnFile<Koru::DataFile>;

/// The records held, by position.
inline Entries held(Koru::DataFile& file) {
    Entries entries;
    for (unsigned long i = 0; i < file.size(); ++i) entries.push_back(entryOf(file[i]));
    return entries;
}

inline void insertAll(Koru::DataFile& file, Entries const& entries) {
    for (Entry const& e : entries) file.insert({e.key, e.data});
}

/// What a file of these bytes is loaded as.
inline Entries loaded(Place const& place, std::string const& content) {
    place.write(content);
    Koru::DataFile file(place.path());
    file.open(READ);
    return held(file);
}

/// The bytes of the file that these records are written to.
inline std::string written(Place const& place, std::vector<Koru::DataFile::Record> const& records) {
    Koru::DataFile file(place.path());
    file.open(WRITE);
    for (Koru::DataFile::Record const& r : records) file.insert(r);
    file.close();
    return place.bytes();
}

/// The message with which opening ends, of the exception of the type that belongs to it.
inline std::string openMessage(Koru::DataFile& file, unsigned long mode) {
    try {
        file.open(mode);
    } catch (std::bad_alloc const&) {
        return "std::bad_alloc";
    } catch (std::invalid_argument const& e) {
        return e.what() == std::string(NO_KEY) ? NO_KEY : "another invalid_argument";
    } catch (std::runtime_error const& e) {
        return e.what() == std::string(NO_KEY) ? "wrong type" : e.what();
    }
    return "<nothing>";
}

inline Entries sorted(Entries entries) {
    std::sort(entries.begin(), entries.end());
    return entries;
}

inline std::string shown(Entries const& entries) {
    std::string result;
    for (std::size_t i = 0; i < entries.size() && i < 50; ++i) {
        result += shownStart(entries[i].key, 100) + ": " + shownStart(entries[i].data, 100) + '\n';
    }
    return result;
}

/// Checks that both are the same in the same order, and shows them if not.
inline void checkSame(Entries const& actual, Entries const& expected) {
    bool const same = actual == expected;
    INFO("actual:\n", shown(actual), "expected:\n", shown(expected));
    CHECK(same);
}

/// Both are the same in any order: positions have no meaning after reading.
inline void checkSameRecords(Entries const& actual, Entries const& expected) {
    checkSame(sorted(actual), sorted(expected));
}

inline void checkKey(std::wstring const& actual, std::wstring const& expected) {
    CHECK(shown(actual) == shown(expected));
}

/// Positions follow the addresses of the records.
inline bool isInOrderOfAddresses(Koru::DataFile& file) {
    for (unsigned long i = 1; i < file.size(); ++i) {
        if (!std::less<>()(&file[i - 1], &file[i])) return false;
    }
    return true;
}

/// Whether nobody, the calling thread included, holds the file's lock.
inline bool isFree(Koru::File& file) {
    std::promise<bool> promise;
    std::future<bool> result = promise.get_future();
    std::thread other([&] { promise.set_value(file.lock() && file.unlock()); });
    bool const finished = result.wait_for(std::chrono::seconds(20)) == std::future_status::ready;
    if (!finished) ::pthread_cancel(other.native_handle());
    other.join();
    return finished && result.get();
}

/// Writes these records and reads them again, both as the plain rules say. Returns how many were
/// written, one of those with equal keys.
inline std::size_t writeAndRead(Place const& place, Entries const& entries) {
    Koru::DataFile file(place.path());
    file.open(WRITE);
    insertAll(file, entries);
    Entries const inserted = held(file);
    file.close();
    bool const same = place.bytes() == fileBytes(inserted);
    CHECK(same);
    Loaded const expected = load(fileBytes(inserted));
    CHECK(openMessage(file, READ) == expected.message);
    checkSameRecords(held(file), expected.entries);
    CHECK(isInOrderOfAddresses(file));
    return inserted.size();
}

// The sanitizers reserve more than any limit allows.
constexpr bool MEMORY_CAN_BE_LIMITED = !test::SANITIZED;

/// Gives this process 256 MiB more address space than it has now. Only for child processes.
inline void limitMemory() {
    if (!MEMORY_CAN_BE_LIMITED) return;
    std::size_t pages = 0;
    std::ifstream("/proc/self/statm") >> pages;
    rlimit limit = {};
    ::getrlimit(RLIMIT_AS, &limit);
    limit.rlim_cur = pages * static_cast<std::size_t>(::sysconf(_SC_PAGESIZE)) + (256UL << 20);
    ::setrlimit(RLIMIT_AS, &limit);
}

/// Opens a file of these bytes and says what is not as it should be; "" when all is well.
inline std::string faultWith(Place const& place, std::string const& content) {
    Loaded const expected = load(content);
    place.write(content);
    Koru::DataFile file(place.path());
    std::string const message = openMessage(file, READ);
    std::string fault;
    if (message != expected.message) fault += message + " instead of " + expected.message + ", ";
    if (!file.is_open()) fault += "not open, ";
    if (sorted(held(file)) != sorted(expected.entries)) fault += "other records, ";
    if (!isFree(file)) fault += "still locked, ";
    // The object can still be used.
    place.write(fileBytes(entry(L"good", "file")));
    file.close();
    file.open(READ);
    if (file.size() != 1) fault += "not usable, ";
    return fault;
}

/// Tries all of these files in a child with little memory.
inline void checkFaultless(std::vector<std::string> const& contents) {
    Place const place;
    REQUIRE(!contents.empty());
    Outcome const outcome = inChild([&] {
        ::alarm(250);
        limitMemory();
        for (std::string const& content : contents) {
            std::string const fault = faultWith(place, content);
            if (!fault.empty()) std::printf("%s: %s\n", shown(content).c_str(), fault.c_str());
        }
        std::printf("tried all");
        return 0;
    });
    CHECK(outcome.exitCode == 0);
    CHECK(outcome.out == "tried all");
}

} // namespace test

#endif
