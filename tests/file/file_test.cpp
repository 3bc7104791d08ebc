// The file base class: its shape, opening and closing, reopening and destruction.
#include <koru/datafile.h>
#include <koru/event.h>
#include <koru/file.h>
#include <koru/initializationfile.h>
#include <koru/logfile.h>
#include <koru/mutex.h>
#include <koru/propertyfile.h>
#include <koru/string.h>

#include <pthread.h>
#include <unistd.h>

#include <atomic>
#include <cstddef>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <memory>
#include <stdexcept>
#include <string>
#include <thread>
#include <type_traits>
#include <utility>
#include <vector>

#include <doctest/doctest.h>

#include "file/filefixture.h"
#include "support/cancellation.h"
#include "support/holder.h"
#include "support/script.h"
#include "support/slots.h"
#include "support/subprocess.h"

using Koru::DataFile;
using Koru::File;
using Koru::InitializationFile;
using Koru::LogFile;
using Koru::PropertyFile;
using test::slotOf;
using test::slotOfOpen;
using namespace test;

namespace {

using Strings = std::vector<std::string>;
using State = std::ios_base::iostate;

unsigned long const MODES[] = {READ, WRITE, UPDATE, 0};

/// The states that a stream may be in.
State const STATES[] = {GOOD, FAIL, BAD, END, FAIL | BAD | END};

std::string const CLOSED = "closed, mode 0";

/// Whether the file is open, its mode and the state of its stream. Nobody may hold its lock.
std::string shown(File& file) {
    CHECK(isFree(file));
    char const* const state = file.rdstate() == GOOD   ? "good"
                              : file.rdstate() == FAIL ? "fail"
                                                       : "";
    return (file.is_open() ? "open, mode " : "closed, mode ") + std::to_string(file.getMode()) +
           ", " + state;
}

test::Words<OnFile> const WORDS = {
    {"read", [](OnFile& on) { on.file.open(READ); }},
    {"write", [](OnFile& on) { on.file.open(WRITE); }},
    {"update", [](OnFile& on) { on.file.open(UPDATE); }},
    {"close", [](OnFile& on) { on.file.close(); }},
    {"synchronize", [](OnFile& on) { on.file.synchronize(); }},
    {"not-read", [](OnFile& on) { CHECK(complaint([&] { on.file.open(READ); }) == NOT_OPENED); }},
    {"not-synchronize",
     [](OnFile& on) { CHECK(complaint([&] { on.file.synchronize(); }) == NOT_OPENED); }},
    {"put", [](OnFile& on) { on.file << "content"; }},
    {"put-NEW", [](OnFile& on) { on.file << "NEW"; }},
    {"mode-write", [](OnFile& on) { on.file.setMode(WRITE); }},
    {"mode-binary", [](OnFile& on) { on.file.setMode(BINARY); }},
    // What others do:
    {"store", [](OnFile& on) { on.store("content"); }},
    {"store-new", [](OnFile& on) { on.store("new"); }},
    {"delete", [](OnFile& on) { std::filesystem::remove(on.path); }},
};

/// What a script makes of the object and of the file on the disk.
std::string after(OnFile& on, std::string const& script) {
    follow(on, WORDS, script);
    return shown(on.file) + (isThere(on.path) ? ": " + on.stored() : ", no file");
}

/// A file whose overrides note the calls and whether the lock was held meanwhile.
class Recorder : public File {
public:
    using File::File;
    void open(unsigned long mode) override {
        note("open " + std::to_string(mode), "open");
        File::open(mode);
    }
    void close() override {
        note("close in mode " + std::to_string(getMode()), "close");
        File::close();
    }

