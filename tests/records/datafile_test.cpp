// The record file: the record, the positions, insert and remove, and what sets it apart from the
// other structured files, which tests/structured compares. datafile_format_test.cpp has the file's
// format, datafile_model_test.cpp a plain model, datafile_memory_test.cpp memory that runs out.
#include <doctest/doctest.h>

#include <locale.h>

#include <algorithm>
#include <climits>
#include <clocale>
#include <cstddef>
#include <filesystem>
#include <set>
#include <stdexcept>
#include <string>
#include <thread>
#include <type_traits>
#include <utility>
#include <vector>

#include <koru/datafile.h>

#include "records/recordfixture.h"
#include "support/shown.h"
#include "support/skip.h"
#include "support/slots.h"
#include "support/throws.h"

using namespace test;
using Koru::DataFile;
using Koru::File;
using Record = Koru::DataFile::Record;
using namespace std::string_literals;

namespace {

template <class Callable>
std::string complaintAboutKey(Callable callable) {
    return messageOf<std::invalid_argument>(callable);
}

bool isNoPosition(DataFile& file, unsigned long index) {
    return messageOf<std::out_of_range>([&] { file[index]; }) == "object does not exist";
}

std::wstring numbered(int i) { return L"key " + std::to_wstring(i); }

Entries numberedEntries(int count) {
    Entries entries;
    for (int i = 0; i < count; ++i) entries.push_back(entry(numbered(i), std::to_string(i)));
    return entries;
}

void insertNumbered(DataFile& file, int count) { insertAll(file, numberedEntries(count)); }

} // namespace

TEST_CASE("size and positions have the types of the interface") {
    using Size = decltype(std::declval<DataFile const&>().size());
    static_assert(std::is_same<Size, unsigned long>::value, "");
    static_assert(std::is_same<decltype(std::declval<DataFile&>()[0UL]), Record&>::value, "");
}

TEST_CASE("a record is a plain value of key and data with a table of virtual operations") {
    using Key = decltype(std::declval<Record const&>().getKey());
    using Data = decltype(std::declval<Record const&>().getData());
    static_assert(std::is_default_constructible<Record>::value, "");
    static_assert(std::is_copy_constructible<Record>::value, "");
    static_assert(std::is_copy_assignable<Record>::value, "");
    static_assert(std::is_polymorphic<Record>::value, "");
    static_assert(std::has_virtual_destructor<Record>::value, "");
    static_assert(std::is_same<Key, std::wstring const&>::value, "");
    static_assert(std::is_same<Data, Bytes const&>::value, "");
    std::size_t const parts = sizeof(void*) + sizeof(std::wstring) + sizeof(Bytes);
    CHECK(sizeof(Record) == parts);
}

TEST_CASE("the operations of a record keep their order after the two entries of the destructor") {
    CHECK(slotOf(&Record::getKey) == 2);
    CHECK(slotOf(&Record::setKey) == 3);
    CHECK(slotOf(&Record::getData) == 4);
    CHECK(slotOf(&Record::setData) == 5);
}

TEST_CASE("setKey trims blanks, tabs and line feeds, unless there is nothing else") {
    struct Row {
        char const* label;
        std::wstring key;
        std::wstring stored;
    };
    for (Row const& row : std::vector<Row>{
             {"nothing to trim", L"Name", L"Name"},
             {"both ends", L"  Name\t\n", L"Name"},
             {"all three in front", L" \t\nName", L"Name"},
             {"all three at the end", L"Name \t\n \t\n", L"Name"},
             {"inside stays", L" a \t\n b ", L"a \t\n b"},
             {"three spaces stay", L"   ", L"   "},
             {"one of each stays", L"\n\t ", L"\n\t "},
             {"one line feed stays", L"\n", L"\n"},
             {"carriage return at the end", L"Name\r", L"Name\r"},
             {"carriage return shields blanks", L" Name \r", L"Name \r"},
             {"carriage return in front", L"\r Name", L"\r Name"},
             {"only a carriage return", L"\r", L"\r"},
             {"other white space", L"\v\fName\v\f", L"\v\fName\v\f"},
             {"wide white space", L"\u00A0\u3000Name\u2003", L"\u00A0\u3000Name\u2003"},
             {"one character", L" x ", L"x"},
             {"NUL inside", L" a\0b "s, L"a\0b"s},
             {"NUL at the end shields blanks", L"a \0"s, L"a \0"s},
             {"blanks after a NUL", L"a\0  "s, L"a\0"s},
         }) {
        CAPTURE(row.label);
        Record changed;
        changed.setKey(row.key);
        checkKey(changed.getKey(), row.stored);
        checkSame({entryOf(record(row.key, "data"))}, {entry(row.stored, "data")});
    }
}

