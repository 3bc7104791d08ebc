// The life cycle that the three structured files share: opened, loaded, changed, written back
// whole.
#include <doctest/doctest.h>

#include <sys/stat.h>

#include <filesystem>
#include <fstream>
#include <memory>
#include <string>
#include <thread>
#include <type_traits>
#include <utility>
#include <vector>

#include "structured/fixture.h"
#include "support/slots.h"
#include "support/subprocess.h"

using namespace structured;

FAMILIES_TEST_CASE("a structured file is a file, a stream and not copyable") {
    using File = typename Family::File;
    static_assert(std::is_base_of<Koru::File, File>::value, "");
    static_assert(std::is_convertible<File*, std::fstream*>::value, "");
    // Only a base that is not virtual can be cast down.
    static_assert(
        std::is_same<decltype(static_cast<File*>(std::declval<Koru::File*>())), File*>::value, "");
    static_assert(std::is_constructible<File, Koru::File::Path const&>::value, "");
    static_assert(!std::is_copy_constructible<File>::value, "");
    static_assert(!std::is_copy_assignable<File>::value, "");
    static_assert(std::has_virtual_destructor<File>::value, "");
    static_assert(std::is_nothrow_destructible<File>::value, "");
    OwnFile<Family> const file("", WRITE);
    std::fstream const& stream = file;
    CHECK(stream.is_open());
}

SETTINGS_TEST_CASE("the published line length is the largest of a 32-bit unsigned long") {
    using File = typename Family::File;
    static_assert(std::is_same<decltype(File::MAX_LINE_LENGTH), unsigned long const>::value, "");
    static_assert(File::MAX_LINE_LENGTH == 4294967295UL, "");
    unsigned long const& length = File::MAX_LINE_LENGTH; // it has an address
    CHECK(length == 4294967295UL);
}

FAMILIES_TEST_CASE(
    "the virtual operations keep their order after the two entries of the destructor") {
    using File = typename Family::File;
    CHECK(slotOfOpen<File>() == 2);
    CHECK(slotOf(&File::close) == 3);
    CHECK(slotOf(&File::synchronize) == 4);
    CHECK(slotOf(&File::getMode) == 5);
    CHECK(slotOf(&File::setMode) == 6);
    std::size_t slot = 7;
    for (std::size_t const own : Family::ownSlots()) CHECK(own == slot++);
}

FAMILIES_TEST_CASE("a new object is closed, has mode 0, no entries and the path's name") {
    OwnFile<Family> file;
    CHECK(file.isClosedAndEmpty());
    CHECK(file.good());
    CHECK((file.getName() == wide(file.place.path())));
    CHECK(Family::value(file, 0).empty());
    CHECK(!file.place.exists());
    typename Family::File nameless;
    CHECK(!nameless.is_open());
    CHECK(nameless.getMode() == 0);
    CHECK(nameless.getName().empty());
    CHECK(sizeOf<Family>(nameless) == 0);
}

FAMILIES_TEST_CASE("opening a missing file fails for reading and creates it for writing") {
    OwnFile<Family> file;
    CHECK(complaint([&] { file.open(READ); }) == NOT_OPENED);
    CHECK(!file.is_open());
    CHECK(!file.place.exists());
    file.open(READ_WRITE);
    CHECK(file.is_open());
    CHECK(file.bytes() == "");
    file.close();
    CHECK(file.bytes() == "");
    std::filesystem::remove(file.place.path());
    file.open(WRITE);
    CHECK(file.bytes() == "");
}

FAMILIES_TEST_CASE("a mode without reading and writing is refused") {
    OwnFile<Family> file("anything");
    for (unsigned long const mode : {0UL, 4UL, 0UL + Koru::File::BINARY}) {
        CHECK(complaint([&] { file.open(mode); }) == NOT_OPENED);
        CHECK(file.isClosedAndEmpty());
    }
    CHECK(file.bytes() == "anything");
}

FAMILIES_TEST_CASE("an open that fails leaves the entries as they were") {
    OwnFile<Family> file;
    file.put(0);
    CHECK(complaint([&] { file.open(READ); }) == NOT_OPENED);
    CHECK(file.has(1));
    CHECK(file.getMode() == 0);
    typename Family::File nameless;
    Family::set(nameless, 0);
    CHECK(complaint([&] { nameless.open(READ_WRITE); }) == NOT_OPENED);
    CHECK(holds<Family>(nameless, 0, 1));
}