    Strings calls;
    std::string failing;

private:
    void note(std::string call, std::string const& function) {
        contenders_.push_back(std::make_unique<Contender>(*this));
        if (!contenders_.back()->waits()) call += " without the lock";
        calls.push_back(call);
        if (failing == function) throw std::logic_error(function);
    }
    // They end when the lock is released, which is after the call.
    std::vector<std::unique_ptr<Contender>> contenders_;
};

template <class Object, class Mode, class = void>
struct OpensWith : std::false_type {};

template <class Object, class Mode>
struct OpensWith<Object, Mode, decltype(std::declval<Object&>().open(std::declval<Mode>()), void())>
    : std::true_type {};

struct OnRecorder : OnContent {
    Recorder recorder{dir.wide("a")};
};

} // namespace

TEST_CASE("the mode bits are integral constants that can be combined") {
    static_assert(File::READ == 0x00000001UL, "");
    static_assert(File::WRITE == 0x00000002UL, "");
    static_assert(File::BINARY == 0x80000000UL, "");
    static_assert((File::READ | File::WRITE | File::BINARY) == 0x80000003UL, "");
    static_assert(std::is_same<decltype(File::READ), unsigned long const>::value, "");
    static_assert(std::is_same<decltype(File::READ | File::BINARY), unsigned long>::value, "");

    // They are objects as well: a reference to one links.
    unsigned long const* const bits[] = {&File::READ, &File::WRITE, &File::BINARY};
    CHECK((*bits[0] | *bits[1] | *bits[2]) == 0x80000003UL);
}

TEST_CASE_FIXTURE(OnFile,
                  "a file is a narrow stream for reading and writing, and cannot be copied") {
    static_assert(std::is_base_of<std::fstream, File>::value, "");
    static_assert(std::is_convertible<File*, std::fstream*>::value, "");
    static_assert(std::is_convertible<File&, std::istream&>::value, "");
    static_assert(std::is_convertible<File&, std::ostream&>::value, "");
    static_assert(std::has_virtual_destructor<File>::value, "");
    static_assert(!std::is_copy_constructible<File>::value, "");
    static_assert(!std::is_copy_assignable<File>::value, "");

    file.open(UPDATE);
    std::fstream& stream = file;
    stream << "17 and " << 4 << std::flush;
    stream.seekg(0);
    int number = 0;
    stream >> number;
    CHECK(number == 17);
    CHECK(stored() == "17 and 4");
}

TEST_CASE("a file is the stream, the name, the mode and the lock, in this order") {
    // The stream's virtual base comes last, so the members take its place and move it up.
    std::size_t const members = sizeof(std::wstring) + sizeof(unsigned long) + sizeof(Koru::Mutex);
    CHECK(sizeof(File) == sizeof(std::fstream) + members);
    static_assert(sizeof(Koru::Mutex) == sizeof(pthread_mutex_t), "");

    auto const offsetOfBase = [](std::fstream& stream, void* whole) {
        return reinterpret_cast<char*>(static_cast<std::ios*>(&stream)) - static_cast<char*>(whole);
    };
    std::fstream stream;
    File file(L"the name");
    std::ptrdiff_t const begin = offsetOfBase(stream, &stream);
    CHECK(offsetOfBase(file, &file) == begin + static_cast<std::ptrdiff_t>(members));

    char* const name = reinterpret_cast<char*>(&file) + begin;
    CHECK((*reinterpret_cast<std::wstring*>(name) == L"the name"));
    char* const mode = name + sizeof(std::wstring);
    file.setMode(0x12345678UL);
    CHECK(*reinterpret_cast<unsigned long*>(mode) == 0x12345678UL);
    auto* const lock = reinterpret_cast<Koru::Mutex*>(mode + sizeof(unsigned long));
    CHECK(!lock->isLocked());
    Holder const holder(file);
    CHECK(lock->isLocked());
}

TEST_CASE_TEMPLATE("the virtual functions of a file are in the order of the published table",
                   Object, File, InitializationFile) {
    // The destructor, which is the stream's, takes the first two places.
    CHECK(slotOfOpen<Object>() == 2);
    CHECK(slotOf(static_cast<void (Object::*)()>(&Object::close)) == 3);
    CHECK(slotOf(&Object::synchronize) == 4);
    CHECK(slotOf(&Object::getMode) == 5);
    CHECK(slotOf(&Object::setMode) == 6);
    static_assert(std::is_same<decltype(&Object::synchronize), decltype(&File::synchronize)>::value,
                  "inherited, not overridden");
}