TEST_CASE("a key that is empty or begins with NUL is refused and changes nothing") {
    for (std::wstring const& key :
         {L""s, L"\0"s, L"\0a"s, L" \t\0"s, L"\n\0 "s, L"  \0a  "s, L"\0\0"s}) {
        CAPTURE(shown(key));
        CHECK(complaintAboutKey([&] { Record const made(key, bytes("x")); }) == NO_KEY);
        for (Record changed : {record(L"before", "data"), Record()}) {
            Entry const before = entryOf(changed);
            CHECK(complaintAboutKey([&] { changed.setKey(key); }) == NO_KEY);
            checkSame({entryOf(changed)}, {before});
        }
    }
}

TEST_CASE("every key of up to five characters is trimmed or refused as the plain rule says") {
    std::size_t const count = 1 + 7 + 49 + 343 + 2401 + 16807;
    std::vector<std::wstring> keys{L""};
    for (std::size_t i = 0; keys.size() < count; ++i) {
        for (wchar_t const c : L" \t\n\ra\0\u3000"s) keys.push_back(keys[i] + c);
    }
    CHECK(keys.size() == count);
    for (std::wstring const& key : keys) {
        std::wstring stored = L"before";
        Record changed(stored, {});
        std::string const expected = complaintAboutKey([&] { stored = storedKey(key); });
        std::string const message = complaintAboutKey([&] { changed.setKey(key); });
        if (message == expected && changed.getKey() == stored) continue;
        CAPTURE(shown(key));
        REQUIRE(message == expected);
        checkKey(changed.getKey(), stored);
    }
}

TEST_CASE("a record may be given its own key and data") {
    Record r(L"key", bytes("data"));
    r.setKey(r.getKey());
    r.setData(r.getData());
    Record const& itself = r;
    r = itself;
    checkSame({entryOf(r)}, {entry(L"key", "data")});
}

TEST_CASE("a default record is empty and unchecked, and data is stored as it is") {
    Record r;
    checkSame({entryOf(r)}, {entry(L"")});
    Bytes all;
    for (int i = 0; i < 256; ++i) all.push_back(static_cast<unsigned char>(i));
    for (Bytes const& data : {all, Bytes()}) {
        r.setData(data);
        checkSame({entryOf(r)}, {{L"", data}});
    }
}

TEST_CASE("getKey and getData refer to what the record stores") {
    Record r(L"first", bytes("one"));
    std::wstring const& key = r.getKey();
    Bytes const& data = r.getData();
    CHECK(&key == &r.getKey());
    CHECK(&data == &r.getData());
    r.setKey(L"second");
    r.setData(bytes("two"));
    checkSame({{key, data}}, {entry(L"second", "two")});
}

TEST_CASE("records are copied member by member, without checks, and apart from then on") {
    Record const empty;
    Record assigned(L"key", bytes("data"));
    assigned = empty;
    checkSame({entryOf(Record(empty)), entryOf(assigned)}, {entry(L""), entry(L"")});
    Record const original(L"key", bytes("data"));
    Record apart(original);
    apart.setKey(L"other");
    apart.setData({});
    checkSame({entryOf(original)}, {entry(L"key", "data")});
}