FAMILIES_TEST_CASE("open discards what was held") {
    OwnFile<Family> file(one<Family>());
    file.put(5);
    file.open(READ_WRITE);
    CHECK(file.has(1));
    file.close();
    CHECK(file.bytes() == one<Family>());
    file.put(5);
    file.open(WRITE);
    CHECK(file.count() == 0);
    file.close();
    CHECK(file.bytes() == "");
}

FAMILIES_TEST_CASE("the operations work on an object that was never opened") {
    typename Family::File file;
    Family::set(file, 0);
    Family::add(file, 1);
    Family::remove(file, 0);
    Family::set(file, 1, "changed");
    CHECK(holds<Family>(file, 1, 2, "changed"));
    CHECK(file.good());
}

FAMILIES_TEST_CASE("changes without the write bit vanish at close and the file stays untouched") {
    OwnFile<Family> file(Family::untidyBytes());
    auto const time = std::filesystem::last_write_time(file.place.path());
    file.open(READ);
    file.put(0, "changed");
    file.put(1);
    CHECK(complaint([&] { file.close(); }) == NOTHING);
    CHECK(file.isClosedAndEmpty());
    {
        typename Family::File other(file.place.path());
        other.open(READ);
        CHECK(holds<Family>(other, 0, 1));
        Family::add(other, 1); // which vanishes with the destructor
    }
    CHECK(file.bytes() == Family::untidyBytes());
    CHECK(std::filesystem::last_write_time(file.place.path()) == time);
}

FAMILIES_TEST_CASE("a file open for writing is rewritten at close, changed or not") {
    OwnFile<Family> file(Family::untidyBytes());
    for (int i = 0; i < 2; ++i) {
        file.open(READ_WRITE);
        file.close();
        CHECK(file.isClosedAndEmpty());
        CHECK(file.bytes() == one<Family>());
    }
}

FAMILIES_TEST_CASE("opening for writing alone begins empty and replaces the whole file") {
    OwnFile<Family> file(Family::bytes(5, 9), WRITE);
    CHECK(file.count() == 0);
    CHECK(file.bytes() == "");
    file.put(0);
    CHECK(file.bytes() == "");
    file.close();
    CHECK(file.bytes() == one<Family>());
    CHECK(file.isClosedAndEmpty());
    file.open(WRITE);
    file.close();
    CHECK(file.bytes() == "");
}

FAMILIES_TEST_CASE("the mode keeps the bits without a meaning") {
    OwnFile<Family> file;
    for (unsigned long const mode :
         {WRITE, READ_WRITE, READ, READ_WRITE | 0x40UL, READ_WRITE | Koru::File::BINARY}) {
        CAPTURE(mode);
        file.open(mode);
        CHECK(file.isOpen(mode));
        file.put(0);
        file.synchronize();
        CHECK(file.isOpen(mode));
        if ((mode & READ_WRITE) == READ_WRITE) CHECK(file.has(1));
        file.close();
        CHECK(file.isClosedAndEmpty());
    }
    CHECK(file.bytes() == one<Family>());
}

FAMILIES_TEST_CASE("a file may be opened and closed again and again") {
    OwnFile<Family> file;
    for (int i = 0; i < 20; ++i) {
        file.open(READ_WRITE);
        CHECK(file.has(i));
        file.put(i);
        file.close();
    }
    CHECK(isWhole<Family>(file.bytes(), 0, 20));
}

FAMILIES_TEST_CASE("closing or destroying an object that was never opened touches no file") {
    Place const place;
    {
        typename Family::File file(place.path());
        Family::set(file, 0);
        file.synchronize(); // which leaves a closed file and what it holds as they are
        CHECK(holds<Family>(file, 0, 1));
        CHECK(complaint([&] { file.close(); }) == NOTHING);
        CHECK(sizeOf<Family>(file) == 0);
        CHECK(file.getMode() == 0);
        CHECK(file.fail());
        // The destructor destroys these, which the address sanitizer would tell.
        for (int i = 0; i < 200; ++i) Family::set(file, i, std::string(1000, 'x'));
    }
    CHECK(!place.exists());
    {
        typename Family::File file(place.path());
        CHECK(complaint([&] { file.open(READ); }) == NOT_OPENED);
        Family::set(file, 0);
        place.write("old");
    }
    CHECK(place.bytes() == "old");
    typename Family::File nameless;
    Family::set(nameless, 0);
    nameless.synchronize();
    CHECK(holds<Family>(nameless, 0, 1));
    CHECK(complaint([&] { nameless.close(); }) == NOTHING);
    CHECK(sizeOf<Family>(nameless) == 0);
}