TEST_CASE("the virtual functions of an initialization file follow those of the file") {
    CHECK(slotOf(&InitializationFile::enumerateSections) == 7);
    CHECK(slotOf(&InitializationFile::createSection) == 8);
    CHECK(slotOf(&InitializationFile::removeSection) == 9);
    CHECK(slotOf(&InitializationFile::enumerateKeys) == 10);
    CHECK(slotOf(&InitializationFile::createKey) == 11);
    CHECK(slotOf(&InitializationFile::removeKey) == 12);
    CHECK(slotOf(&InitializationFile::getValue) == 13);
    CHECK(slotOf(&InitializationFile::setValue) == 14);
}

TEST_CASE_TEMPLATE("a path converts to the file that is there", Object, DataFile,
                   InitializationFile, PropertyFile, LogFile) {
    static_assert(std::is_convertible<File::Path, Object>::value, "");
    auto const nameOf = [](Object const& object) { return object.getName(); };
    CHECK(nameOf(File::Path("/folder/name")) == L"/folder/name");
}

TEST_CASE("a name converts to a file, a flag to an event") {
    static_assert(std::is_convertible<std::wstring, File>::value, "");
    static_assert(std::is_convertible<bool, Koru::Event>::value, "");
    auto const nameOf = [](File const& file) { return file.getName(); };
    CHECK(nameOf(std::wstring(L"name")) == L"name");
}

TEST_CASE_TEMPLATE("the open modes of a stream do not pass for a file's modes", Object, File,
                   DataFile, InitializationFile, PropertyFile) {
    static_assert(!OpensWith<Object, std::ios_base::openmode>::value, "");
    static_assert(!OpensWith<Object, decltype(std::ios::in | std::ios::out)>::value, "");
    static_assert(OpensWith<Object, unsigned long>::value, "");
    static_assert(OpensWith<Object, unsigned int>::value && OpensWith<Object, int>::value, "");
    static_assert(OpensWith<Object, decltype(File::READ)>::value, "");
}

TEST_CASE("a log keeps the one signature that it has") {
    static_assert(std::is_same<decltype(&LogFile::open), void (LogFile::*)(unsigned int)>::value,
                  "");
}

TEST_CASE("the mode is an unsigned long in place and size") {
    struct Layout : std::fstream {
        std::wstring name;
        unsigned long mode;
        Koru::Mutex lock;
    };
    CHECK(sizeof(File) == sizeof(Layout));
    static_assert(sizeof(std::atomic<unsigned long>) == sizeof(unsigned long), "");
    static_assert(alignof(std::atomic<unsigned long>) == alignof(unsigned long), "");
}

TEST_CASE_FIXTURE(OnContent, "the mode and the name may be asked for and the mode set while a file "
                             "is opened") {
    PropertyFile shared(path);
    std::atomic<bool> done{false};
    std::thread other([&] {
        unsigned long seen = 0;
        while (!done) {
            seen |= shared.getMode();
            if (shared.getName().empty()) seen |= 0x100;
            shared.setMode(READ);
        }
        CHECK((seen & ~READ) == 0);
    });
    for (int i = 0; i < 200; ++i) {
        shared.open(READ);
        shared.close();
    }
    done = true;
    other.join();
}

TEST_CASE_FIXTURE(OnFile, "a new file is closed, in mode 0 and in a good state") {
    File nameless;
    CHECK(nameless.getName() == L"");
    CHECK(file.getName() == dir.wide("a"));
    for (File* const each : {&nameless, &file}) {
        CHECK(shown(*each) == CLOSED + ", good");
        CHECK(each->exceptions() == GOOD);
    }
    CHECK(!isThere(path));
}

