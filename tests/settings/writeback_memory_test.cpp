// The sectioned settings file when memory runs out.
#include <doctest/doctest.h>

#include <cstddef>
#include <memory>
#include <stdexcept>
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include <koru/initializationfile.h>

#include "support/failingmemory.h"
#include "support/settingsfixture.h"
#include "support/settingsmodel.h"
#include "support/subprocess.h"
#include "support/throws.h"

using Koru::InitializationFile;
using test::drain;
using test::Failing;
using test::memoryRanOut;
using test::READ;
using test::READ_WRITE;
using test::runOutOfMemory;
using test::Setting;
using test::Settings;
using test::SettingsPlace;
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

/// What the file holds after the edit is written.
std::string newBytes(Edit const& edit, unsigned long mode) {
    SettingsTableModel model;
    if ((mode & READ) != 0) model.settings = test::parseSettings(edit.bytes);
    test::sortSettings(model.settings);
    for (Setting const& s : edit.changes) model.setValue(s.section, s.key, s.value);
    test::sortSettings(model.settings);
    return test::settingsText(model.settings);
}

void openAndEdit(InitializationFile& file, unsigned long mode, Edit const& edit) {
    file.open(mode);
    for (Setting const& s : edit.changes) file.setValue(s.section, s.key, s.value);
}

/// Runs a write-back with each of its allocations failing in turn. The file on the disk is the old
/// or the new one after each, whole, also after `finish`, and the file object can still be used.
template <class WriteBack, class Finish>
void checkWriteBack(std::vector<unsigned long> const& modes, WriteBack writeBack, Finish finish) {
    Watchdog const watchdog;
    SettingsPlace const place;
    for (Edit const& edit : edits()) {
        for (unsigned long const mode : modes) {
            for (Failing const failing : {Failing::ONE, Failing::ONE_AND_ALL_LATER}) {
                std::string const complete = newBytes(edit, mode);
                for (long before = 0;; ++before) {
                    CAPTURE(edit.label);
                    CAPTURE(mode);
                    CAPTURE(failing == Failing::ONE);
                    CAPTURE(before);
                    place.write(edit.bytes);
                    InitializationFile file(place.path());
                    openAndEdit(file, mode, edit);
                    std::string const old = place.bytes();
                    std::string const outcome =
                        runOutOfMemory(before, failing, [&] { writeBack(file); });
                    REQUIRE(place.exists());
                    bool const oldOrNew = place.bytes() == old || place.bytes() == complete;
                    CHECK(oldOrNew);
                    if (outcome == "done") {
                        CHECK(place.bytes() == complete);
                    } else {
                        CHECK(outcome == "std::bad_alloc");
                    }
                    useFromAnotherThread(file);
                    if (!memoryRanOut()) break;
                    CHECK(test::messageOf<std::exception>([&] { finish(file); }) == "<nothing>");
                    bool const stillOldOrNew =
                        place.exists() && (place.bytes() == old || place.bytes() == complete);
                    CHECK(stillOldOrNew);
                    CHECK(before < 100000);
                }
            }
        }
    }
}

} // namespace

TEST_CASE("when memory runs out in close, the old file or the new one is there, and whole") {
    auto const close = [](InitializationFile& file) { file.close(); };
    checkWriteBack({READ_WRITE, WRITE}, close, close);
}

TEST_CASE("when memory runs out in synchronize, the old file or the new one is there, and whole") {
    // Where memory ran out while the file was read again, the table holds what was read so far. It
    // is the caller who keeps the file from being replaced by that.
    checkWriteBack(
        {READ_WRITE}, [](InitializationFile& file) { file.synchronize(); },
        [](InitializationFile& file) {
            file.setMode(READ);
            file.close();
        });
}

TEST_CASE("when memory runs out in the destructor, the process goes on and no file is cut") {
    SettingsPlace const place;
    for (Edit const& edit : edits()) {
        for (Failing const failing : {Failing::ONE, Failing::ONE_AND_ALL_LATER}) {
            std::string const complete = newBytes(edit, READ_WRITE);
            for (long before = 0;; ++before) {
                CAPTURE(edit.label);
                CAPTURE(failing == Failing::ONE);
                CAPTURE(before);
                place.write(edit.bytes);
                test::Outcome const outcome = test::inChild([&] {
                    ::alarm(60);
                    std::unique_ptr<InitializationFile> file(new InitializationFile(place.path()));
                    openAndEdit(*file, READ_WRITE, edit);
                    if (runOutOfMemory(before, failing, [&] { file.reset(); }) != "done") return 1;
                    return memoryRanOut() ? 42 : 43;
                });
                CHECK(outcome.signal == 0);
                REQUIRE(place.exists());
                bool const oldOrNew = place.bytes() == edit.bytes || place.bytes() == complete;
                CHECK(oldOrNew);
                if (outcome.exitCode == 43) {
                    CHECK(place.bytes() == complete);
                    break;
                }
                REQUIRE(outcome.exitCode == 42);
            }
        }
    }
}