FAMILIES_TEST_CASE("closing twice is harmless") {
    OwnFile<Family> file("", READ_WRITE);
    file.put(0);
    file.close();
    file.put(1);
    CHECK(complaint([&] { file.close(); }) == NOTHING);
    CHECK(file.isClosedAndEmpty());
    CHECK(file.bytes() == one<Family>());
}

FAMILIES_TEST_CASE("the destructor writes a file that is open for writing") {
    using File = typename Family::File;
    Place const place;
    auto const destroyed = [&](unsigned long mode, std::string const& value) {
        auto* const file = new File(place.path());
        std::unique_ptr<std::iostream> stream(file);
        file->open(mode);
        Family::set(*file, 0, value);
        stream.reset();
        return place.bytes();
    };
    CHECK(destroyed(WRITE, "first") == one<Family>("first"));
    CHECK(destroyed(READ_WRITE, "second") == one<Family>("second"));
    CHECK(destroyed(READ, "third") == one<Family>("second"));
    { // Not one that was closed, whatever it holds.
        File file(place.path());
        file.open(READ_WRITE);
        file.close();
        Family::set(file, 5);
    }
    CHECK(place.bytes() == one<Family>("second"));
    std::unique_ptr<Koru::File> file(new File(place.path()));
    file->open(READ_WRITE);
    place.write("");
    file.reset();
    CHECK(place.bytes() == one<Family>("second"));
}

FAMILIES_TEST_CASE("the destructor closes a settings file always, a record file when it is open") {
    Place const place;
    place.write("old");
    {
        typename Family::File file(place.path());
        file.setMode(WRITE);
        Family::set(file, 0);
    }
    CHECK(place.bytes() == (Family::CLOSES_ALWAYS ? one<Family>() : "old"));
}

namespace {

/// A structured file whose overrides note the calls.
template <class File>
class Recorder : public File {
public:
    Recorder(std::string const& path, std::string& calls)
        : File(Koru::File::Path(path)), calls_(calls) {}
    void open(unsigned long mode) override {
        calls_ += "open " + std::to_string(mode) + "; ";
        File::open(mode);
    }
    void close() override {
        calls_ += "close; ";
        File::close();
    }

private:
    std::string& calls_;
};

} // namespace

FAMILIES_TEST_CASE(
    "synchronize reaches overrides, and the destructor calls the class's own close") {
    Place const place;
    std::string calls;
    std::string const all =
        "open 3; close; open " + std::to_string(READ_WRITE | Family::ADDED_MODE) + "; ";
    {
        Recorder<typename Family::File> file(place.path(), calls);
        file.synchronize();
        CHECK(calls == "");
        static_cast<Koru::File&>(file).open(READ_WRITE);
        Family::set(file, 0);
        file.synchronize();
        CHECK(calls == all);
        CHECK(place.bytes() == one<Family>());
        Family::set(file, 0, "changed");
    }
    CHECK(calls == all);
    CHECK(place.bytes() == one<Family>("changed"));
}

FAMILIES_TEST_CASE("synchronize writes back and reads again") {
    OwnFile<Family> file(Family::untidyBytes(), READ_WRITE);
    file.put(1);
    file.synchronize();
    CHECK(file.isOpen(READ_WRITE));
    CHECK(file.has(2));
    CHECK(isWhole<Family>(file.bytes(), 0, 2));
}

FAMILIES_TEST_CASE(
    "synchronize of a file open for reading drops changes and reads what is there now") {
    OwnFile<Family> file(one<Family>(), READ);
    file.put(0, "mine");
    file.put(1);
    file.place.write(one<Family>("there now"));
    file.synchronize();
    CHECK(file.has(1, "there now"));
    CHECK(file.isOpen(READ));
    CHECK(file.bytes() == one<Family>("there now"));
}

FAMILIES_TEST_CASE("synchronize of a file open for writing alone leaves it and the memory empty") {
    // Intended: reopening for writing empties the file that was just written.
    OwnFile<Family> file("", WRITE);
    file.put(1);
    file.synchronize();
    CHECK(file.isOpen(WRITE));
    CHECK(file.count() == 0);
    CHECK(file.bytes() == "");
    file.put(0);
    file.close();
    CHECK(file.bytes() == one<Family>());
}