TEST_CASE("positions follow the addresses of the records, whatever was done before") {
    for (int const count : {0, 1, 2, 63, 64, 65, 127, 128, 129, 500, 2000}) {
        CAPTURE(count);
        OwnDataFile file(fileBytes(numberedEntries(count)), READ_WRITE);
        CHECK(isInOrderOfAddresses(file));
        for (int i = 0; i < count; i += 3) file.remove(record(numbered(i)));
        CHECK(isInOrderOfAddresses(file));
        for (int i = 0; i < count; i += 6) file.insert(record(numbered(i)));
        CHECK(isInOrderOfAddresses(file));
        for (int i = 0; i < 300; ++i) file.insert(record(L"new " + std::to_wstring(i)));
        CHECK(isInOrderOfAddresses(file));
        for (int i = 299; i >= 0; i -= 2) file.remove(record(L"new " + std::to_wstring(i)));
        CHECK(isInOrderOfAddresses(file));
        Entries const entries = held(file);
        file.synchronize();
        CHECK(isInOrderOfAddresses(file));
        checkSameRecords(held(file), entries);
    }
}

TEST_CASE("a record stays where it is until it is removed, whatever happens to others") {
    DataFile file;
    std::vector<Record*> records;
    std::set<Record*> places;
    for (int i = 0; i < 1000; ++i) {
        file.insert(record(numbered(i), std::to_string(i)));
        for (unsigned long at = 0; at < file.size(); ++at) {
            if (places.insert(&file[at]).second) records.push_back(&file[at]);
        }
        REQUIRE(records.size() == static_cast<std::size_t>(i) + 1);
    }
    for (int i = 0; i < 1000; i += 2) file.remove(record(numbered(i)));
    for (int i = 0; i < 500; ++i) file.insert(record(L"other" + std::to_wstring(i)));
    Entries kept;
    Entries expected;
    for (std::size_t i = 1; i < records.size(); i += 2) {
        kept.push_back(entryOf(*records[i]));
        expected.push_back(entry(numbered(static_cast<int>(i)), std::to_string(i)));
    }
    checkSame(kept, expected);
    CHECK(file.size() == 1000UL);
    CHECK(isInOrderOfAddresses(file));
}

TEST_CASE("records are written in the order of their positions") {
    OwnDataFile file(WRITE);
    insertNumbered(file, 300);
    for (int i = 0; i < 300; i += 4) file.remove(record(numbered(i)));
    for (int i = 0; i < 300; i += 8) file.insert(record(numbered(i), "again"));
    Entries const entries = held(file);
    file.close();
    checkSame(load(file.bytes()).entries, entries);
}

TEST_CASE("a position after the last is refused") {
    OwnDataFile file;
    for (unsigned long const index : {0UL, 1UL, ULONG_MAX}) CHECK(isNoPosition(file, index));
    file.open(WRITE);
    CHECK(isNoPosition(file, 0));
    for (unsigned long count = 1; count <= 200; ++count) {
        file.insert(record(numbered(static_cast<int>(count))));
        CHECK(file.size() == count);
        CHECK(!isNoPosition(file, count - 1));
        for (unsigned long const index : {count, count + 1, 0xFFFFFFFFUL, ULONG_MAX}) {
            CHECK(isNoPosition(file, index));
        }
        CHECK(file.size() == count);
    }
    CHECK(isFree(file));
}

TEST_CASE("a record with an equal key is not inserted, and the one held stays as it is") {
    DataFile file;
    file.insert(record(L"name", "first"));
    // The last is equal up to its NUL.
    for (std::wstring const& key :
         {L"name"s, L"NAME"s, L"Name"s, L"nAmE"s, L" name\n"s, L"name\0else"s}) {
        file.insert(record(key, "second"));
        checkSame(held(file), {entry(L"name", "first")});
    }
    for (wchar_t const* const key : {L"na", L"names", L"name.", L"\u00F1ame"}) {
        file.insert(record(key));
    }
    CHECK(file.size() == 5UL);
}

