// The record file when memory runs out.
#include <doctest/doctest.h>

#include <cstddef>
#include <memory>
#include <stdexcept>
#include <string>
#include <vector>

#include <koru/datafile.h>

#include "records/recordfixture.h"
#include "support/failingmemory.h"
#include "support/subprocess.h"
#include "support/throws.h"

using Koru::DataFile;
using test::checkSame;
using test::checkSameRecords;
using test::Entries;
using test::Entry;
using test::Failing;
using test::fileBytes;
using test::held;
using test::isFree;
using test::memoryRanOut;
using test::Place;
using test::READ;
using test::READ_WRITE;
using test::record;
using test::runOutOfMemory;
using test::Watchdog;
using test::WRITE;
using Record = Koru::DataFile::Record;

namespace {

/// Records stored in a file, and those that are inserted before it is written back.
struct Edit {
    std::string label;
    Entries stored;
    Entries inserted;
};

Entries numbered(std::wstring const& prefix, int count, std::size_t dataSize) {
    Entries entries;
    for (int i = 0; i < count; ++i) {
        entries.push_back({prefix + std::to_wstring(i), test::Bytes(dataSize, 'd')});
    }
    return entries;
}

std::vector<Edit> edits() {
    return {
        {"nothing at all", {}, {}},
        {"one record", numbered(L"k", 1, 4), {}},
        {"one record more", numbered(L"k", 1, 4), numbered(L"l", 1, 100)},
        {"long key and data", {}, {{std::wstring(50000, L'k'), test::Bytes(200000, 'd')}}},
        {"many records", numbered(L"a somewhat long key ", 70, 30), numbered(L"k", 70, 3)},
    };
}

void openAndEdit(DataFile& file, unsigned long mode, Edit const& edit) {
    file.open(mode);
    for (Entry const& e : edit.inserted) file.insert(Record(e.key, e.data));
}

/// Runs a write-back with each of its allocations failing in turn. The file on the disk is the old
/// or the new one after each, whole, and the object can still be used.
template <class WriteBack>
void checkWriteBack(WriteBack writeBack, std::vector<unsigned long> const& modes) {
    Watchdog const watchdog;
    Place const place;
    for (Edit const& edit : edits()) {
        for (unsigned long const mode : modes) {
            for (Failing const failing : {Failing::ONE, Failing::ONE_AND_ALL_LATER}) {
                for (long before = 0;; ++before) {
                    CAPTURE(edit.label);
                    CAPTURE(mode);
                    CAPTURE(failing == Failing::ONE);
                    CAPTURE(before);
                    place.write(fileBytes(edit.stored));
                    DataFile file(place.path());
                    openAndEdit(file, mode, edit);
                    std::string const old = place.bytes();
                    std::string const complete = fileBytes(held(file));
                    std::string const outcome =
                        runOutOfMemory(before, failing, [&] { writeBack(file); });
                    REQUIRE(place.exists());
                    bool const isOld = place.bytes() == old;
                    bool const isNew = place.bytes() == complete;
                    if (outcome == "done") {
                        CHECK(isNew);
                    } else {
                        bool const oldOrNew = isOld || isNew;
                        CHECK(oldOrNew);
                        CHECK(outcome == "std::bad_alloc");
                    }
                    CHECK(isFree(file));
                    if (!memoryRanOut()) break;
                    CHECK(test::messageOf<std::exception>([&] { file.close(); }) == "<nothing>");
                    CHECK(before < 10000);
                }
            }
        }
    }
}

} // namespace

TEST_CASE("when memory runs out in close, the old file or the new one is there, and whole") {
    checkWriteBack([](DataFile& file) { file.close(); }, {READ_WRITE, WRITE});
}

TEST_CASE("when memory runs out in synchronize, the old file or the new one is there, and whole") {
    checkWriteBack([](DataFile& file) { file.synchronize(); }, {READ_WRITE});
}

TEST_CASE("when memory runs out before the old file is deleted, the records are still held") {
    Place const place;
    place.write(fileBytes(numbered(L"k", 70, 10)));
    DataFile file(place.path());
    file.open(READ_WRITE);
    file.insert(record(L"new"));
    Entries const entries = held(file);
    std::string const outcome = runOutOfMemory(0, Failing::ONE, [&] { file.close(); });
    REQUIRE(outcome == "std::bad_alloc");
    CHECK(file.is_open());
    checkSame(held(file), entries);
    file.close();
    CHECK(place.bytes() == fileBytes(entries));
}