TEST_CASE("the name is kept verbatim") {
    for (std::wstring const& name :
         {std::wstring(L""), std::wstring(L"relative.txt"), std::wstring(L"//a/./..//b/"),
          std::wstring(L"C:\\back\\slash"), std::wstring(L" blank "), std::wstring(L"/a\0b", 4),
          std::wstring(L"\u20AC\U0001F600"),
          std::wstring{static_cast<wchar_t>(0x80000041U), static_cast<wchar_t>(0xD800)}}) {
        CHECK((File(name).getName() == name));
    }
}

TEST_CASE("getName gives a copy") {
    static_assert(
        std::is_same<decltype(std::declval<File const&>().getName()), std::wstring>::value, "");
    File const file(L"/a/b");
    file.getName() += L"c";
    CHECK(file.getName() == L"/a/b");
}

TEST_CASE("a file is made of a path") {
    File::Path path(L"//a\\b");
    path.setVolume(L"C:");
    CHECK(File(path).getName() == L"C:/a/b");
}

TEST_CASE_FIXTURE(OnContent, "setMode stores the mode and nothing else") {
    for (unsigned long const mode : {READ, WRITE, 0UL, BINARY | OTHERS, ~0UL}) {
        file.setMode(mode);
        CHECK(file.getMode() == mode);
        CHECK(!file.is_open());
        CHECK(file.rdstate() == GOOD);
    }
    file.open(READ);
    file.setMode(UPDATE);
    CHECK(file.getMode() == UPDATE);
    CHECK(!canWrite(file));
    CHECK(contentOf(file) == "content");
}

TEST_CASE("name and mode can be asked and set while another thread holds the lock") {
    File file(L"/a/b");
    Holder const holder(file);
    file.setMode(7);
    CHECK(file.getMode() == 7);
    CHECK(file.getName() == L"/a/b");
}

TEST_CASE("open opens, creates, empties or fails as its mode says") {
    struct {
        std::string label;
        unsigned long mode;
        char const* before; ///< content of the file, null for none
        bool opens;
        char const* after;
        bool reads, writes;
    } const rows[] = {
        {"reading a file", READ, "content", true, "content", true, false},
        {"reading a missing file", READ, nullptr, false, nullptr, false, false},
        {"writing a file", WRITE, "content", true, "", false, true},
        {"writing a missing file", WRITE, nullptr, true, "", false, true},
        {"updating a file", UPDATE, "content", true, "content", true, true},
        {"updating a missing file", UPDATE, nullptr, true, "", false, true},
        {"neither, with a file", 0, "content", false, "content", false, false},
        {"neither, without a file", 0, nullptr, false, nullptr, false, false},
    };
    for (auto const& row : rows) {
        for (unsigned long const more : {0UL, BINARY, OTHERS, BINARY | OTHERS, ~3UL}) {
            INFO(row.label, ", with ", more);
            OnFile on;
            if (row.before != nullptr) on.store(row.before);
            on.file.setMode(99);
            CHECK(complaint([&] { on.file.open(row.mode | more); }) ==
                  (row.opens ? "<nothing>" : NOT_OPENED));
            CHECK(on.file.is_open() == row.opens);
            CHECK(on.file.getMode() == (row.opens ? row.mode | more : 99));
            CHECK(on.file.getName() == on.dir.wide("a"));
            CHECK(on.file.good() == row.opens);
            CHECK(isThere(on.path) == (row.after != nullptr));
            if (row.after != nullptr) CHECK(on.stored() == row.after);
            if (row.opens) CHECK(canRead(on.file) == row.reads);
            if (row.opens) CHECK(canWrite(on.file) == row.writes);
            CHECK(isFree(on.file));
        }
    }
}

TEST_CASE_FIXTURE(OnContent,
                  "updating begins at the start of the file and keeps what is not overwritten") {
    CHECK(after(*this, "update put-NEW close") == "closed, mode 0, good: NEWtent");
}