TEST_CASE("keys count up to their first NUL where they are compared, and in full where written") {
    OwnDataFile file(READ_WRITE);
    file.insert(record(L"a\0b"s, "first"));
    file.insert(record(L"A", "second"));
    file.insert(record(L"a\0c"s, "third"));
    CHECK(file.size() == 1UL);
    file.synchronize();
    checkSame(held(file), {entry(L"a\0b"s, "first")});
    file.remove(record(L"A\0"s));
    CHECK(file.size() == 0UL);
}

TEST_CASE("insert copies the record as it is") {
    DataFile file;
    Record r(L"key", bytes("data"));
    file.insert(r);
    r.setKey(L"other");
    r.setData({});
    checkSame(held(file), {entry(L"key", "data")});
}

TEST_CASE("a default record can be inserted once, and removed") {
    DataFile file;
    file.insert(Record());
    file.insert(Record());
    checkSame(held(file), {entry(L"")});
    file.insert(record(L" "));
    CHECK(file.size() == 2UL);
    file.remove(Record());
    checkSame(held(file), {entry(L" ")});
}

TEST_CASE("remove removes the first record of an equal key, and nothing without one") {
    Entries stored;
    for (int i = 0; i < 10; ++i) {
        stored.push_back(entry(i % 2 == 0 ? L"Name" : L"nAME", std::to_string(i)));
        stored.push_back(entry(L"other " + std::to_wstring(i)));
    }
    OwnDataFile file(fileBytes(stored), READ);
    Entries expected = held(file);
    REQUIRE(expected.size() == 20);
    for (int i = 0; i < 12; ++i) {
        auto const first = std::find_if(expected.begin(), expected.end(),
                                        [](Entry const& e) { return sameKey(e.key, L"name"); });
        if (first != expected.end()) expected.erase(first);
        file.remove(record(L"NAME"));
        checkSame(held(file), expected);
    }
    CHECK(file.size() == 10UL);
    file.remove(record(L"nothing"));
    file.remove(Record());
    CHECK(file.size() == 10UL);
}

TEST_CASE("a held record may itself be the argument") {
    DataFile file;
    insertNumbered(file, 100);
    for (unsigned long i = 0; i < 100; ++i) file.insert(file[i]);
    CHECK(file.size() == 100UL);
    for (unsigned long left = 100; left > 0; --left) {
        std::wstring const key = file[left / 2].getKey();
        file.remove(file[left / 2]);
        REQUIRE(file.size() == left - 1);
        for (Entry const& e : held(file)) CHECK(e.key != key);
    }
}

TEST_CASE("changes through a reference are changes of the record held") {
    OwnDataFile file(READ_WRITE);
    file.insert(record(L"key", "data"));
    file[0].setKey(L"  new ");
    file[0].setData(bytes("new data"));
    CHECK(complaintAboutKey([&] { file[0].setKey(L""); }) == NO_KEY);
    file.synchronize();
    checkSame(held(file), {entry(L"new", "new data")});
    file[0] = record(L"assigned", "as a whole");
    file.close();
    CHECK(file.bytes() == fileBytes(entry(L"assigned", "as a whole")));
}

namespace {

struct Step {
    void (DataFile::*change)(Record const&);
    std::wstring key;
    long difference; ///< what it makes of the size
};

/// Takes one step after the other and checks the size after each.
void checkSteps(DataFile& file, std::vector<Step> const& steps) {
    auto size = static_cast<long>(file.size());
    for (Step const& step : steps) {
        CAPTURE(shown(step.key));
        (file.*step.change)(record(step.key));
        size += step.difference;
        CHECK(file.size() == static_cast<unsigned long>(size));
    }
}

auto const INSERT = &DataFile::insert;
auto const REMOVE = &DataFile::remove;

} // namespace

