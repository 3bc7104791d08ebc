// The sectioned settings file when memory runs out.
#include <doctest/doctest.h>

#include <cstddef>
#include <exception>
#include <memory>
#include <string>
#include <thread>
#include <vector>

#include <koru/initializationfile.h>

#include "support/failingmemory.h"
#include "support/settingsfixture.h"
#include "support/settingsmodel.h"
#include "support/subprocess.h"
#include "support/throws.h"

using Koru::InitializationFile;
using test::checkSame;
using test::drain;
using test::forEachFailure;
using test::MemoryPlan;
using test::memoryRanOut;
using test::Place;
using test::READ;
using test::READ_WRITE;
using test::runOutOfMemory;
using test::Setting;
using test::Settings;
using test::SettingsTableModel;
using test::Watchdog;
using test::WRITE;

namespace {

/// Lets another thread use the file, which it can when the lock is free.
void useFromAnotherThread(InitializationFile& file) {
    std::thread([&file] { file.getValue(L"s", L"k"); }).join();
}

/// A file's bytes, and what is set in it before it is written back.
struct Edit {
    std::string label;
    std::string bytes;
    Settings changes;
};

std::vector<Edit> edits() {
    std::string sorted = "[s]\n";
    std::string unsorted = "[t]\nx=1\n[s]\n";
    Settings additions;
    for (int i = 100; i < 250; ++i) {
        sorted += "key" + std::to_string(i) + "=value\n";
        unsorted += "key" + std::to_string(i * 7919 % 1000) + "=v\xC3\xA9lue\n";
        additions.push_back({L"a" + std::to_wstring(i % 5), L"k" + std::to_wstring(900 - i),
                             std::wstring(static_cast<std::size_t>(2 * i), L'\u20AC')});
    }
    return {
        {"nothing at all", "", {}},
        {"one entry, unchanged", "[s]\nk=v\n", {}},
        {"one entry, changed", "; c\n[s]\nk=v\n", {{L"s", L"k", L"a longer value"}}},
        {"sorted, unchanged", sorted, {}},
        {"sorted, one value longer", sorted, {{L"s", L"key200", std::wstring(5000, L'x')}}},
        {"unsorted, unchanged", unsorted, {}},
        {"unsorted, with additions", unsorted, additions},
        {"malformed text", "[s\xC3]\n\xC1\x81=\x80xyz\n", {{L"s?", L"\xD800", L"v"}}},
    };
}

template <class Table>
void change(Table& table, Edit const& edit) {
    for (Setting const& s : edit.changes) table.setValue(s.section, s.key, s.value);
}

/// What the file holds after the edit is written.
std::string newBytes(Edit const& edit, unsigned long mode) {
    SettingsTableModel model;
    if ((mode & READ) != 0) model.settings = test::sortedSettings(edit.bytes);
    change(model, edit);
    test::sortSettings(model.settings);
    return test::settingsText(model.settings);
}

/// Calls attempt(edit, plan) with every allocation failing in turn, edit by edit.
template <class Attempt>
void forEachEditAndFailure(Attempt attempt) {
    Watchdog const watchdog;
    for (Edit const& edit : edits()) {
        CAPTURE(edit.label);
        forEachFailure([&](MemoryPlan const& plan) { return attempt(edit, plan); });
    }
}

/// Runs a write-back with each of its allocations failing in turn. The file on the disk is the old
/// or the new one after each, whole, also after `finish`, and the file object can still be used.
template <class WriteBack, class Finish>
void checkWriteBack(unsigned long mode, WriteBack writeBack, Finish finish) {
    CAPTURE(mode);
    Place const place;
    forEachEditAndFailure([&](Edit const& edit, MemoryPlan const& plan) {
        place.write(edit.bytes);
        InitializationFile file(place.path());
        file.open(mode);
        change(file, edit);
        std::string const old = place.bytes();
        std::string const complete = newBytes(edit, mode);
        auto const isOldOrNew = [&] { return place.bytes() == old || place.bytes() == complete; };
        std::string const outcome = runOutOfMemory(plan, [&] { writeBack(file); });
        REQUIRE(place.exists());
        CHECK(isOldOrNew());
        if (outcome == "done") CHECK(place.bytes() == complete);
        if (outcome != "done") CHECK(outcome == "std::bad_alloc");
        useFromAnotherThread(file);
        if (!memoryRanOut()) {
            CHECK(outcome == "done");
            return false;
        }
        CHECK(test::messageOf<std::exception>([&] { finish(file); }) == "<nothing>");
        REQUIRE(place.exists());
        CHECK(isOldOrNew());
        return true;
    });
}

} // namespace

TEST_CASE("when memory runs out in close, the old file or the new one is there, and whole") {
    auto const close = [](InitializationFile& file) { file.close(); };
    checkWriteBack(READ_WRITE, close, close);
    checkWriteBack(WRITE, close, close);
}

TEST_CASE("when memory runs out in synchronize, the old file or the new one is there, and whole") {
    // Where memory ran out while the file was read again, the table holds what was read so far. It
    // is the caller who keeps the file from being replaced by that.
    checkWriteBack(
        READ_WRITE, [](InitializationFile& file) { file.synchronize(); },
        [](InitializationFile& file) {
            file.setMode(READ);
            file.close();
        });
}