FAMILIES_TEST_CASE("setMode decides what the next close does") {
    OwnFile<Family> file(Family::untidyBytes());
    SUBCASE("writing allowed later") {
        file.open(READ);
        file.put(0, "new");
        file.setMode(READ_WRITE);
        file.synchronize();
        CHECK(file.bytes() == one<Family>("new"));
        CHECK(file.isOpen(READ_WRITE));
        CHECK(file.has(1, "new"));
    }
    SUBCASE("writing no longer allowed") {
        file.open(READ_WRITE);
        file.put(0, "new");
        file.setMode(READ);
        file.synchronize();
        CHECK(file.isOpen(READ));
        CHECK(file.has(1));
        file.close();
        CHECK(file.bytes() == Family::untidyBytes());
    }
    SUBCASE("writing alone") {
        file.open(READ);
        file.setMode(WRITE);
        file.close();
        CHECK(file.bytes() == one<Family>());
    }
    SUBCASE("neither") {
        file.open(READ_WRITE);
        file.put(0, "new");
        file.setMode(0);
        CHECK(complaint([&] { file.synchronize(); }) == NOT_OPENED);
        CHECK(!file.is_open());
        CHECK(file.bytes() == Family::untidyBytes());
    }
    SUBCASE("writing, without the file ever opened") {
        file.setMode(READ_WRITE);
        file.put(0, "new");
        file.close();
        CHECK(file.bytes() == one<Family>("new"));
        CHECK(file.isClosedAndEmpty());
    }
}

FAMILIES_TEST_CASE("opening an open file reads it again and changes the mode, but not the stream") {
    OwnFile<Family> file(one<Family>());
    SUBCASE("to read again") {
        file.open(READ_WRITE);
        file.put(1);
        file.open(READ);
        CHECK(file.isOpen(READ));
        CHECK(file.rdstate() == std::ios::eofbit);
        CHECK(file.has(1));
        file.put(1);
        file.close();
        CHECK(file.bytes() == one<Family>());
    }
    SUBCASE("to read again from the start, wherever the caller left the stream") {
        file.open(READ);
        file.clear();
        file.seekg(3);
        file.open(READ);
        CHECK(file.has(1));
    }
    SUBCASE("to read what the caller wrote through the stream") {
        file.open(READ_WRITE);
        file.clear();
        file.seekp(0, std::ios::end);
        std::string const more = Family::bytes(1, 2);
        file.write(more.data(), static_cast<std::streamsize>(more.size()));
        file.open(READ_WRITE);
        CHECK(file.has(2));
    }
    SUBCASE("to write") {
        file.open(READ);
        file.open(WRITE);
        CHECK(file.isOpen(WRITE));
        CHECK(file.count() == 0);
        CHECK(file.bytes() == one<Family>()); // not emptied: it was not opened again
        file.put(0, "new");
        file.close();
        CHECK(file.bytes() == one<Family>("new"));
    }
    SUBCASE("to read what was opened for writing alone") {
        file.open(WRITE);
        file.put(1);
        // Intended: as if the file were empty.
        CHECK(complaint([&] { file.open(READ); }) == NOTHING);
        CHECK(file.count() == 0);
        file.close();
        CHECK(file.bytes() == "");
    }
    SUBCASE("with no mode at all") {
        file.open(READ_WRITE);
        file.open(0);
        CHECK(file.isOpen(0));
        CHECK(file.count() == 0);
        file.close();
        CHECK(file.bytes() == one<Family>());
    }
}

FAMILIES_TEST_CASE("open leaves the stream at the end of the file, where it can be used") {
    for (std::string const& bytes : {Family::bytes(0, 2), Family::untidyBytes(), std::string()}) {
        for (unsigned long const mode : {READ, READ_WRITE}) {
            CAPTURE(bytes.size());
            CAPTURE(mode);
            OwnFile<Family> file(bytes, mode);
            CHECK(file.rdstate() == std::ios::eofbit);
            file.clear();
            CHECK(file.tellg() == std::streampos(static_cast<std::streamoff>(bytes.size())));
            file.seekg(0);
            std::string content(bytes.size(), ' ');
            CHECK(bool(file.read(&content[0], static_cast<std::streamsize>(content.size()))));
            CHECK(content == bytes);
        }
    }
    OwnFile<Family> file("", WRITE);
    CHECK(file.good());
    file.write("direct", 6).flush();
    CHECK(file.bytes() == "direct");
    file.close();
    CHECK(file.bytes() == "");
}