TEST_CASE("a record is found under the key that it has now") {
    for (int const others : {0, 1, 31, 32, 33, 64, 200}) {
        for (int const position : {0, others / 2, others}) {
            CAPTURE(others);
            CAPTURE(position);
            DataFile file;
            insertNumbered(file, others + 1);
            Record& changed = file[static_cast<unsigned long>(position)];
            std::wstring const before = changed.getKey();
            changed.setKey(L"changed");
            checkSteps(file, {{INSERT, L"CHANGED", 0},
                              {INSERT, before, 1},
                              {REMOVE, before, -1},
                              {REMOVE, before, 0}});
            checkKey(changed.getKey(), L"changed");
            checkSteps(file, {{REMOVE, L"Changed", -1}, {REMOVE, L"Changed", 0}});
        }
    }
}

TEST_CASE("a key changed long after the reference was given is found all the same") {
    DataFile file;
    insertNumbered(file, 100);
    Record& kept = file[50];
    std::wstring const before = kept.getKey();
    for (int round = 0; round < 3; ++round) {
        for (int i = 0; i < 100; ++i) {
            if (numbered(i) != before) file.remove(record(numbered(i)));
        }
        for (int i = 1000; i < 3000; ++i) file.insert(record(numbered(i)));
        for (int i = 1000; i < 3000; i += 1 + round) file.remove(record(numbered(i)));
    }
    kept.setKey(L"at last");
    checkSteps(file, {{INSERT, L"AT LAST", 0}, {INSERT, before, 1}});
    kept.setKey(L"once more");
    checkSteps(file, {{REMOVE, L"at last", 0}, {REMOVE, L"once MORE", -1}});
}

TEST_CASE("a key changed through a reference is not compared with others") {
    DataFile file;
    file.insert(record(L"a", "1"));
    file.insert(record(L"b", "2"));
    file[0].setKey(L"same");
    file[1].setKey(L"SAME");
    Entries const entries = held(file);
    CHECK(entries.size() == 2);
    file.remove(record(L"Same"));
    checkSame(held(file), {entries[1]});
}

TEST_CASE("the data held may be large while records come and go") {
    DataFile file;
    for (int i = 0; i < 50; ++i) {
        file.insert(record(numbered(i), std::string(100000, static_cast<char>('0' + i))));
        if (i >= 10) file.remove(record(numbered(i - 10)));
    }
    CHECK(file.size() == 10UL);
    for (Entry const& e : held(file)) CHECK(e.data.size() == 100000U);
}

namespace {

/// A record that gives another key than the one it stores.
class Alias : public Record {
public:
    Alias(std::wstring const& key, std::wstring const& alias) : Record(key, {}), alias_(alias) {}
    std::wstring const& getKey() const override { return alias_; }

private:
    std::wstring alias_;
};

/// A record whose key needs the file, or cannot be had.
class Curious : public Record {
public:
    explicit Curious(DataFile& file) : Record(L"curious", {}), file_(file) {}
    std::wstring const& getKey() const override {
        if (file_.size() == 0) throw std::domain_error("no key");
        return Record::getKey();
    }

private:
    DataFile& file_;
};

} // namespace

TEST_CASE("insert and remove ask the argument for its key, and copy what it stores") {
    DataFile file;
    file.insert(record(L"held"));
    file.insert(Alias(L"held", L"other")); // not equal as "other"
    checkSame(held(file), {entry(L"held"), entry(L"held")});
    file.insert(Alias(L"new", L"HELD")); // equal as "held"
    CHECK(file.size() == 2UL);
    file.remove(Alias(L"held", L"other"));
    CHECK(file.size() == 2UL);
    file.remove(Alias(L"other", L"Held"));
    CHECK(file.size() == 1UL);
}

