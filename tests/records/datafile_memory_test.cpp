// The record file when memory runs out.
#include <doctest/doctest.h>

#include <unistd.h>

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

using namespace test;
using Koru::DataFile;
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
        entries.push_back({prefix + std::to_wstring(i), Bytes(dataSize, 'd')});
    }
    return entries;
}

/// Calls attempt(edit, plan) with every allocation failing in turn, edit by edit.
template <class Attempt>
void forEachEditAndFailure(Attempt attempt) {
    for (Edit const& edit : std::vector<Edit>{
             {"nothing at all", {}, {}},
             {"one record", numbered(L"k", 1, 4), {}},
             {"one record more", numbered(L"k", 1, 4), numbered(L"l", 1, 100)},
             {"long key and data", {}, {{std::wstring(50000, L'k'), Bytes(200000, 'd')}}},
             {"many records", numbered(L"a somewhat long key ", 70, 30), numbered(L"k", 70, 3)},
         }) {
        CAPTURE(edit.label);
        forEachFailure([&](MemoryPlan const& plan) { return attempt(edit, plan); });
    }
}

/// Runs a write-back with each of its allocations failing in turn. The file on the disk is the old
/// or the new one after each, whole, and the object can still be used.
void checkWriteBack(void (DataFile::*writeBack)(), unsigned long mode) {
    Watchdog const watchdog;
    Place const place;
    forEachEditAndFailure([&](Edit const& edit, MemoryPlan const& plan) {
        place.write(fileBytes(edit.stored));
        DataFile file(place.path());
        file.open(mode);
        insertAll(file, edit.inserted);
        std::string const old = place.bytes();
        std::string const complete = fileBytes(held(file));
        std::string const outcome = runOutOfMemory(plan, [&] { (file.*writeBack)(); });
        REQUIRE(place.exists());
        bool const isNew = place.bytes() == complete;
        bool const isOld = place.bytes() == old;
        bool const right = isNew || (isOld && outcome != "done");
        CHECK(right);
        if (outcome != "done") CHECK(outcome == "std::bad_alloc");
        CHECK(isFree(file));
        if (!memoryRanOut()) return false;
        CHECK(messageOf<std::exception>([&] { file.close(); }) == "<nothing>");
        return true;
    });
}

} // namespace

TEST_CASE("when memory runs out in close, the old file or the new one is there, and whole") {
    checkWriteBack(&DataFile::close, READ_WRITE);
    checkWriteBack(&DataFile::close, WRITE);
}

TEST_CASE("when memory runs out in synchronize, the old file or the new one is there, and whole") {
    checkWriteBack(&DataFile::synchronize, READ_WRITE);
}

TEST_CASE("when memory runs out before the old file is deleted, the records are still held") {
    OwnDataFile file(fileBytes(numbered(L"k", 70, 10)), READ_WRITE);
    file.insert(record(L"new"));
    Entries const entries = held(file);
    REQUIRE(runOutOfMemory({0}, [&] { file.close(); }) == "std::bad_alloc");
    CHECK(file.is_open());
    checkSame(held(file), entries);
    file.close();
    CHECK(file.bytes() == fileBytes(entries));
}

TEST_CASE("when memory runs out in the destructor, the process goes on and no file is cut") {
    Place const place;
    forEachEditAndFailure([&](Edit const& edit, MemoryPlan const& plan) {
        std::string const old = fileBytes(edit.stored);
        place.write(old);
        std::string const told = toldByChild([&] {
            auto file = std::make_unique<DataFile>(place.path());
            file->open(READ_WRITE);
            insertAll(*file, edit.inserted);
            std::string const complete = fileBytes(held(*file));
            std::string const outcome = runOutOfMemory(plan, [&] { file.reset(); });
            bool const isRight =
                place.bytes() == complete || (memoryRanOut() && place.bytes() == old);
            return outcome + (memoryRanOut() ? ", ran out" : "") +
                   (isRight ? "" : ", another file");
        });
        if (told == "done") return false;
        REQUIRE(told == "done, ran out");
        return true;
    });
}

TEST_CASE("when memory runs out in open, a later open works") {
    Watchdog const watchdog;
    Place const place;
    for (unsigned long const mode : {READ, READ_WRITE}) {
        CAPTURE(mode);
        forEachEditAndFailure([&](Edit const& edit, MemoryPlan const& plan) {
            std::string const content = fileBytes(edit.stored) + fileBytes(edit.inserted);
            Entries const expected = load(content).entries;
            place.write(content);
            DataFile file(place.path());
            std::string const outcome = runOutOfMemory(plan, [&] { file.open(mode); });
            bool const ranOut = memoryRanOut();
            CHECK(isFree(file));
            if (outcome != "done") {
                CHECK(outcome == "std::bad_alloc");
                CHECK(held(file).size() <= expected.size());
                file.setMode(READ);
                file.close();
                file.open(READ);
            }
            bool const same = place.bytes() == content;
            CHECK(same);
            checkSameRecords(held(file), expected);
            file.setMode(READ);
            return ranOut;
        });
    }
}

TEST_CASE("when memory runs out in insert or remove, it is done whole or not at all") {
    Watchdog const watchdog;
    Record const longOne = record(std::wstring(500, L'\u00E9'), std::string(500, 'x'));
    for (int const size : {0, 1, 63, 64, 65, 127, 128, 129, 256}) {
        for (auto const change : {&DataFile::insert, &DataFile::remove}) {
            bool const inserting = change == &DataFile::insert;
            CAPTURE(size);
            CAPTURE(inserting);
            Entries expected = numbered(L"k", size, 5);
            if (inserting) expected.push_back(entryOf(longOne));
            forEachFailure([&](MemoryPlan const& plan) {
                DataFile file;
                insertAll(file, numbered(L"k", size, 5));
                if (!inserting) file.insert(longOne);
                unsigned long const count = file.size();
                std::string const outcome = runOutOfMemory(plan, [&] { (file.*change)(longOne); });
                bool const ranOut = memoryRanOut();
                CHECK(isFree(file));
                if (outcome != "done") {
                    CHECK(outcome == "std::bad_alloc");
                    CHECK(file.size() == count);
                    (file.*change)(longOne);
                }
                checkSameRecords(held(file), expected);
                CHECK(isInOrderOfAddresses(file));
                return ranOut;
            });
        }
    }
}

TEST_CASE("when memory runs out in setKey or setData, the record keeps a key and data of its own") {
    Entry const before = entry(L"before", "old");
    Entry const after{std::wstring(500, L'k'), Bytes(500, 'd')};
    forEachFailure([&](MemoryPlan const& plan) {
        Record r(before.key, before.data);
        std::string const outcome = runOutOfMemory(plan, [&] { r.setKey(after.key); });
        checkSame({entryOf(r)}, {{outcome == "done" ? after.key : before.key, before.data}});
        return memoryRanOut();
    });
    forEachFailure([&](MemoryPlan const& plan) {
        Record r(before.key, before.data);
        std::string const outcome = runOutOfMemory(plan, [&] { r.setData(after.data); });
        checkSame({entryOf(r)}, {{before.key, outcome == "done" ? after.data : before.data}});
        return memoryRanOut();
    });
}

TEST_CASE("when memory runs out in the constructor, nothing is left") {
    Place const place;
    Koru::File::Path const path(place.path());
    forEachFailure([&](MemoryPlan const& plan) {
        std::string const outcome = runOutOfMemory(plan, [&] { DataFile const file(path); });
        CHECK(outcome == (memoryRanOut() ? "std::bad_alloc" : "done"));
        return memoryRanOut();
    });
    CHECK(!place.exists());
}