TEST_CASE("when memory runs out in open, a later open works") {
    Watchdog const watchdog;
    SettingsPlace const place;
    for (Edit const& edit : edits()) {
        Settings expected = test::parseSettings(edit.bytes);
        test::sortSettings(expected);
        for (unsigned long const mode : {READ, READ_WRITE}) {
            for (Failing const failing : {Failing::ONE, Failing::ONE_AND_ALL_LATER}) {
                for (long before = 0;; ++before) {
                    CAPTURE(edit.label);
                    CAPTURE(mode);
                    CAPTURE(failing == Failing::ONE);
                    CAPTURE(before);
                    place.write(edit.bytes);
                    InitializationFile file(place.path());
                    std::string const outcome =
                        runOutOfMemory(before, failing, [&] { file.open(mode); });
                    CHECK(place.bytes() == edit.bytes);
                    useFromAnotherThread(file);
                    if (outcome == "done") {
                        CHECK(file.is_open());
                        CHECK(file.getMode() == mode);
                    } else {
                        CHECK(outcome == "std::bad_alloc");
                        file.setMode(READ);
                        drain(file); // whatever it is, it can be used
                        file.close();
                        file.open(READ);
                    }
                    bool const ranOut = memoryRanOut();
                    file.setMode(READ);
                    checkSame(drain(file), expected);
                    if (!ranOut) break;
                    CHECK(before < 100000);
                }
            }
        }
    }
}

namespace {

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

template <class Table>
void runOperation(std::size_t operation, Table& table) {
    std::wstring const longText(500, L'\u00E9');
    switch (operation) {
    case 0:
        return table.setValue(L"s", L"key0", longText);
    case 1:
        return table.setValue(L"s", L"key0", L"");
    case 2:
        return table.setValue(longText, longText, longText);
    case 3:
        return table.setValue(L"S", L"new", L"v");
    case 4:
        return table.createKey(L"s", longText);
    case 5:
        return table.createKey(L"new", L"k");
    case 6:
        return table.createSection(longText);
    case 7:
        return table.removeKey(L"s", L"KEY0");
    case 8:
        return table.removeSection(L"S");
    case 9:
        static_cast<void>(table.enumerateSections());
        return;
    case 10:
        static_cast<void>(table.enumerateKeys(L"S"));
        return;
    default:
        static_cast<void>(table.getValue(L"S", L"KEY0"));
    }
}

std::size_t const OPERATIONS = 12;

} // namespace

TEST_CASE("when memory runs out in a change, it is made whole or not at all") {
    Watchdog const watchdog;
    SettingsPlace const place;
    for (int const size : {0, 1, 7, 8, 16, 31, 32, 33, 64, 128, 300}) {
        std::string bytes = "[s]\n";
        for (int i = 0; i < size; ++i) bytes += "key" + std::to_string(i) + "=some value\n";
        place.write(bytes);
        for (std::size_t operation = 0; operation < OPERATIONS; ++operation) {
            CAPTURE(size);
            CAPTURE(operation);
            SettingsTableModel model;
            model.settings = test::parseSettings(bytes);
            test::sortSettings(model.settings);
            std::vector<std::wstring> const before = snapshot(model);
            runOperation(operation, model);
            std::vector<std::wstring> const after = snapshot(model);
            for (long allocations = 0;; ++allocations) {
                CAPTURE(allocations);
                InitializationFile file(place.path());
                file.open(READ);
                std::string const outcome = runOutOfMemory(allocations, Failing::ONE,
                                                           [&] { runOperation(operation, file); });
                bool const ranOut = memoryRanOut();
                useFromAnotherThread(file);
                if (outcome == "done") {
                    CHECK((snapshot(file) == after));
                } else {
                    CHECK(outcome == "std::bad_alloc");
                    bool const whole = snapshot(file) == before || snapshot(file) == after;
                    CHECK(whole);
                    if (snapshot(file) == before) runOperation(operation, file);
                    CHECK((snapshot(file) == after));
                }
                if (!ranOut) break;
                CHECK(allocations < 100000);
            }
        }
    }
}

TEST_CASE("when memory runs out in the constructor, nothing is left behind") {
    SettingsPlace const place;
    Koru::File::Path const path(place.path());
    for (long before = 0;; ++before) {
        std::string const outcome =
            runOutOfMemory(before, Failing::ONE, [&] { InitializationFile const file(path); });
        CHECK(outcome == (memoryRanOut() ? "std::bad_alloc" : "done"));
        if (!memoryRanOut()) break;
    }
    CHECK(!place.exists());
}