TEST_CASE("an argument's key may come from the file itself or not at all") {
    DataFile file;
    CHECK(messageOf<std::domain_error>([&] { file.remove(Curious(file)); }) == "no key");
    CHECK(messageOf<std::domain_error>([&] { file.insert(Curious(file)); }) == "no key");
    CHECK(isFree(file));
    CHECK(file.size() == 0UL);
    file.insert(record(L"k"));
    file.insert(Curious(file));
    CHECK(file.size() == 2UL);
    file.remove(Curious(file));
    CHECK(file.size() == 1UL);
    CHECK(isFree(file));
}

TEST_CASE("keys are compared under the C locale of the moment") {
    if (std::setlocale(LC_ALL, "C.UTF-8") == nullptr) {
        test::skipped("there is no locale C.UTF-8");
        return;
    }
    std::setlocale(LC_ALL, "C");
    DataFile file;
    checkSteps(file, {{INSERT, L"\u00C9t\u00E9", 1},
                      {INSERT, L"\u00E9T\u00E9", 1}, // no letters of one case in this locale
                      {REMOVE, L"\u00E9T\u00C9", 0}});
    std::setlocale(LC_ALL, "C.UTF-8");
    checkSteps(file, {{INSERT, L"\u00C9T\u00C9", 0},
                      {REMOVE, L"\u00E9t\u00E9", -1},
                      {INSERT, L"kelvin", 1},
                      {INSERT, L"\u212AELVIN", 0}}); // whose small letter is k
    std::setlocale(LC_ALL, "C");
    checkSteps(file, {{INSERT, L"\u212AELVIN", 1}, {REMOVE, L"\u00C9T\u00C9", 0}});

    // A thread's own locale counts, too.
    ::locale_t const own = ::newlocale(LC_ALL_MASK, "C.UTF-8", nullptr);
    REQUIRE(own != nullptr);
    ::locale_t const before = ::uselocale(own);
    file.remove(record(L"\u00E9t\u00E9"));
    ::uselocale(before);
    ::freelocale(own);
    CHECK(file.size() == 2UL);
}

TEST_CASE("of many records the equal one is found, and only that") {
    int const count = 20000;
    auto const each = [](wchar_t const* prefix, int end, int step) {
        std::vector<Record> records;
        for (int i = 0; i < end; i += step) records.push_back(record(prefix + std::to_wstring(i)));
        return records;
    };
    OwnDataFile file(fileBytes(numberedEntries(count)), READ);
    CHECK(file.size() == static_cast<unsigned long>(count));
    for (Record const& r : each(L"KEY ", count, 7)) file.insert(r);
    CHECK(file.size() == static_cast<unsigned long>(count));
    for (int round = 0; round < 2; ++round) {
        for (Record const& r : each(L"kEY ", 500 * 37, 37)) file.remove(r);
        for (Record const& r : each(L"none ", 500, 1)) file.remove(r);
        CHECK(file.size() == static_cast<unsigned long>(count - 500));
    }
    for (Record const& r : each(L"new ", 500, 1)) file.insert(r);
    CHECK(file.size() == static_cast<unsigned long>(count));
}

TEST_CASE("an exception of the record file's own leaves the lock free") {
    OwnDataFile file(READ_WRITE);
    CHECK(isNoPosition(file, 0));
    CHECK(isFree(file));
    file.insert(Record());
    CHECK(complaintAboutKey([&] { file.synchronize(); }) == NO_KEY);
    CHECK(isFree(file));
    CHECK(complaintAboutKey([&] { file.open(READ_WRITE); }) == NO_KEY);
    CHECK(isFree(file));
    std::filesystem::remove(file.place.path());
    std::filesystem::create_directories(file.place.path() + "/content");
    CHECK(messageOf<std::runtime_error>([&] { file.close(); }) == "failed to open file.");
    CHECK(isFree(file));
}

TEST_CASE("a key that several threads insert at once is held once") {
    DataFile file;
    std::vector<std::thread> threads;
    for (int t = 0; t < 3; ++t) threads.emplace_back([&] { insertNumbered(file, 100); });
    for (std::thread& thread : threads) thread.join();
    checkSameRecords(held(file), numberedEntries(100));
}