TEST_CASE_FIXTURE(OnFile, "bytes pass unchanged with and without the binary bit") {
    std::string every;
    for (int byte = 0; byte < 256; ++byte) every += static_cast<char>(byte);
    every += "\r\n\n\r\x1A\xEF\xBB\xBF";
    for (unsigned long const more : {0UL, BINARY}) {
        CAPTURE(more);
        file.open(WRITE | more);
        file.write(every.data(), static_cast<std::streamsize>(every.size()));
        file.close();
        CHECK((stored() == every));
        file.open(READ | more);
        CHECK((contentOf(file) == every));
        file.close();
    }
}

TEST_CASE_FIXTURE(OnContent, "a file that cannot be opened is reported, whatever the reason") {
    std::filesystem::create_directories(dir / "directory");
    std::filesystem::create_symlink("loop", dir / "loop");
    for (std::wstring const& name :
         {dir.wide("none/a"), dir.wide("directory"), dir.wide("loop"), dir.wide("a/a"),
          dir.wide(std::string(300, 'n')), std::wstring(), std::wstring(L"\0/tmp", 5)}) {
        for (unsigned long const mode : {WRITE, UPDATE}) {
            INFO(Koru::make_string(name), " in mode ", mode);
            File other(name);
            CHECK(complaint([&] { other.open(mode); }) == NOT_OPENED);
            CHECK(shown(other) == CLOSED + ", fail");
        }
    }
    CHECK(stored() == "content");
}

TEST_CASE_FIXTURE(OnFile, "a name reaches the system as UTF-8 and up to its first NUL") {
    std::pair<std::wstring, std::string> const rows[] = {
        {L"gr\u00FC\u00DFe", "gr\xC3\xBC\xC3\x9F\x65"},
        {L"\u20AC\U0001F600", "\xE2\x82\xAC\xF0\x9F\x98\x80"},
        {std::wstring(L"cut\0off", 7), "cut"},
        {L"back\\slash", "back\\slash"},
        {{static_cast<wchar_t>(0x80000041U)}, "A"},
        {{static_cast<wchar_t>(0xD800)}, "\xED\xA0\x80"}};
    for (auto const& row : rows) {
        CAPTURE(row.second);
        File other(dir.wide("") + row.first);
        other.open(WRITE);
        CHECK(isThere(dir / row.second));
        CHECK((other.getName() == dir.wide("") + row.first));
    }
}

TEST_CASE_FIXTURE(OnFile,
                  "a relative name belongs to the working directory, not to the executable's") {
    CHECK(test::ending([&] {
              if (::chdir(dir.path().c_str()) != 0) return 1;
              File(L"relative.txt").open(WRITE);
              return 0;
          }) == "exit 0");
    CHECK(isThere(dir / "relative.txt"));
}

TEST_CASE_FIXTURE(OnFile, "opening through a dangling link creates the file that it names") {
    std::filesystem::create_symlink("target", path);
    CHECK(complaint([&] { file.open(READ); }) == NOT_OPENED);
    file.open(UPDATE);
    CHECK(readFile(dir / "target") == "");
}

TEST_CASE_FIXTURE(OnContent, "a first attempt that succeeds leaves the stream's state as it was") {
    for (unsigned long const mode : {READ, UPDATE, WRITE}) {
        for (State const state : STATES) {
            INFO("mode ", mode, ", state ", state);
            File other(dir.wide("a"));
            other.setstate(state);
            other.open(mode);
            CHECK(other.is_open());
            CHECK(other.rdstate() == state);
        }
    }
}

TEST_CASE("a second attempt that succeeds clears the stream's state") {
    for (State const state : STATES) {
        CAPTURE(state);
        OnFile on;
        on.file.setstate(state);
        on.file.open(UPDATE);
        CHECK(on.file.is_open());
        CHECK(on.file.rdstate() == GOOD);
    }
}

TEST_CASE_FIXTURE(OnFile, "attempts that fail add the fail state") {
    for (unsigned long const mode : MODES) {
        for (State const state : STATES) {
            INFO("mode ", mode, ", state ", state);
            File other(dir.wide("none/a"));
            other.setstate(state);
            CHECK(complaint([&] { other.open(mode); }) == NOT_OPENED);
            CHECK(other.rdstate() == (state | FAIL));
        }
    }
}