FAMILIES_TEST_CASE("open and close clear what went wrong with the stream before") {
    OwnFile<Family> file;
    CHECK(complaint([&] { file.open(READ); }) == NOT_OPENED);
    CHECK(file.fail());
    file.open(WRITE);
    for (std::ios::iostate const state :
         {std::ios::failbit, std::ios::badbit, std::ios::failbit | std::ios::badbit}) {
        CAPTURE(state);
        file.put(0, "first");
        file.setstate(state);
        CHECK(complaint([&] { file.close(); }) == NOTHING);
        CHECK(file.bytes() == one<Family>("first"));
        file.setstate(state);
        file.open(READ_WRITE);
        CHECK(file.rdstate() == std::ios::eofbit);
        CHECK(file.has(1, "first"));
        file.put(0, "second");
        file.setstate(state);
        file.synchronize();
        CHECK(file.bytes() == one<Family>("second"));
        CHECK(file.has(1, "second"));
    }
}

FAMILIES_TEST_CASE("the stream's formatting does not show in the file") {
    OwnFile<Family> file(Family::untidyBytes());
    file.width(30);
    file.fill('*');
    file.setf(std::ios::left | std::ios::unitbuf | std::ios::showbase);
    file.unsetf(std::ios::skipws);
    file.open(READ_WRITE);
    CHECK(file.has(1));
    file.width(30);
    file.close();
    CHECK(file.bytes() == one<Family>());
}

FAMILIES_TEST_CASE("close deletes the old file and writes another in its place") {
    OwnFile<Family> file(one<Family>("old"));
    std::string const path = file.place.path();
    std::string const other = file.place.directory() / "other";
    mode_t const mask = ::umask(022);
    auto const replace = [&](auto meanwhile) {
        file.open(READ_WRITE);
        CHECK(file.has(1, "old"));
        file.put(0, "new");
        meanwhile();
        file.close();
        CHECK(file.bytes() == one<Family>("new"));
    };
    SUBCASE("another name of the old file keeps the old content") {
        std::filesystem::create_hard_link(path, other);
        replace([] {});
        CHECK(readFile(other) == one<Family>("old"));
    }
    SUBCASE("a link is replaced, not what it leads to") {
        std::filesystem::rename(path, other);
        std::filesystem::create_symlink(other, path);
        replace([] {});
        CHECK(!std::filesystem::is_symlink(path));
        CHECK(readFile(other) == one<Family>("old"));
    }
    SUBCASE("the new file has a new file's permissions") {
        CHECK(::chmod(path.c_str(), 0600) == 0);
        replace([] {});
        struct stat status = {};
        CHECK(::stat(path.c_str(), &status) == 0);
        CHECK((status.st_mode & 0777U) == 0644U);
    }
    SUBCASE("a file that was deleted meanwhile comes back") {
        replace([&] { std::filesystem::remove(path); });
    }
    SUBCASE("what another wrote meanwhile is lost") {
        replace([&] { file.place.write(std::string(10000, 'x')); });
    }
    SUBCASE("an empty directory in its place is deleted too") {
        replace([&] {
            std::filesystem::remove(path);
            std::filesystem::create_directory(path);
        });
    }
    ::umask(mask);
}

FAMILIES_TEST_CASE("a pipe is read to its end") {
    OwnFile<Family> file;
    REQUIRE(::mkfifo(file.place.path().c_str(), 0600) == 0);
    CHECK(toldByChild([&] {
              std::thread writer([&] { writeFile(file.place.path(), Family::bytes(0, 10000)); });
              file.open(READ);
              writer.join();
              return file.has(10000) ? "all of it" : "something else";
          }) == "all of it");
    CHECK(std::filesystem::is_fifo(file.place.path()));
}

SETTINGS_TEST_CASE("results are copies that later changes do not touch") {
    OwnFile<Family> file(Family::bytes(0, 2), READ_WRITE);
    std::vector<std::wstring> const keys = Family::keys(file);
    std::wstring const value = Family::value(file, 0);
    file.put(0, "changed");
    file.drop(1);
    file.synchronize();
    file.close();
    CHECK((keys == std::vector<std::wstring>{entryKey(0), entryKey(1)}));
    CHECK((value == L"value"));
    CHECK(file.bytes() == one<Family>("changed"));
}