TEST_CASE("when memory runs out in the destructor, the process goes on and no file is cut") {
    Place const place;
    forEachEditAndFailure([&place](Edit const& edit, MemoryPlan const& plan) {
        place.write(edit.bytes);
        std::string const told = test::toldByChild([&] {
            auto file = std::make_unique<InitializationFile>(place.path());
            file->open(READ_WRITE);
            change(*file, edit);
            std::string const outcome = runOutOfMemory(plan, [&file] { file.reset(); });
            return outcome + (memoryRanOut() ? ", ran out" : "");
        });
        REQUIRE(place.exists());
        bool const isNew = place.bytes() == newBytes(edit, READ_WRITE);
        bool const isRight = isNew || (told == "done, ran out" && place.bytes() == edit.bytes);
        CHECK(isRight);
        if (told != "done") REQUIRE(told == "done, ran out");
        return told != "done";
    });
}

TEST_CASE("when memory runs out in open, a later open works") {
    Place const place;
    for (unsigned long const mode : {READ, READ_WRITE}) {
        CAPTURE(mode);
        forEachEditAndFailure([&](Edit const& edit, MemoryPlan const& plan) {
            place.write(edit.bytes);
            InitializationFile file(place.path());
            std::string const outcome = runOutOfMemory(plan, [&] { file.open(mode); });
            bool const ranOut = memoryRanOut();
            CHECK(place.bytes() == edit.bytes);
            useFromAnotherThread(file);
            if (outcome == "done") {
                CHECK(file.is_open());
                CHECK(file.getMode() == mode);
                file.setMode(READ);
            } else {
                CHECK(outcome == "std::bad_alloc");
                file.setMode(READ);
                drain(file); // whatever it is, it can be used
                file.close();
                file.open(READ);
            }
            checkSame(drain(file), test::sortedSettings(edit.bytes));
            return ranOut;
        });
    }
}

namespace {

/// Changes, and questions that must not change anything.
template <class Table>
std::vector<void (*)(Table&)> operations() {
    static std::wstring const longText(500, L'\u00E9');
    return {
        [](Table& table) { table.setValue(L"s", L"key0", longText); },
        [](Table& table) { table.setValue(L"s", L"key0", L""); },
        [](Table& table) { table.setValue(longText, longText, longText); },
        [](Table& table) { table.setValue(L"S", L"new", L"v"); },
        [](Table& table) { table.createKey(L"s", longText); },
        [](Table& table) { table.createKey(L"new", L"k"); },
        [](Table& table) { table.createSection(longText); },
        [](Table& table) { table.removeKey(L"s", L"KEY0"); },
        [](Table& table) { table.removeSection(L"S"); },
        [](Table& table) { static_cast<void>(table.enumerateSections()); },
        [](Table& table) { static_cast<void>(table.enumerateKeys(L"S")); },
        [](Table& table) { static_cast<void>(table.getValue(L"S", L"KEY0")); },
    };
}

/// All that can be asked of a table, its sections, their keys and their values.
template <class Table>
std::vector<std::wstring> snapshot(Table& table) {
    std::vector<std::wstring> all = table.enumerateSections();
    for (std::wstring const& section : table.enumerateSections()) {
        for (std::wstring const& key : table.enumerateKeys(section)) {
            all.push_back(section + L'/' + key + L'/' + table.getValue(section, key));
        }
    }
    return all;
}

} // namespace

TEST_CASE("when memory runs out in a change, it is made whole or not at all") {
    Watchdog const watchdog;
    Place const place;
    for (int const size : {0, 1, 7, 8, 16, 31, 32, 33, 64, 128, 300}) {
        std::string bytes = "[s]\n";
        for (int i = 0; i < size; ++i) bytes += "key" + std::to_string(i) + "=some value\n";
        place.write(bytes);
        for (std::size_t i = 0; i < operations<InitializationFile>().size(); ++i) {
            CAPTURE(size);
            CAPTURE(i);
            auto const operation = operations<InitializationFile>()[i];
            SettingsTableModel model;
            model.settings = test::sortedSettings(bytes);
            auto const before = snapshot(model);
            operations<SettingsTableModel>()[i](model);
            auto const after = snapshot(model);
            forEachFailure([&](MemoryPlan const& plan) {
                InitializationFile file(place.path());
                file.open(READ);
                std::string const outcome = runOutOfMemory(plan, [&] { operation(file); });
                bool const ranOut = memoryRanOut();
                useFromAnotherThread(file);
                if (outcome != "done") {
                    CHECK(outcome == "std::bad_alloc");
                    if (snapshot(file) == before) operation(file);
                }
                bool const isChanged = snapshot(file) == after;
                CHECK(isChanged);
                return ranOut;
            });
        }
    }
}

TEST_CASE("when memory runs out in the constructor, nothing is left") {
    Place const place;
    Koru::File::Path const path(place.path());
    forEachFailure([&path](MemoryPlan const& plan) {
        std::string const outcome =
            runOutOfMemory(plan, [&path] { InitializationFile const file(path); });
        CHECK(outcome == (memoryRanOut() ? "std::bad_alloc" : "done"));
        return memoryRanOut();
    });
    CHECK(!place.exists());
}