TEST_CASE_FIXTURE(OnFile, "a file that could not be opened can be opened later, and stays in the "
                          "fail state") {
    CHECK(after(*this, "not-read store read") == "open, mode 1, fail: content");
    file.clear();
    CHECK(contentOf(file) == "content");
}

TEST_CASE("opening an open file changes its mode and sets the fail state, no more") {
    for (unsigned long const first : {READ, UPDATE}) {
        for (unsigned long const second : {READ, WRITE, UPDATE, 0UL, BINARY | OTHERS}) {
            INFO("first ", first, ", then ", second);
            OnContent on;
            on.file.open(first);
            on.file.ignore(3);
            on.file.open(second);
            CHECK(shown(on.file) == "open, mode " + std::to_string(second) + ", fail");
            on.file.clear();
            CHECK(on.file.tellg() == std::streampos(3));
            CHECK(contentOf(on.file) == "content");
            CHECK(canWrite(on.file) == ((first & WRITE) != 0));
        }
    }
}

TEST_CASE_FIXTURE(OnFile, "what an open file has buffered survives being opened again") {
    CHECK(after(*this, "write put write close") == "closed, mode 0, fail: content");
}

TEST_CASE_FIXTURE(OnFile, "a file can be opened and closed in one mode and another again") {
    for (int round = 0; round < 5; ++round) {
        CHECK(after(*this, "write put close read") == "open, mode 1, good: content");
        CHECK(contentOf(file) == "content");
        CHECK(after(*this, "close") == "closed, mode 0, good: content");
    }
}

TEST_CASE_FIXTURE(OnFile, "open and close set the mode themselves, whatever an override does") {
    struct Stubborn : File {
        using File::File;
        void setMode(unsigned long) override {}
    };
    Stubborn stubborn(dir.wide("a"));
    stubborn.open(WRITE);
    CHECK(stubborn.getMode() == WRITE);
    stubborn.close();
    CHECK(stubborn.getMode() == 0);
}

TEST_CASE_FIXTURE(OnFile, "close writes out what is buffered, closes and resets the mode") {
    CHECK(after(*this, "write put") == "open, mode 2, good: ");
    CHECK(after(*this, "close") == "closed, mode 0, good: content");
    CHECK(file.getName() == dir.wide("a"));
}

TEST_CASE_FIXTURE(OnContent, "close leaves the state of the stream as it was") {
    for (State const state : {END, FAIL, BAD, END | FAIL}) {
        CAPTURE(state);
        file.open(READ);
        file.setstate(state);
        file.close();
        CHECK(file.rdstate() == state);
        file.clear();
    }
}

TEST_CASE_FIXTURE(OnFile, "closing a file that was never opened sets the fail state and touches "
                          "nothing else") {
    CHECK(after(*this, "mode-write close") == "closed, mode 0, fail, no file");
    CHECK(after(*this, "store close") == "closed, mode 0, fail: content");
    CHECK(file.getName() == dir.wide("a"));
}

TEST_CASE_FIXTURE(OnFile, "closing twice is harmless, and the mode is 0") {
    CHECK(after(*this, "write put close mode-write close") == "closed, mode 0, fail: content");
}

TEST_CASE("what cannot be written out shows in the stream's state, and the file is closed") {
    File file(L"/dev/full");
    file.open(WRITE);
    file << "more than nothing";
    CHECK(file.good());
    file.close();
    CHECK(shown(file) == CLOSED + ", fail");
}

TEST_CASE("no descriptor stays open after close or destruction") {
    auto const descriptors = [] {
        std::filesystem::directory_iterator const first("/proc/self/fd");
        return std::distance(begin(first), end(first));
    };
    auto const before = descriptors();
    {
        OnFile on;
        on.file.open(WRITE);
        CHECK(descriptors() == before + 1);
        on.file.close();
        CHECK(descriptors() == before);
        on.file.open(READ);
        CHECK(descriptors() == before + 1);
    }
    CHECK(descriptors() == before);
}

