// The record file compared with a plain model over many operations in a fixed random order.
#include <doctest/doctest.h>

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <iterator>
#include <map>
#include <random>
#include <stdexcept>
#include <string>
#include <vector>

#include <koru/datafile.h>

#include "records/recordfixture.h"
#include "support/throws.h"

using namespace test;
using Koru::DataFile;
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

/// A record whose key was set, which is tried until one is not refused.
Record randomRecord(Chance& chance, std::size_t mostData) {
    Record result;
    result.setData(randomData(chance, mostData));
    while (result.getKey().empty()) {
        std::wstring const key = randomKey(chance);
        std::wstring stored;
        std::string const expected =
            messageOf<std::invalid_argument>([&] { stored = storedKey(key); });
        std::string const message = messageOf<std::invalid_argument>([&] { result.setKey(key); });
        if (message == expected && result.getKey() == stored) continue;
        CHECK(message == expected);
        checkKey(result.getKey(), stored);
    }
    return result;
}

/// A record file beside what it should hold: the records by their addresses, whose order is that of
/// the positions.
class Pair {
public:
    void insert(Record const& record) {
        bool const isNew = find(record.getKey()) == records_.end();
        file_.insert(record);
        int newcomers = 0;
        for (unsigned long i = 0; i < file_.size(); ++i) {
            if (records_.emplace(&file_[i], entryOf(record)).second) ++newcomers;
        }
        CHECK(newcomers == (isNew ? 1 : 0));
    }

    void remove(Record const& record) {
        auto const found = find(record.getKey());
        if (found != records_.end()) records_.erase(found);
        file_.remove(record);
    }

    void removeHeld(Chance& chance) {
        if (!records_.empty()) remove(Record(file_[anyPosition(chance)]));
    }

    void change(Chance& chance, Record const& record) {
        if (records_.empty()) return;
        Record& changed = file_[anyPosition(chance)];
        changed.setKey(record.getKey());
        changed.setData(record.getData());
        records_[&changed] = entryOf(record);
    }

    /// Writes and reads again; a key that does not come back ends the reading.
    void synchronize() {
        std::string const content = fileBytes(expected());
        Loaded const reloaded = load(content);
        std::string const message = messageOf<std::exception>([&] { file_.synchronize(); });
        CHECK((message == "<nothing>") == (reloaded.message == "<nothing>"));
        bool const same = file_.bytes() == content;
        CHECK(same);
        records_.clear();
        for (unsigned long i = 0; i < file_.size(); ++i) {
            records_.emplace(&file_[i], entryOf(file_[i]));
        }
        checkSameRecords(held(file_), reloaded.entries);
    }

    /// Positions, addresses and content are as expected.
    void compare() {
        REQUIRE(file_.size() == records_.size());
        unsigned long i = 0;
        for (auto const& r : records_) {
            Record const& actual = file_[i++];
            if (&actual != r.first) CHECK(&actual == r.first);
            if (!(entryOf(actual) == r.second)) checkSame({entryOf(actual)}, {r.second});
        }
    }

    void close() {
        file_.close();
        bool const same = file_.bytes() == fileBytes(expected());
        CHECK(same);
    }

private:
    using Held = std::map<Record const*, Entry, std::less<>>;

    Held::iterator find(std::wstring const& key) {
        return std::find_if(records_.begin(), records_.end(),
                            [&](auto const& r) { return sameKey(r.second.key, key); });
    }
    unsigned long anyPosition(Chance& chance) {
        return static_cast<unsigned long>(chance.below(records_.size()));
    }
    Entries expected() const {
        Entries result;
        for (auto const& r : records_) result.push_back(r.second);
        return result;
    }

    OwnDataFile file_{READ_WRITE};
    Held records_;
};

} // namespace

TEST_CASE("any sequence of operations gives what the model gives, position by position") {
    for (std::uint32_t seed = 1; seed <= 30; ++seed) {
        CAPTURE(seed);
        Chance chance(seed);
        Pair pair;
        for (int step = 0; step < 150; ++step) {
            CAPTURE(step);
            Record const record = randomRecord(chance, 20000);
            std::size_t const choice = chance.below(100);
            if (choice < 60) pair.insert(record);
            if (choice >= 60 && choice < 75) pair.remove(record);
            if (choice >= 75 && choice < 85) pair.change(chance, record);
            if (choice >= 85 && choice < 98) pair.removeHeld(chance);
            if (choice >= 98) pair.synchronize();
            pair.compare();
        }
        pair.close();
    }
}

TEST_CASE("records that nobody looks at are inserted and removed as the model says") {
    for (std::uint32_t seed = 100; seed < 110; ++seed) {
        CAPTURE(seed);
        Chance chance(seed);
        OwnDataFile file(WRITE);
        Entries model; // no two with equal keys, so the order does not matter
        for (int step = 0; step < 1500; ++step) {
            Record const record = randomRecord(chance, 300);
            auto const found = std::find_if(model.begin(), model.end(), [&](Entry const& e) {
                return sameKey(e.key, record.getKey());
            });
            if (!chance.oneIn(3)) {
                file.insert(record);
                if (found == model.end()) model.push_back(entryOf(record));
            } else {
                file.remove(record);
                if (found != model.end()) model.erase(found);
            }
            if (file.size() != model.size()) REQUIRE(file.size() == model.size());
        }
        CHECK(model.size() > 100);
        if (seed % 2 == 0) checkSameRecords(held(file), model);
        file.close();
        std::string const content = file.bytes();
        CHECK(content.size() == fileBytes(model).size());
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
        Entries entries;
        for (int i = 0; i < 25; ++i) {
            entries.push_back(entryOf(randomRecord(chance, (1U << 20) + 1)));
        }
        CHECK(writeAndRead(place, entries) > 15);
    }
}

TEST_CASE("a file of any bytes is read as the model reads it") {
    Chance chance(300);
    std::vector<std::string> contents;
    for (int round = 0; round < 1500; ++round) {
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
        contents.push_back(content);
    }
    checkFaultless(contents);
}
