// The record file compared with a plain model over many operations in a fixed random order.
#include <doctest/doctest.h>

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <map>
#include <random>
#include <stdexcept>
#include <string>
#include <vector>

#include <koru/datafile.h>

#include "records/recordfixture.h"
#include "support/throws.h"

using Koru::DataFile;
using test::Bytes;
using test::checkSame;
using test::checkSameRecords;
using test::Entries;
using test::Entry;
using test::fileBytes;
using test::held;
using test::isInOrderOfAddresses;
using test::messageOf;
using test::Place;
using test::READ;
using test::READ_WRITE;
using test::sameKey;
using Record = Koru::DataFile::Record;

namespace {

/// Numbers in the same order on every machine: the distributions of <random> may differ.
class Chance {
public:
    explicit Chance(std::uint32_t seed) : engine_(seed) {}
    std::size_t below(std::size_t limit) { return engine_() % limit; }
    bool oneIn(std::size_t n) { return below(n) == 0; }

private:
    std::mt19937 engine_;
};

/// A key of characters with every low byte, sometimes with high bits, blanks and NULs.
std::wstring randomKey(Chance& chance) {
    std::wstring key;
    std::size_t const length = chance.oneIn(20) ? chance.below(3000) : 1 + chance.below(4);
    static wchar_t const few[] = {L'a', L'A', L'b', L'B', L' ', L'\t', L'\n', L'\0', L'\u00E9'};
    while (key.size() < length) {
        if (!chance.oneIn(3)) {
            key += few[chance.below(sizeof few / sizeof *few)];
        } else {
            std::uint32_t const high = chance.oneIn(4) ? 0x100U << chance.below(24) : 0;
            key += static_cast<wchar_t>(high | static_cast<std::uint32_t>(chance.below(256)));
        }
    }
    return key;
}

Bytes randomData(Chance& chance, std::size_t most) {
    Bytes data(chance.oneIn(10) ? chance.below(most) : chance.below(30));
    std::uint32_t state = static_cast<std::uint32_t>(chance.below(1000)) + 1;
    for (unsigned char& byte : data) {
        state = state * 1664525U + 1013904223U;
        byte = static_cast<unsigned char>(state >> 24);
    }
    return data;
}

/// A record with a key that can be set, as it is stored.
Record randomRecord(Chance& chance, std::size_t mostData) {
    Record result;
    result.setData(randomData(chance, mostData));
    for (;;) {
        std::wstring const key = randomKey(chance);
        std::wstring stored;
        try {
            stored = test::storedKey(key);
        } catch (std::invalid_argument const&) {
            CHECK(messageOf<std::invalid_argument>([&] { result.setKey(key); }) ==
                  "zero length key");
            continue;
        }
        result.setKey(key);
        if (result.getKey() != stored) test::checkKey(result.getKey(), stored);
        return result;
    }
}

/// The records by their addresses: the order of positions.
class Model {
public:
    std::map<Record const*, Entry, std::less<>> records;

    std::map<Record const*, Entry, std::less<>>::iterator find(std::wstring const& key) {
        return std::find_if(records.begin(), records.end(),
                            [&](auto const& r) { return sameKey(r.second.key, key); });
    }
    Entries entries() const {
        Entries result;
        for (auto const& r : records) result.push_back(r.second);
        return result;
    }
    /// Takes over what the file holds after it was read.
    void adopt(DataFile& file) {
        records.clear();
        for (unsigned long i = 0; i < file.size(); ++i) {
            records.emplace(&file[i], test::entryOf(file[i]));
        }
    }
};

/// The one record of the file that the model does not know.
Record const* newcomer(DataFile& file, Model const& model) {
    Record const* found = nullptr;
    for (unsigned long i = 0; i < file.size(); ++i) {
        if (model.records.count(&file[i]) != 0) continue;
        CHECK(found == nullptr);
        found = &file[i];
    }
    return found;
}

/// Positions, addresses and content are the model's.
void compare(DataFile& file, Model const& model) {
    REQUIRE(file.size() == model.records.size());
    unsigned long i = 0;
    for (auto const& r : model.records) {
        if (&file[i] != r.first) CHECK(&file[i] == r.first);
        if (!(test::entryOf(file[i]) == r.second)) {
            checkSame({test::entryOf(file[i])}, {r.second});
        }
        ++i;
    }
}

void insert(DataFile& file, Model& model, Record const& record) {
    bool const isNew = model.find(record.getKey()) == model.records.end();
    file.insert(record);
    Record const* const added = newcomer(file, model);
    CHECK((added != nullptr) == isNew);
    if (added != nullptr) model.records.emplace(added, test::entryOf(record));
}

void remove(DataFile& file, Model& model, Record const& record) {
    auto const found = model.find(record.getKey());
    if (found != model.records.end()) model.records.erase(found);
    file.remove(record);
}

void changeOne(DataFile& file, Model& model, Chance& chance, Record const& record) {
    if (file.size() == 0) return;
    Record& changed = file[static_cast<unsigned long>(chance.below(file.size()))];
    changed.setKey(record.getKey());
    changed.setData(record.getData());
    model.records[&changed] = test::entryOf(record);
}

/// Writes and reads again; a key that does not come back ends the reading.
void synchronize(Place const& place, DataFile& file, Model& model) {
    std::string const content = fileBytes(model.entries());
    test::Loaded const expected = test::load(content);
    std::string const message = messageOf<std::exception>([&] { file.synchronize(); });
    CHECK((message == "<nothing>") == (expected.message == "<nothing>"));
    bool const same = place.bytes() == content;
    CHECK(same);
    model.adopt(file);
    checkSameRecords(held(file), expected.entries);
}

} // namespace