TEST_CASE_FIXTURE(OnContent, "stream exceptions that a caller enables leave the lock released") {
    auto const check = [](File& target, bool isOpen, auto step) {
        target.exceptions(FAIL);
        CHECK_THROWS_AS(step(), std::ios_base::failure);
        CHECK(target.is_open() == isOpen);
        CHECK(isFree(target));
    };
    File missing(dir.wide("none"));
    SUBCASE("opening a missing file") {
        check(missing, false, [&] { missing.open(READ); });
        CHECK(missing.getMode() == 0);
    }
    SUBCASE("opening a missing file for reading and writing, which ends the first attempt") {
        check(missing, false, [&] { missing.open(UPDATE); });
        CHECK(!isThere(dir / "none"));
    }
    SUBCASE("opening an open file") {
        file.open(READ);
        check(file, true, [&] { file.open(UPDATE); });
    }
    SUBCASE("closing a closed file") {
        check(file, false, [&] { file.close(); });
    }
    SUBCASE("closing a file that cannot be written out") {
        File full(L"/dev/full");
        full.open(WRITE);
        full << "more than nothing";
        check(full, false, [&] { full.close(); });
    }
    SUBCASE("synchronizing a file that is gone") {
        file.open(READ);
        std::filesystem::remove(path);
        check(file, false, [&] { file.synchronize(); });
    }
}

TEST_CASE_FIXTURE(OnRecorder, "synchronize closes and reopens through the virtual functions, under "
                              "the lock") {
    unsigned long const mode = UPDATE | BINARY | 0x40;
    recorder.File::open(mode);
    File& base = recorder;
    base.synchronize();
    std::string const number = std::to_string(mode);
    CHECK(recorder.calls == Strings{"close in mode " + number, "open " + number});
    CHECK(shown(recorder) == "open, mode " + number + ", good");
}

TEST_CASE_FIXTURE(OnRecorder, "synchronize leaves a closed file as it is") {
    std::filesystem::remove(path);
    recorder.setMode(UPDATE);
    recorder.synchronize();
    CHECK(recorder.calls == Strings{});
    CHECK(shown(recorder) == "closed, mode 3, good");
    CHECK(!isThere(path));
}

TEST_CASE_FIXTURE(OnRecorder,
                  "synchronize opens in the mode that setMode left, such as read-only") {
    recorder.File::open(UPDATE);
    recorder << "CON" << std::flush;
    recorder.setMode(READ);
    recorder.synchronize();
    CHECK(recorder.calls == Strings{"close in mode 1", "open 1"});
    CHECK(recorder.getMode() == READ);
    CHECK(contentOf(recorder) == "CONtent");
    CHECK(!canWrite(recorder));
}

TEST_CASE_FIXTURE(OnContent,
                  "synchronize opens in the remembered mode, whatever an override says") {
    struct Liar : File {
        using File::File;
        unsigned long getMode() const override { return 0; }
    };
    Liar liar(dir.wide("a"));
    liar.open(READ);
    CHECK(complaint([&] { liar.synchronize(); }) == "<nothing>");
    CHECK(liar.File::getMode() == READ);
    CHECK(contentOf(liar) == "content");
}

TEST_CASE_FIXTURE(OnFile, "synchronize writes out and goes back to the start") {
    CHECK(after(*this, "update put synchronize") == "open, mode 3, good: content");
    CHECK(file.tellg() == std::streampos(0));
    CHECK(contentOf(file) == "content");
}

TEST_CASE_FIXTURE(OnContent, "synchronize sees what others wrote meanwhile") {
    file.open(READ);
    CHECK(contentOf(file) == "content");
    CHECK(after(*this, "delete store-new synchronize") == "open, mode 1, good: new");
    CHECK(contentOf(file) == "new");
}