TEST_CASE("when memory runs out in the destructor, the process goes on and no file is cut") {
    Place const place;
    for (Edit const& edit : edits()) {
        for (Failing const failing : {Failing::ONE, Failing::ONE_AND_ALL_LATER}) {
            for (long before = 0;; ++before) {
                CAPTURE(edit.label);
                CAPTURE(failing == Failing::ONE);
                CAPTURE(before);
                std::string const old = fileBytes(edit.stored);
                place.write(old);
                test::Outcome const outcome = test::inChild([&] {
                    ::alarm(60);
                    std::unique_ptr<DataFile> file(new DataFile(place.path()));
                    openAndEdit(*file, READ_WRITE, edit);
                    std::string const complete = fileBytes(held(*file));
                    if (runOutOfMemory(before, failing, [&] { file.reset(); }) != "done") return 1;
                    bool const ranOut = memoryRanOut();
                    if (place.bytes() == complete) return ranOut ? 42 : 43;
                    return place.bytes() == old && ranOut ? 42 : 2;
                });
                CHECK(outcome.signal == 0);
                if (outcome.exitCode == 43) break;
                REQUIRE(outcome.exitCode == 42);
            }
        }
    }
}

TEST_CASE("when memory runs out in open, a later open works") {
    Watchdog const watchdog;
    Place const place;
    for (Edit const& edit : edits()) {
        std::string const content = fileBytes(edit.stored) + fileBytes(edit.inserted);
        Entries const expected = test::load(content).entries;
        for (unsigned long const mode : {READ, READ_WRITE}) {
            for (Failing const failing : {Failing::ONE, Failing::ONE_AND_ALL_LATER}) {
                for (long before = 0;; ++before) {
                    CAPTURE(edit.label);
                    CAPTURE(mode);
                    CAPTURE(failing == Failing::ONE);
                    CAPTURE(before);
                    place.write(content);
                    DataFile file(place.path());
                    std::string const outcome =
                        runOutOfMemory(before, failing, [&] { file.open(mode); });
                    bool const ranOut = memoryRanOut();
                    CHECK(isFree(file));
                    if (outcome != "done") {
                        CHECK(outcome == "std::bad_alloc");
                        CHECK(file.size() <= expected.size());
                        held(file); // whatever it is, it can be used
                        file.setMode(READ);
                        file.close();
                        file.open(READ);
                    }
                    bool const same = place.bytes() == content;
                    CHECK(same);
                    checkSameRecords(held(file), expected);
                    file.setMode(READ);
                    if (!ranOut) break;
                    CHECK(before < 100000);
                }
            }
        }
    }
}

TEST_CASE("when memory runs out in insert or remove, it is done whole or not at all") {
    Watchdog const watchdog;
    Record const longOne(std::wstring(500, L'\u00E9'), test::Bytes(500, 'x'));
    for (int const size : {0, 1, 63, 64, 65, 127, 128, 129, 256}) {
        for (bool const inserting : {true, false}) {
            for (long before = 0;; ++before) {
                CAPTURE(size);
                CAPTURE(inserting);
                CAPTURE(before);
                DataFile file;
                for (Entry const& e : numbered(L"k", size, 5)) file.insert(Record(e.key, e.data));
                if (!inserting) file.insert(longOne);
                unsigned long const count = file.size();
                std::string const outcome = runOutOfMemory(before, Failing::ONE, [&] {
                    inserting ? file.insert(longOne) : file.remove(longOne);
                });
                bool const ranOut = memoryRanOut();
                CHECK(isFree(file));
                if (outcome != "done") {
                    CHECK(outcome == "std::bad_alloc");
                    CHECK(file.size() == count);
                    inserting ? file.insert(longOne) : file.remove(longOne);
                }
                Entries expected = numbered(L"k", size, 5);
                if (inserting) expected.push_back(test::entryOf(longOne));
                checkSameRecords(held(file), expected);
                CHECK(test::isInOrderOfAddresses(file));
                if (!ranOut) break;
                CHECK(before < 100);
            }
        }
    }
}

TEST_CASE("when memory runs out in setKey or setData, the record keeps a key and data of its own") {
    std::wstring const key(500, L'k');
    test::Bytes const data(500, 'd');
    for (long before = 0;; ++before) {
        Record r = record(L"before", "old");
        std::string const outcome = runOutOfMemory(before, Failing::ONE, [&] { r.setKey(key); });
        test::checkKey(r.getKey(), outcome == "done" ? key : L"before");
        if (!memoryRanOut()) break;
    }
    for (long before = 0;; ++before) {
        Record r = record(L"before", "old");
        std::string const outcome = runOutOfMemory(before, Failing::ONE, [&] { r.setData(data); });
        bool const right = r.getData() == (outcome == "done" ? data : test::bytes("old"));
        CHECK(right);
        if (!memoryRanOut()) break;
    }
}

TEST_CASE("when memory runs out in the constructor, nothing is left behind") {
    Place const place;
    Koru::File::Path const path(place.path());
    for (long before = 0;; ++before) {
        std::string const outcome =
            runOutOfMemory(before, Failing::ONE, [&] { DataFile const file(path); });
        CHECK(outcome == (memoryRanOut() ? "std::bad_alloc" : "done"));
        if (!memoryRanOut()) break;
    }
    CHECK(!place.exists());
}