TEST_CASE("any sequence of operations gives what the model gives, position by position") {
    Place const place;
    for (std::uint32_t seed = 1; seed <= 30; ++seed) {
        CAPTURE(seed);
        Chance chance(seed);
        place.write("");
        DataFile file(place.path());
        file.open(READ_WRITE);
        Model model;
        for (int step = 0; step < 150; ++step) {
            CAPTURE(step);
            Record const record = randomRecord(chance, 20000);
            std::size_t const choice = chance.below(100);
            if (choice < 60) insert(file, model, record);
            if (choice >= 60 && choice < 75) remove(file, model, record);
            if (choice >= 75 && choice < 85) changeOne(file, model, chance, record);
            if (choice >= 85 && choice < 98 && !model.records.empty()) {
                auto const at = std::next(model.records.begin(),
                                          static_cast<long>(chance.below(model.records.size())));
                remove(file, model, Record(*at->first));
            }
            if (choice >= 98) synchronize(place, file, model);
            compare(file, model);
        }
        file.close();
        bool const same = place.bytes() == fileBytes(model.entries());
        CHECK(same);
    }
}

TEST_CASE("records that nobody looks at are inserted and removed as the model says") {
    Place const place;
    for (std::uint32_t seed = 100; seed < 110; ++seed) {
        CAPTURE(seed);
        Chance chance(seed);
        place.write("");
        DataFile file(place.path());
        file.open(READ_WRITE);
        Entries model; // no two with equal keys, so the order does not matter
        for (int step = 0; step < 1500; ++step) {
            Record const record = randomRecord(chance, 300);
            auto const found = std::find_if(model.begin(), model.end(), [&](Entry const& e) {
                return sameKey(e.key, record.getKey());
            });
            if (!chance.oneIn(3)) {
                file.insert(record);
                if (found == model.end()) model.push_back(test::entryOf(record));
            } else {
                file.remove(record);
                if (found != model.end()) model.erase(found);
            }
            if (file.size() != model.size()) REQUIRE(file.size() == model.size());
        }
        CHECK(model.size() > 100);
        file.setMode(Koru::File::WRITE);
        Entries const before = seed % 2 == 0 ? held(file) : Entries();
        file.close();
        std::string const content = place.bytes();
        if (seed % 2 == 0) {
            checkSameRecords(before, model);
            bool const same = content == fileBytes(before);
            CHECK(same);
        }
        CHECK(content.size() == fileBytes(model).size());
        // Each entry of the model is somewhere in the file.
        for (Entry const& e : model) {
            if (content.find(fileBytes(e)) == std::string::npos) checkSame({e}, {});
        }
    }
}

TEST_CASE("records of up to 1 MiB with keys of every low byte are written and read") {
    Place const place;
    for (std::uint32_t seed = 200; seed < 206; ++seed) {
        CAPTURE(seed);
        Chance chance(seed);
        DataFile file(place.path());
        file.open(Koru::File::WRITE);
        for (int i = 0; i < 25; ++i) file.insert(randomRecord(chance, (1U << 20) + 1));
        Entries const entries = held(file);
        file.close();
        std::string const content = place.bytes();
        bool const same = content == fileBytes(entries);
        CHECK(same);
        test::Loaded const expected = test::load(content);
        std::string const message = messageOf<std::exception>([&] { file.open(READ); });
        CHECK((message == "<nothing>") == (expected.message == "<nothing>"));
        checkSameRecords(held(file), expected.entries);
        CHECK(isInOrderOfAddresses(file));
    }
}

TEST_CASE("a file of any bytes is read as the model reads it") {
    Place const place;
    Chance chance(300);
    for (int round = 0; round < 1500; ++round) {
        CAPTURE(round);
        Entries entries;
        for (std::size_t i = chance.below(5); i > 0; --i) {
            entries.push_back({randomKey(chance), randomData(chance, 100)});
        }
        std::string content = fileBytes(entries);
        // Low bits, so that few lengths are beyond what memory there is.
        for (std::size_t i = chance.below(3); i > 0 && !content.empty(); --i) {
            char& byte = content[chance.below(content.size())];
            byte = static_cast<char>(byte ^ (1 << chance.below(2)));
        }
        if (chance.oneIn(4)) content.resize(chance.below(content.size() + 1));
        test::Loaded const expected = test::load(content);
        place.write(content);
        DataFile file(place.path());
        std::string message = messageOf<std::exception>([&] { file.open(READ); });
        std::size_t const typeEnd = message.find("> ");
        if (typeEnd != std::string::npos) message.erase(0, typeEnd + 2);
        CHECK(message == expected.message);
        checkSameRecords(held(file), expected.entries);
    }
}