TEST_CASE_FIXTURE(OnFile, "synchronize empties a file that is open for writing only") {
    CHECK(after(*this, "write put synchronize") == "open, mode 2, good: ");
}

TEST_CASE_FIXTURE(OnFile, "synchronize creates a file that is gone when its mode is both") {
    CHECK(after(*this, "update put delete synchronize") == "open, mode 3, good: ");
}

TEST_CASE_FIXTURE(OnContent, "synchronize fails on a file that cannot be opened again, which is "
                             "closed then") {
    CHECK(after(*this, "update mode-binary not-synchronize") == "closed, mode 0, fail: content");
    file.clear();
    CHECK(after(*this, "read delete not-synchronize") == "closed, mode 0, fail, no file");
}

TEST_CASE_FIXTURE(OnRecorder, "what an override throws comes out of synchronize, and the lock is "
                              "released") {
    recorder.File::open(READ);
    recorder.failing = "close";
    CHECK(messageOf<std::logic_error>([&] { recorder.synchronize(); }) == "close");
    CHECK(recorder.calls == Strings{"close in mode 1"});
    CHECK(shown(recorder) == "open, mode 1, good");

    recorder.failing = "open";
    CHECK(messageOf<std::logic_error>([&] { recorder.synchronize(); }) == "open");
    CHECK(recorder.calls == Strings{"close in mode 1", "close in mode 1", "open 1"});
    CHECK(shown(recorder) == CLOSED + ", good");
}

TEST_CASE_TEMPLATE("a file can be destroyed as the file or the stream that it is, and is written "
                   "out",
                   Base, File, std::fstream, std::ostream, std::istream) {
    OnFile const on;
    auto file = std::make_unique<File>(on.dir.wide("a"));
    file->open(WRITE);
    *file << "content";
    std::unique_ptr<Base>(std::move(file)).reset();
    CHECK(on.stored() == "content");
}

TEST_CASE_FIXTURE(OnFile, "the destructor of a file does not call overrides") {
    struct Counting : File {
        Counting(std::wstring const& name, int& calls) : File(name), calls_(calls) {}
        void close() override {
            ++calls_;
            File::close();
        }
        int& calls_;
    };
    int calls = 0;
    {
        Counting counting(dir.wide("a"), calls);
        counting.open(WRITE);
        counting << "content";
    }
    CHECK(calls == 0);
    CHECK(stored() == "content");
}

TEST_CASE_FIXTURE(OnFile, "the destructor of a closed file touches nothing") {
    { File const other(dir.wide("a")); }
    CHECK(!isThere(path));
    store("content");
    {
        File other(dir.wide("a"));
        other.open(UPDATE);
        other.close();
        other.setMode(WRITE);
    }
    CHECK(stored() == "content");
}

TEST_CASE("the destructor lets no exception out") {
    struct {
        std::string label;
        wchar_t const* name;
        bool closed;
    } const rows[] = {{"a file that cannot be written out", L"/dev/full", false},
                      {"a file that can", L"/dev/null", false},
                      {"a closed file", L"/dev/null", true}};
    for (auto const& row : rows) {
        for (State const mask : {static_cast<State>(~0), FAIL, FAIL | BAD | END, GOOD}) {
            INFO(row.label, " with mask ", mask);
            CHECK(test::ending([&] {
                      File file(row.name);
                      file.open(WRITE);
                      file << "more than nothing";
                      if (row.closed) file.close();
                      file.exceptions(mask);
                      return 0;
                  }) == "exit 0");
        }
    }
}

TEST_CASE_FIXTURE(OnFile, "a cancellation that is due waits until the destructor has written out") {
    CHECK(test::ending([&] {
              bool const cancelled = endsCancelled(
                  [&] {
                      {
                          File own(dir.wide("a"));
                          own.open(WRITE);
                          own << "content";
                          ::pthread_cancel(::pthread_self());
                      }
                      ::pthread_testcancel();
                  },
                  [](pthread_t) {});
              return cancelled ? 0 : 1;
          }) == "exit 0");
    CHECK(stored() == "content");
}
