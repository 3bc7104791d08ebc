// The file base class: opening and closing, the lock, reopening and the operations on whole files.
#include <koru/file.h>
#include <koru/initializationfile.h>
#include <koru/mutex.h>
#include <koru/string.h>

#include <fcntl.h>
#include <pthread.h>
#include <sys/stat.h>
#include <time.h>
#include <unistd.h>

#include <atomic>
#include <chrono>
#include <cstddef>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <functional>
#include <future>
#include <iterator>
#include <limits>
#include <locale>
#include <memory>
#include <sstream>
#include <stdexcept>
#include <string>
#include <thread>
#include <type_traits>
#include <utility>
#include <vector>

#include <doctest/doctest.h>

#include "support/cancellation.h"
#include "support/slots.h"
#include "support/subprocess.h"
#include "support/tempdir.h"
#include "support/throws.h"

#if defined(__SANITIZE_THREAD__)
// A lock that is not held may be released, which the sanitizer would report as a mistake. It still
// looks for data races.
extern "C" char const* __tsan_default_options();
extern "C" char const* __tsan_default_options() { return "report_mutex_bugs=0"; }
#endif

using test::slotOf;
using test::slotOfOpen;
namespace {

/// What happens to a thread's polls for a lock: nothing, an exception, or no sleep between them.
enum class Interruption { NONE, ERROR, NUMBER, HURRY };
thread_local Interruption interruption = Interruption::NONE;
std::atomic<unsigned long> hurriedPolls{0};

} // namespace

// The library polls with usleep, and finds this one before the C library's. It sleeps and can be
// cancelled like the other.
extern "C" int usleep(useconds_t microseconds) {
    if (interruption == Interruption::ERROR) throw std::runtime_error("interrupted");
    if (interruption == Interruption::NUMBER) throw 42;
    if (interruption == Interruption::HURRY) return ++hurriedPolls, 0;
    timespec const time{static_cast<time_t>(microseconds / 1000000),
                        static_cast<long>(microseconds % 1000000) * 1000};
    return ::nanosleep(&time, nullptr);
}

namespace {

using Koru::File;

unsigned long const READ = File::READ;
unsigned long const WRITE = File::WRITE;
unsigned long const BINARY = File::BINARY;
unsigned long const OTHERS = 0x7FFFFFFCUL; ///< all 32 bits that have no meaning

/// Long enough for a thread that need not wait to have gone on.
std::chrono::milliseconds const SHORT_WHILE(50);
/// After which a thread that should have gone on is given up.
std::chrono::seconds const LONG_WHILE(20);

std::ios_base::iostate const GOOD = std::ios_base::goodbit;
std::ios_base::iostate const FAIL = std::ios_base::failbit;
std::ios_base::iostate const BAD = std::ios_base::badbit;
std::ios_base::iostate const END = std::ios_base::eofbit;

char const* const NOT_OPENED = "failed to open file.";

template <class Callable>
std::string complaint(Callable callable) {
    return test::messageOf<std::runtime_error>(callable);
}

template <class Callable>
bool throwsStreamFailure(Callable callable) {
    try {
        callable();
    } catch (std::ios_base::failure const&) {
        return true;
    }
    return false;
}

/// Everything that the stream can read from the beginning of the file.
std::string contentOf(File& file) {
    file.seekg(0);
    return std::string(std::istreambuf_iterator<char>(file.rdbuf()),
                       std::istreambuf_iterator<char>());
}

bool canRead(File& file) { return file.rdbuf()->sgetc() != std::char_traits<char>::eof(); }

bool canWrite(File& file) {
    file.rdbuf()->pubseekpos(0);
    return file.rdbuf()->sputc('W') == 'W' && file.rdbuf()->pubsync() == 0;
}

/// A thread that takes the file's lock, and gives it back once it has it.
class Contender {
public:
    explicit Contender(File& file)
        : thread_([this, &file] {
              if (!file.lock()) return;
              hasLocked_ = true;
              file.unlock();
          }) {}
    ~Contender() { thread_.join(); }

    /// Whether it is kept waiting. Ask once.
    bool waits() const {
        std::this_thread::sleep_for(SHORT_WHILE);
        return !hasLocked_;
    }

private:
    std::atomic<bool> hasLocked_{false};
    std::thread thread_;
};

/// Whether nobody, the calling thread included, holds the file's lock.
bool isFree(File& file) {
    std::promise<bool> promise;
    std::future<bool> result = promise.get_future();
    std::thread other([&] { promise.set_value(file.lock() && file.unlock()); });
    bool const finished = result.wait_for(LONG_WHILE) == std::future_status::ready;
    if (!finished) ::pthread_cancel(other.native_handle());
    other.join();
    return finished && result.get();
}

/// Another thread that holds the file's lock until it is told to let go or destroyed.
class Holder {
public:
    explicit Holder(File& file)
        : thread_([this, &file] {
              file.lock();
              held_.set_value();
              release_.get_future().wait();
              file.unlock();
          }) {
        held_.get_future().wait();
    }
    ~Holder() {
        if (thread_.joinable()) letGo();
    }
    void letGo() {
        release_.set_value();
        thread_.join();
    }

private:
    std::promise<void> held_, release_;
    std::thread thread_;
};

/// A file whose overrides note the calls and whether the lock was held meanwhile.
class Recorder : public File {
public:
    using File::File;
    void open(unsigned long mode) override {
        note("open " + std::to_string(mode));
        if (failing == "open") throw std::logic_error("open");
        File::open(mode);
    }
    void close() override {
        note("close in mode " + std::to_string(getMode()));
        if (failing == "close") throw std::logic_error("close");
        File::close();
    }

    std::vector<std::string> calls;
    std::string failing;

private:
    void note(std::string call) {
        contenders_.push_back(std::make_unique<Contender>(*this));
        if (!contenders_.back()->waits()) call += " without the lock";
        calls.push_back(call);
    }
    // They end when the lock is released, which is after the call.
    std::vector<std::unique_ptr<Contender>> contenders_;
};

using Strings = std::vector<std::string>;

/// The permissions of an entry itself, be it a link.
unsigned permissions(std::string const& path) {
    struct stat status = {};
    if (::lstat(path.c_str(), &status) != 0) throw std::runtime_error("no " + path);
    return status.st_mode & 07777U;
}

/// Whether there is an entry of that name, be it a dangling link.
bool isThere(std::string const& path) {
    return std::filesystem::symlink_status(path).type() != std::filesystem::file_type::not_found;
}

} // namespace

// ---- The class

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

TEST_CASE("a file is a narrow stream for reading and writing, and cannot be copied") {
    static_assert(std::is_base_of<std::fstream, File>::value, "");
    static_assert(std::is_convertible<File*, std::fstream*>::value, "");
    static_assert(std::is_convertible<File&, std::istream&>::value, "");
    static_assert(std::is_convertible<File&, std::ostream&>::value, "");
    static_assert(std::has_virtual_destructor<File>::value, "");
    static_assert(!std::is_copy_constructible<File>::value, "");
    static_assert(!std::is_copy_assignable<File>::value, "");

    test::TempDir const dir;
    File file(dir.wide("a"));
    file.open(READ | WRITE);
    std::fstream& stream = file;
    stream << "17 and " << 4 << std::flush;
    stream.seekg(0);
    int number = 0;
    stream >> number;
    CHECK(number == 17);
    CHECK(test::readFile(dir / "a") == "17 and 4");
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

TEST_CASE("the virtual functions of a file are in the order of the published table") {
    // The destructor, which is the stream's, takes the first two places.
    CHECK(slotOfOpen<File>() == 2);
    CHECK(slotOf(static_cast<void (File::*)()>(&File::close)) == 3);
    CHECK(slotOf(&File::synchronize) == 4);
    CHECK(slotOf(&File::getMode) == 5);
    CHECK(slotOf(&File::setMode) == 6);
}

TEST_CASE("the virtual functions of an initialization file follow those of the file") {
    using Koru::InitializationFile;
    CHECK(slotOfOpen<InitializationFile>() == 2);
    CHECK(slotOf(static_cast<void (InitializationFile::*)()>(&InitializationFile::close)) == 3);
    CHECK(slotOf(&InitializationFile::synchronize) == 4);
    CHECK(slotOf(&InitializationFile::getMode) == 5);
    CHECK(slotOf(&InitializationFile::setMode) == 6);
    CHECK(slotOf(&InitializationFile::enumerateSections) == 7);
    CHECK(slotOf(&InitializationFile::createSection) == 8);
    CHECK(slotOf(&InitializationFile::removeSection) == 9);
    CHECK(slotOf(&InitializationFile::enumerateKeys) == 10);
    CHECK(slotOf(&InitializationFile::createKey) == 11);
    CHECK(slotOf(&InitializationFile::removeKey) == 12);
    CHECK(slotOf(&InitializationFile::getValue) == 13);
    CHECK(slotOf(&InitializationFile::setValue) == 14);
    static_assert(std::is_same<decltype(&InitializationFile::synchronize),
                               decltype(&File::synchronize)>::value,
                  "inherited, not overridden");
}

// ---- Construction, name and mode

TEST_CASE("a new file is closed, in mode 0 and in a good state") {
    File const nameless;
    CHECK(nameless.getName() == L"");
    CHECK(nameless.getMode() == 0);
    CHECK(!nameless.is_open());
    CHECK(nameless.rdstate() == GOOD);
    CHECK(nameless.exceptions() == GOOD);

    test::TempDir const dir;
    File const named(dir.wide("a"));
    CHECK(named.getName() == dir.wide("a"));
    CHECK(named.getMode() == 0);
    CHECK(!named.is_open());
    CHECK(named.rdstate() == GOOD);
    CHECK(!isThere(dir / "a"));
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
    std::wstring name = file.getName();
    name += L"c";
    CHECK(file.getName() == L"/a/b");
}

TEST_CASE("a file is made of a path") {
    Koru::File::Path path(L"//a\\b");
    path.setVolume(L"C:");
    File const file(path);
    CHECK(file.getName() == L"C:/a/b");
}

TEST_CASE("setMode stores the mode and nothing else") {
    test::TempDir const dir;
    test::writeFile(dir / "a", "content");
    File file(dir.wide("a"));
    for (unsigned long const mode : {READ, WRITE, 0UL, BINARY | OTHERS, ~0UL}) {
        file.setMode(mode);
        CHECK(file.getMode() == mode);
        CHECK(!file.is_open());
        CHECK(file.rdstate() == GOOD);
    }
    file.open(READ);
    file.setMode(READ | WRITE);
    CHECK(file.getMode() == (READ | WRITE));
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

// ---- open

TEST_CASE("open opens, creates, empties or fails as its mode says") {
    struct {
        char const* label;
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
        {"updating a file", READ | WRITE, "content", true, "content", true, true},
        {"updating a missing file", READ | WRITE, nullptr, true, "", false, true},
        {"neither, with a file", 0, "content", false, "content", false, false},
        {"neither, without a file", 0, nullptr, false, nullptr, false, false},
    };
    for (auto const& row : rows) {
        for (unsigned long const more : {0UL, BINARY, OTHERS, BINARY | OTHERS, ~3UL}) {
            CAPTURE(row.label);
            CAPTURE(more);
            test::TempDir const dir;
            if (row.before != nullptr) test::writeFile(dir / "a", row.before);
            File file(dir.wide("a"));
            file.setMode(99);
            CHECK(complaint([&] { file.open(row.mode | more); }) ==
                  (row.opens ? "<nothing>" : NOT_OPENED));
            CHECK(file.is_open() == row.opens);
            CHECK(file.getMode() == (row.opens ? row.mode | more : 99));
            CHECK(file.getName() == dir.wide("a"));
            CHECK(file.good() == row.opens);
            CHECK(isThere(dir / "a") == (row.after != nullptr));
            if (row.after != nullptr) CHECK(test::readFile(dir / "a") == row.after);
            if (row.opens) {
                CHECK(canRead(file) == row.reads);
                CHECK(canWrite(file) == row.writes);
            }
            CHECK(isFree(file));
        }
    }
}

TEST_CASE("updating begins at the start of the file and keeps what is not overwritten") {
    test::TempDir const dir;
    test::writeFile(dir / "a", "old content");
    File file(dir.wide("a"));
    file.open(READ | WRITE);
    CHECK(file.tellg() == std::streampos(0));
    file << "NEW";
    file.close();
    CHECK(test::readFile(dir / "a") == "NEW content");
}

TEST_CASE("bytes pass unchanged with and without the binary bit") {
    std::string every;
    for (int byte = 0; byte < 256; ++byte) every += static_cast<char>(byte);
    every += "\r\n\n\r\x1A\xEF\xBB\xBF";
    for (unsigned long const more : {0UL, BINARY}) {
        CAPTURE(more);
        test::TempDir const dir;
        File file(dir.wide("a"));
        file.open(WRITE | more);
        file.write(every.data(), static_cast<std::streamsize>(every.size()));
        file.close();
        CHECK((test::readFile(dir / "a") == every));
        file.open(READ | more);
        CHECK((contentOf(file) == every));
    }
}

TEST_CASE("a file that cannot be opened is reported, whatever the reason") {
    test::TempDir const dir;
    std::filesystem::create_directories(dir / "directory");
    std::filesystem::create_symlink("loop", dir / "loop");
    test::writeFile(dir / "file", "content");
    for (std::wstring const& name :
         {dir.wide("none/a"), dir.wide("directory"), dir.wide("loop"), dir.wide("file/a"),
          dir.wide(std::string(300, 'n')), std::wstring(), std::wstring(L"\0/tmp", 5)}) {
        std::string const narrow = Koru::make_string(name);
        CAPTURE(narrow);
        for (unsigned long const mode : {WRITE, READ | WRITE}) {
            File file(name);
            CHECK(complaint([&] { file.open(mode); }) == NOT_OPENED);
            CHECK(!file.is_open());
            CHECK(file.rdstate() == FAIL);
            CHECK(file.getMode() == 0);
            CHECK(isFree(file));
        }
    }
    CHECK(test::readFile(dir / "file") == "content");
}

TEST_CASE("a name reaches the system as UTF-8 and up to its first NUL") {
    test::TempDir const dir;
    struct {
        std::wstring name;
        char const* bytes;
    } const rows[] = {{L"gr\u00FC\u00DFe", "gr\xC3\xBC\xC3\x9F"
                                           "e"},
                      {L"\u20AC\U0001F600", "\xE2\x82\xAC\xF0\x9F\x98\x80"},
                      {std::wstring(L"cut\0off", 7), "cut"},
                      {L"back\\slash", "back\\slash"},
                      {{static_cast<wchar_t>(0x80000041U)}, "A"},
                      {{static_cast<wchar_t>(0xD800)}, "\xED\xA0\x80"}};
    for (auto const& row : rows) {
        CAPTURE(row.bytes);
        std::wstring const name = dir.wide("") + row.name;
        File file(name);
        file.open(WRITE);
        CHECK(isThere(dir / row.bytes));
        CHECK((file.getName() == name));
    }
}

TEST_CASE("a relative name belongs to the working directory, not to the executable's") {
    test::TempDir const dir;
    test::Outcome const outcome = test::inChild([&] {
        if (::chdir(dir.path().c_str()) != 0) return 1;
        File file(L"relative.txt");
        file.open(WRITE);
        return 0;
    });
    CHECK(outcome.exitCode == 0);
    CHECK(isThere(dir / "relative.txt"));
}

TEST_CASE("opening through a dangling link creates the file that it names") {
    test::TempDir const dir;
    std::filesystem::create_symlink("target", dir / "link");
    File reader(dir.wide("link"));
    CHECK(complaint([&] { reader.open(READ); }) == NOT_OPENED);
    File file(dir.wide("link"));
    file.open(READ | WRITE);
    CHECK(test::readFile(dir / "target") == "");
}

TEST_CASE("a first attempt that succeeds leaves the stream's state as it was") {
    test::TempDir const dir;
    test::writeFile(dir / "a", "content");
    for (unsigned long const mode : {READ, READ | WRITE, WRITE}) {
        for (std::ios_base::iostate const state : {GOOD, FAIL, BAD, END, FAIL | BAD | END}) {
            CAPTURE(mode);
            CAPTURE(static_cast<int>(state));
            File file(dir.wide("a"));
            file.setstate(state);
            file.open(mode);
            CHECK(file.is_open());
            CHECK(file.rdstate() == state);
        }
    }
}

TEST_CASE("a second attempt that succeeds clears the stream's state") {
    for (std::ios_base::iostate const state : {GOOD, FAIL, BAD, END, FAIL | BAD | END}) {
        CAPTURE(static_cast<int>(state));
        test::TempDir const dir;
        File file(dir.wide("a"));
        file.setstate(state);
        file.open(READ | WRITE);
        CHECK(file.is_open());
        CHECK(file.rdstate() == GOOD);
    }
}

TEST_CASE("attempts that fail add the fail state") {
    test::TempDir const dir;
    for (unsigned long const mode : {READ, WRITE, READ | WRITE, 0UL}) {
        for (std::ios_base::iostate const state : {GOOD, FAIL, BAD, END}) {
            CAPTURE(mode);
            CAPTURE(static_cast<int>(state));
            File file(dir.wide("none/a"));
            file.setstate(state);
            CHECK(complaint([&] { file.open(mode); }) == NOT_OPENED);
            CHECK(file.rdstate() == (state | FAIL));
        }
    }
}

TEST_CASE("a file that could not be opened can be opened later, and stays in the fail state") {
    test::TempDir const dir;
    File file(dir.wide("a"));
    CHECK(complaint([&] { file.open(READ); }) == NOT_OPENED);
    test::writeFile(dir / "a", "content");
    file.open(READ);
    CHECK(file.is_open());
    CHECK(file.getMode() == READ);
    CHECK(file.rdstate() == FAIL);
    file.clear();
    CHECK(contentOf(file) == "content");
}

TEST_CASE("opening an open file changes its mode and sets the fail state, no more") {
    test::TempDir const dir;
    for (unsigned long const first : {READ, READ | WRITE}) {
        for (unsigned long const second : {READ, WRITE, READ | WRITE, 0UL, BINARY | OTHERS}) {
            CAPTURE(first);
            CAPTURE(second);
            test::writeFile(dir / "a", "content");
            File file(dir.wide("a"));
            file.open(first);
            file.ignore(3);
            CHECK(complaint([&] { file.open(second); }) == "<nothing>");
            CHECK(file.getMode() == second);
            CHECK(file.is_open());
            CHECK(file.rdstate() == FAIL);
            file.clear();
            CHECK(file.tellg() == std::streampos(3));
            CHECK(contentOf(file) == "content");
            CHECK(canWrite(file) == ((first & WRITE) != 0));
            CHECK(isFree(file));
        }
    }
}

TEST_CASE("what an open file has buffered survives being opened again") {
    test::TempDir const dir;
    File file(dir.wide("a"));
    file.open(WRITE);
    file << "buffered";
    file.open(WRITE);
    file.close();
    CHECK(test::readFile(dir / "a") == "buffered");
}

TEST_CASE("a file can be opened, closed and opened in another mode again and again") {
    test::TempDir const dir;
    File file(dir.wide("a"));
    for (int round = 0; round < 5; ++round) {
        file.open(WRITE);
        file << "round " << round;
        file.close();
        file.open(READ | BINARY);
        CHECK(contentOf(file) == "round " + std::to_string(round));
        CHECK(file.getMode() == (READ | BINARY));
        file.close();
        CHECK(file.good());
    }
}

TEST_CASE("open and close set the mode themselves, whatever an override of setMode does") {
    struct Stubborn : File {
        using File::File;
        void setMode(unsigned long) override {}
    };
    test::TempDir const dir;
    Stubborn file(dir.wide("a"));
    file.open(WRITE);
    CHECK(file.getMode() == WRITE);
    file.close();
    CHECK(file.getMode() == 0);
}

// ---- close

TEST_CASE("close writes out what is buffered, closes and resets the mode") {
    test::TempDir const dir;
    File file(dir.wide("a"));
    file.open(WRITE | BINARY);
    file << "content";
    CHECK(test::readFile(dir / "a") == "");
    file.close();
    CHECK(test::readFile(dir / "a") == "content");
    CHECK(!file.is_open());
    CHECK(file.getMode() == 0);
    CHECK(file.rdstate() == GOOD);
    CHECK(file.getName() == dir.wide("a"));
    CHECK(isFree(file));
}

TEST_CASE("close leaves the state of the stream as it was") {
    test::TempDir const dir;
    test::writeFile(dir / "a", "content");
    for (std::ios_base::iostate const state : {END, FAIL, BAD, END | FAIL}) {
        CAPTURE(static_cast<int>(state));
        File file(dir.wide("a"));
        file.open(READ);
        file.setstate(state);
        file.close();
        CHECK(file.rdstate() == state);
    }
}

TEST_CASE("closing a file that was never opened sets the fail state and touches nothing else") {
    test::TempDir const dir;
    File file(dir.wide("a"));
    file.setMode(READ | WRITE);
    CHECK(complaint([&] { file.close(); }) == "<nothing>");
    CHECK(file.getMode() == 0);
    CHECK(file.rdstate() == FAIL);
    CHECK(!file.is_open());
    CHECK(!isThere(dir / "a"));
    CHECK(file.getName() == dir.wide("a"));
    CHECK(isFree(file));

    test::writeFile(dir / "a", "content");
    CHECK(complaint([&] { file.close(); }) == "<nothing>");
    CHECK(test::readFile(dir / "a") == "content");
}

TEST_CASE("closing twice is harmless, and the mode is 0") {
    test::TempDir const dir;
    File file(dir.wide("a"));
    file.open(WRITE);
    file << "content";
    file.close();
    file.setMode(WRITE);
    CHECK(complaint([&] { file.close(); }) == "<nothing>");
    CHECK(file.getMode() == 0);
    CHECK(file.rdstate() == FAIL);
    CHECK(test::readFile(dir / "a") == "content");
}

TEST_CASE("what cannot be written out shows in the stream's state, and the file is closed") {
    File file(L"/dev/full");
    file.open(WRITE);
    file << "more than nothing";
    CHECK(file.good());
    CHECK(complaint([&] { file.close(); }) == "<nothing>");
    CHECK(file.rdstate() == FAIL);
    CHECK(!file.is_open());
    CHECK(file.getMode() == 0);
    CHECK(isFree(file));
}

TEST_CASE("no descriptor stays open after close or destruction") {
    test::TempDir const dir;
    auto const descriptors = [] {
        std::filesystem::directory_iterator const first("/proc/self/fd");
        return std::distance(begin(first), end(first));
    };
    auto const before = descriptors();
    {
        File file(dir.wide("a"));
        file.open(WRITE);
        CHECK(descriptors() == before + 1);
        file.close();
        CHECK(descriptors() == before);
        file.open(READ);
        CHECK(descriptors() == before + 1);
    }
    CHECK(descriptors() == before);
}

// ---- Stream exceptions, which a caller can enable

TEST_CASE("stream exceptions that a caller enables leave the lock released") {
    test::TempDir const dir;
    test::writeFile(dir / "a", "content");

    SUBCASE("opening a missing file") {
        File file(dir.wide("none"));
        file.exceptions(FAIL);
        CHECK(throwsStreamFailure([&] { file.open(READ); }));
        CHECK(!file.is_open());
        CHECK(file.getMode() == 0);
        CHECK(isFree(file));
    }
    SUBCASE("opening a missing file for reading and writing, which ends the first attempt") {
        File file(dir.wide("none"));
        file.exceptions(FAIL);
        CHECK(throwsStreamFailure([&] { file.open(READ | WRITE); }));
        CHECK(!file.is_open());
        CHECK(!isThere(dir / "none"));
        CHECK(isFree(file));
    }
    SUBCASE("opening an open file") {
        File file(dir.wide("a"));
        file.open(READ);
        file.exceptions(FAIL);
        CHECK(throwsStreamFailure([&] { file.open(READ | WRITE); }));
        CHECK(file.is_open());
        CHECK(isFree(file));
    }
    SUBCASE("closing a closed file") {
        File file(dir.wide("a"));
        file.exceptions(FAIL);
        CHECK(throwsStreamFailure([&] { file.close(); }));
        CHECK(isFree(file));
    }
    SUBCASE("closing a file that cannot be written out") {
        File file(L"/dev/full");
        file.open(WRITE);
        file << "more than nothing";
        file.exceptions(FAIL);
        CHECK(throwsStreamFailure([&] { file.close(); }));
        CHECK(!file.is_open());
        CHECK(isFree(file));
    }
    SUBCASE("synchronizing a file that is gone") {
        File file(dir.wide("a"));
        file.open(READ);
        file.exceptions(FAIL);
        std::filesystem::remove(dir / "a");
        CHECK(throwsStreamFailure([&] { file.synchronize(); }));
        CHECK(isFree(file));
    }
}

// ---- synchronize

TEST_CASE("synchronize closes and reopens through the virtual functions, under the lock") {
    test::TempDir const dir;
    test::writeFile(dir / "a", "content");
    Recorder file(dir.wide("a"));
    unsigned long const mode = READ | WRITE | BINARY | 0x40;
    file.File::open(mode);
    File& base = file;
    base.synchronize();
    std::string const number = std::to_string(mode);
    CHECK(file.calls == Strings{"close in mode " + number, "open " + number});
    CHECK(file.is_open());
    CHECK(file.getMode() == mode);
    CHECK(file.rdstate() == GOOD);
    CHECK(isFree(file));
}

TEST_CASE("synchronize leaves a closed file as it is") {
    test::TempDir const dir;
    Recorder file(dir.wide("a"));
    file.setMode(READ | WRITE);
    file.synchronize();
    CHECK(file.calls == Strings{});
    CHECK(file.getMode() == (READ | WRITE));
    CHECK(file.rdstate() == GOOD);
    CHECK(!file.is_open());
    CHECK(!isThere(dir / "a"));
    CHECK(isFree(file));
}

TEST_CASE("synchronize opens in the mode that setMode left, read-only for one") {
    test::TempDir const dir;
    test::writeFile(dir / "a", "content");
    Recorder file(dir.wide("a"));
    file.File::open(READ | WRITE);
    file << "CON" << std::flush;
    file.setMode(READ);
    file.synchronize();
    CHECK(file.calls == Strings{"close in mode 1", "open 1"});
    CHECK(file.getMode() == READ);
    CHECK(contentOf(file) == "CONtent");
    CHECK(!canWrite(file));
}

TEST_CASE("synchronize opens in the remembered mode, whatever an override of getMode says") {
    struct Liar : File {
        using File::File;
        unsigned long getMode() const override { return 0; }
    };
    test::TempDir const dir;
    test::writeFile(dir / "a", "content");
    Liar file(dir.wide("a"));
    file.open(READ);
    CHECK(complaint([&] { file.synchronize(); }) == "<nothing>");
    CHECK(file.File::getMode() == READ);
    CHECK(contentOf(file) == "content");
}

TEST_CASE("synchronize writes out and goes back to the start") {
    test::TempDir const dir;
    File file(dir.wide("a"));
    file.open(READ | WRITE);
    file << "content";
    file.synchronize();
    CHECK(test::readFile(dir / "a") == "content");
    CHECK(file.tellg() == std::streampos(0));
    CHECK(contentOf(file) == "content");
}

TEST_CASE("synchronize sees what others wrote meanwhile") {
    test::TempDir const dir;
    test::writeFile(dir / "a", "old");
    File file(dir.wide("a"));
    file.open(READ);
    CHECK(contentOf(file) == "old");
    std::filesystem::remove(dir / "a");
    test::writeFile(dir / "a", "new");
    file.synchronize();
    CHECK(contentOf(file) == "new");
}

TEST_CASE("synchronize empties a file that is open for writing only") {
    test::TempDir const dir;
    File file(dir.wide("a"));
    file.open(WRITE);
    file << "content";
    file.synchronize();
    CHECK(test::readFile(dir / "a") == "");
    CHECK(file.getMode() == WRITE);
}

TEST_CASE("synchronize creates a file that is gone when its mode is reading and writing") {
    test::TempDir const dir;
    File file(dir.wide("a"));
    file.open(READ | WRITE);
    file << "content";
    std::filesystem::remove(dir / "a");
    file.synchronize();
    CHECK(test::readFile(dir / "a") == "");
    CHECK(file.good());
}

TEST_CASE("synchronize fails on a file that cannot be opened again, which is closed then") {
    test::TempDir const dir;
    test::writeFile(dir / "a", "content");
    File file(dir.wide("a"));

    SUBCASE("since it is gone") {
        file.open(READ);
        std::filesystem::remove(dir / "a");
    }
    SUBCASE("since the mode is neither reading nor writing") {
        file.open(READ | WRITE);
        file.setMode(BINARY);
    }
    CHECK(complaint([&] { file.synchronize(); }) == NOT_OPENED);
    CHECK(!file.is_open());
    CHECK(file.getMode() == 0);
    CHECK(file.rdstate() == FAIL);
    CHECK(isFree(file));
}

TEST_CASE("what an override throws comes out of synchronize, and the lock is released") {
    test::TempDir const dir;
    test::writeFile(dir / "a", "content");
    Recorder file(dir.wide("a"));
    file.File::open(READ);

    file.failing = "close";
    CHECK(test::messageOf<std::logic_error>([&] { file.synchronize(); }) == "close");
    CHECK(file.calls == Strings{"close in mode 1"});
    CHECK(file.is_open());
    CHECK(file.getMode() == READ);
    CHECK(isFree(file));

    file.failing = "open";
    CHECK(test::messageOf<std::logic_error>([&] { file.synchronize(); }) == "open");
    CHECK(file.calls == Strings{"close in mode 1", "close in mode 1", "open 1"});
    CHECK(!file.is_open());
    CHECK(isFree(file));
}

// ---- The lock

TEST_CASE("the lock keeps other threads waiting until it is released") {
    File file;
    CHECK(file.lock());
    {
        Contender const contender(file);
        CHECK(contender.waits());
        CHECK(file.unlock());
    }
    CHECK(isFree(file));
}

TEST_CASE("the lock is recursive: it is free after as many unlocks as locks") {
    File file;
    for (int i = 0; i < 3; ++i) CHECK(file.lock());
    {
        Contender const contender(file);
        CHECK(file.unlock());
        CHECK(file.unlock());
        CHECK(contender.waits());
        CHECK(file.unlock());
    }
    CHECK(isFree(file));
}

TEST_CASE("each file has a lock of its own") {
    File a, b;
    Holder const holder(a);
    CHECK(isFree(b));
    CHECK(b.lock());
    CHECK(b.unlock());
}

TEST_CASE("lock waits as long as it takes") {
    // More than half an hour's polls, without the millisecond between them.
    unsigned long const many = 2000000;
    File file;
    Holder holder(file);
    hurriedPolls = 0;
    std::future<bool> locked = std::async(std::launch::async, [&] {
        interruption = Interruption::HURRY;
        return file.lock() && file.unlock();
    });
    while (hurriedPolls < many && locked.wait_for(SHORT_WHILE) != std::future_status::ready) {
    }
    CHECK(hurriedPolls >= many);
    CHECK(locked.wait_for(SHORT_WHILE) == std::future_status::timeout);
    holder.letGo();
    CHECK(locked.get());
}

TEST_CASE("unlock without the lock reports success and takes it from nobody") {
    File file;
    CHECK(file.unlock());
    CHECK(isFree(file));
    Holder holder(file);
    CHECK(file.unlock());
    {
        Contender const contender(file);
        CHECK(contender.waits());
        holder.letGo();
    }
    CHECK(isFree(file));
}

TEST_CASE("lock is false when anything is thrown while it waits") {
    for (Interruption const kind : {Interruption::ERROR, Interruption::NUMBER}) {
        CAPTURE(static_cast<int>(kind));
        File file;
        std::promise<void> held, finished;
        std::thread holder([&] {
            file.lock();
            held.set_value();
            finished.get_future().wait_for(LONG_WHILE);
            file.unlock();
        });
        held.get_future().wait();
        interruption = kind;
        bool const locked = file.lock();
        interruption = Interruption::NONE;
        finished.set_value();
        holder.join();
        CHECK(!locked);
        CHECK(isFree(file));
    }
}

TEST_CASE("open and close carry on without the lock when waiting for it is interrupted") {
    test::TempDir const dir;
    test::writeFile(dir / "a", "content");
    File file(dir.wide("a"));
    Holder holder(file);
    interruption = Interruption::ERROR;
    file.open(READ);
    CHECK(file.is_open());
    file.synchronize();
    CHECK(file.is_open());
    file.close();
    CHECK(!file.is_open());
    interruption = Interruption::NONE;
    {
        Contender const contender(file);
        CHECK(contender.waits());
        holder.letGo();
    }
    CHECK(isFree(file));
}

TEST_CASE("open, close and synchronize wait for the lock and release it") {
    struct {
        char const* label;
        std::function<void(File&)> operation;
        bool open; ///< before
    } const rows[] = {{"open", [](File& file) { file.open(READ); }, false},
                      {"close", [](File& file) { file.close(); }, true},
                      {"synchronize", [](File& file) { file.synchronize(); }, true}};
    for (auto const& row : rows) {
        CAPTURE(row.label);
        test::TempDir const dir;
        test::writeFile(dir / "a", "content");
        File file(dir.wide("a"));
        if (row.open) file.open(READ);
        Holder holder(file);
        std::future<void> done = std::async(std::launch::async, [&] { row.operation(file); });
        CHECK(done.wait_for(SHORT_WHILE) == std::future_status::timeout);
        holder.letGo();
        CHECK(done.wait_for(LONG_WHILE) == std::future_status::ready);
        done.get();
        CHECK(isFree(file));
    }
}

TEST_CASE("the thread that holds the lock can open, close and synchronize and still holds it") {
    test::TempDir const dir;
    File file(dir.wide("a"));
    CHECK(file.lock());
    file.open(READ | WRITE);
    file.synchronize();
    file.close();
    CHECK(complaint([&] { file.open(READ | 4); }) == "<nothing>");
    file.close();
    CHECK(complaint([&] { file.open(0); }) == NOT_OPENED);
    {
        Contender const contender(file);
        CHECK(contender.waits());
        CHECK(file.unlock());
    }
    CHECK(isFree(file));
}

TEST_CASE("open holds the lock as long as the system takes to open the file") {
    test::TempDir const dir;
    REQUIRE(::mkfifo((dir / "pipe").c_str(), 0600) == 0);
    File file(dir.wide("pipe"));
    std::future<void> opened = std::async(std::launch::async, [&] { file.open(READ); });
    REQUIRE(opened.wait_for(SHORT_WHILE) == std::future_status::timeout);
    {
        Contender const contender(file);
        CHECK(contender.waits());
        // The reader gets on when there is a writer.
        std::ofstream writer(dir / "pipe");
        opened.get();
    }
    CHECK(file.is_open());
    CHECK(isFree(file));
}

TEST_CASE("close holds the lock as long as writing out takes") {
    test::TempDir const dir;
    REQUIRE(::mkfifo((dir / "pipe").c_str(), 0600) == 0);
    int const end = ::open((dir / "pipe").c_str(), O_RDWR | O_NONBLOCK | O_CLOEXEC);
    REQUIRE(end >= 0);
    std::string const page(4096, 'p');
    while (::write(end, page.data(), page.size()) > 0) continue;

    File file(dir.wide("pipe"));
    file.open(WRITE);
    file << "one more";
    std::future<void> closed = std::async(std::launch::async, [&] { file.close(); });
    REQUIRE(closed.wait_for(SHORT_WHILE) == std::future_status::timeout);
    {
        Contender const contender(file);
        CHECK(contender.waits());
        char sink[4096];
        while (::read(end, sink, sizeof sink) > 0 ||
               closed.wait_for(std::chrono::milliseconds(1)) != std::future_status::ready)
            continue;
        closed.get();
    }
    ::close(end);
    CHECK(!file.is_open());
    CHECK(isFree(file));
}

TEST_CASE("a thread cancelled while it waits for the lock ends, and the process carries on") {
    test::TempDir const dir;
    test::writeFile(dir / "a", "content");
    struct {
        char const* label;
        std::function<void(File&)> operation;
    } const rows[] = {{"lock", [](File& file) { file.lock(); }},
                      {"open", [](File& file) { file.open(READ); }},
                      {"close", [](File& file) { file.close(); }},
                      {"synchronize", [](File& file) { file.synchronize(); }}};
    for (auto const& row : rows) {
        CAPTURE(row.label);
        test::Outcome const outcome = test::inChild([&] {
            File file(dir.wide("a"));
            file.open(READ);
            file.lock();
            bool const cancelled = test::endsCancelled([&] { row.operation(file); },
                                                       [](pthread_t thread) {
                                                           std::this_thread::sleep_for(SHORT_WHILE);
                                                           ::pthread_cancel(thread);
                                                       });
            if (!cancelled) return 1;
            file.unlock();
            return isFree(file) && file.is_open() && contentOf(file) == "content" ? 0 : 2;
        });
        CHECK(outcome.exitCode == 0);
        CHECK(outcome.signal == 0);
    }
}

// ---- Destruction

TEST_CASE("the destructor writes out and closes") {
    test::TempDir const dir;
    {
        File file(dir.wide("a"));
        file.open(WRITE);
        file << "content";
    }
    CHECK(test::readFile(dir / "a") == "content");
}

TEST_CASE("a file can be destroyed as the stream that it is") {
    test::TempDir const dir;
    for (char const* name : {"a", "b", "c"}) {
        auto file = std::make_unique<File>(dir.wide(name));
        file->open(WRITE);
        *file << "content";
        if (*name == 'a') std::unique_ptr<std::fstream>(std::move(file)).reset();
        if (*name == 'b') std::unique_ptr<std::ostream>(std::move(file)).reset();
        if (*name == 'c') std::unique_ptr<std::istream>(std::move(file)).reset();
        CHECK(test::readFile(dir / name) == "content");
    }
}

TEST_CASE("the destructor of a file does not call overrides") {
    struct Counting : File {
        Counting(std::wstring const& name, int& calls) : File(name), calls_(calls) {}
        void close() override {
            ++calls_;
            File::close();
        }
        int& calls_;
    };
    test::TempDir const dir;
    int calls = 0;
    {
        Counting file(dir.wide("a"), calls);
        file.open(WRITE);
        file << "content";
    }
    CHECK(calls == 0);
    CHECK(test::readFile(dir / "a") == "content");
}

TEST_CASE("the destructor of a closed file touches nothing") {
    test::TempDir const dir;
    { File const file(dir.wide("a")); }
    CHECK(!isThere(dir / "a"));
    test::writeFile(dir / "a", "content");
    {
        File file(dir.wide("a"));
        file.open(READ | WRITE);
        file.close();
        file.setMode(WRITE);
    }
    CHECK(test::readFile(dir / "a") == "content");
}

TEST_CASE("the destructor lets no exception out") {
    struct {
        char const* label;
        wchar_t const* name;
        bool closed;
    } const rows[] = {{"a file that cannot be written out", L"/dev/full", false},
                      {"a file that can", L"/dev/null", false},
                      {"a closed file", L"/dev/null", true}};
    for (auto const& row : rows) {
        for (std::ios_base::iostate const mask :
             {static_cast<std::ios_base::iostate>(~0), FAIL, FAIL | BAD | END, GOOD}) {
            CAPTURE(row.label);
            CAPTURE(static_cast<long>(mask));
            test::Outcome const outcome = test::inChild([&] {
                {
                    File file(row.name);
                    file.open(WRITE);
                    file << "more than nothing";
                    if (row.closed) file.close();
                    file.exceptions(mask);
                }
                return 0;
            });
            CHECK(outcome.exitCode == 0);
            CHECK(outcome.signal == 0);
        }
    }
}

TEST_CASE("a cancellation that is due waits until the destructor has written out") {
    test::TempDir const dir;
    test::Outcome const outcome = test::inChild([&] {
        bool const cancelled = test::endsCancelled(
            [&] {
                {
                    File file(dir.wide("a"));
                    file.open(WRITE);
                    file << "content";
                    ::pthread_cancel(::pthread_self());
                }
                ::pthread_testcancel();
            },
            [](pthread_t) {});
        return cancelled ? 0 : 1;
    });
    CHECK(outcome.exitCode == 0);
    CHECK(outcome.signal == 0);
    CHECK(test::readFile(dir / "a") == "content");
}

// ---- Operations on whole files

TEST_CASE("exists is true of any kind of entry that can be reached") {
    test::TempDir const dir;
    test::writeFile(dir / "file", "content");
    test::writeFile(dir / "without permissions", "content");
    REQUIRE(::chmod((dir / "without permissions").c_str(), 0) == 0);
    std::filesystem::create_directories(dir / "directory");
    REQUIRE(::mkfifo((dir / "pipe").c_str(), 0600) == 0);
    std::filesystem::create_symlink("file", dir / "link");
    std::filesystem::create_symlink("directory", dir / "link to directory");
    std::filesystem::create_symlink("none", dir / "dangling");
    std::filesystem::create_symlink("loop", dir / "loop");

    struct {
        char const* name;
        bool exists;
    } const rows[] = {{"file", true},        {"without permissions", true},
                      {"directory", true},   {"directory/", true},
                      {"directory/.", true}, {"pipe", true},
                      {"link", true},        {"link to directory/", true},
                      {"dangling", false},   {"loop", false},
                      {"none", false},       {"none/file", false},
                      {"file/", false},      {"file/none", false},
                      {"FILE", false}};
    for (auto const& row : rows) {
        CAPTURE(row.name);
        CHECK(File::exists(dir.wide(row.name)) == row.exists);
    }
    CHECK(File::exists(L"/dev/null"));
    CHECK(File::exists(L"/"));
    CHECK(!File::exists(L""));
    CHECK(!File::exists(dir.wide(std::string(300, 'n'))));
    CHECK(!File::exists(dir.wide(std::string(5000, 'n'))));
}

TEST_CASE("the operations take the UTF-8 form of their paths, up to the first NUL") {
    test::TempDir const dir;
    std::wstring const name = dir.wide("") + L"gr\u00FC\u00DFe \u20AC\U0001F600";
    std::wstring const other = dir.wide("") + std::wstring(L"o\u0308\0cut off", 10);
    std::string const bytes = dir / "gr\xC3\xBC\xC3\x9F"
                                    "e \xE2\x82\xAC\xF0\x9F\x98\x80";
    std::string const otherBytes = dir / "o\xCC\x88";

    CHECK(File::create(name));
    CHECK(isThere(bytes));
    CHECK(File::exists(name));
    CHECK(File::rename(name, other));
    CHECK(!isThere(bytes));
    CHECK(isThere(otherBytes));
    CHECK(File::exists(other));
    CHECK(File::copy(other, name));
    CHECK(test::readFile(bytes) != "");
    CHECK(File::remove(other));
    CHECK(!isThere(otherBytes));
    CHECK(!File::exists(other));
}

TEST_CASE("relative paths of the operations belong to the working directory") {
    test::TempDir const dir;
    test::Outcome const outcome = test::inChild([&] {
        if (::chdir(dir.path().c_str()) != 0) return 1;
        if (!File::create(L"a") || !File::exists(L"a")) return 2;
        if (!File::rename(L"a", L"b") || !File::copy(L"b", L"c")) return 3;
        return File::create(L"d") && File::remove(L"d") ? 0 : 4;
    });
    CHECK(outcome.exitCode == 0);
    CHECK(!isThere(dir / "a"));
    CHECK(isThere(dir / "b"));
    CHECK(isThere(dir / "c"));
    CHECK(!isThere(dir / "d"));
}

TEST_CASE("rename moves a file and tells whether it is at its new place only") {
    test::TempDir const dir;
    std::filesystem::create_directories(dir / "directory");
    test::writeFile(dir / "a", "content");
    CHECK(File::rename(dir.wide("a"), dir.wide("b")));
    CHECK(!isThere(dir / "a"));
    CHECK(test::readFile(dir / "b") == "content");
    CHECK(File::rename(dir.wide("b"), dir.wide("directory/c")));
    CHECK(test::readFile(dir / "directory/c") == "content");
    CHECK(File::rename(dir.wide("directory"), dir.wide("moved")));
    CHECK(test::readFile(dir / "moved/c") == "content");
}

TEST_CASE("rename replaces an existing target") {
    test::TempDir const dir;
    test::writeFile(dir / "a", "new");
    test::writeFile(dir / "b", "old and longer");
    CHECK(File::rename(dir.wide("a"), dir.wide("b")));
    CHECK(!isThere(dir / "a"));
    CHECK(test::readFile(dir / "b") == "new");
}

TEST_CASE("rename of a missing source is true when the target is there, as only that is asked") {
    test::TempDir const dir;
    CHECK(!File::rename(dir.wide("a"), dir.wide("b")));
    CHECK(!isThere(dir / "b"));
    test::writeFile(dir / "b", "content");
    CHECK(File::rename(dir.wide("a"), dir.wide("b")));
    CHECK(test::readFile(dir / "b") == "content");
    CHECK(File::rename(L"", dir.wide("b")));
}

TEST_CASE("rename is false when it cannot be done") {
    test::TempDir const dir;
    test::writeFile(dir / "a", "content");
    std::filesystem::create_directories(dir / "full/directory");

    CHECK(!File::rename(dir.wide("a"), dir.wide("none/a")));
    CHECK(!File::rename(dir.wide("a"), dir.wide("full")));
    CHECK(!File::rename(dir.wide("full"), dir.wide("a")));
    CHECK(!File::rename(dir.wide("full"), dir.wide("full/directory/full")));
    CHECK(!File::rename(dir.wide("a"), L""));
    CHECK(test::readFile(dir / "a") == "content");
    CHECK(isThere(dir / "full/directory"));
}

TEST_CASE("rename is false when the source is there afterwards for another reason") {
    test::TempDir const dir;
    test::writeFile(dir / "a", "content");
    CHECK(!File::rename(dir.wide("a"), dir.wide("a")));
    // Two names of one file stay both.
    std::filesystem::create_hard_link(dir / "a", dir / "b");
    CHECK(!File::rename(dir.wide("a"), dir.wide("b")));
    CHECK(isThere(dir / "a"));
    CHECK(isThere(dir / "b"));
}

TEST_CASE("rename moves a link, and is false where that dangles") {
    test::TempDir const dir;
    test::writeFile(dir / "file", "content");
    std::filesystem::create_symlink("file", dir / "link");
    std::filesystem::create_symlink("none", dir / "dangling");
    CHECK(File::rename(dir.wide("link"), dir.wide("moved")));
    CHECK(std::filesystem::is_symlink(dir / "moved"));
    CHECK(!File::rename(dir.wide("dangling"), dir.wide("moved too")));
    CHECK(!isThere(dir / "dangling"));
    CHECK(std::filesystem::is_symlink(dir / "moved too"));
}

TEST_CASE("remove deletes files, empty directories and links") {
    test::TempDir const dir;
    test::writeFile(dir / "file", "content");
    std::filesystem::create_directories(dir / "directory");
    REQUIRE(::mkfifo((dir / "pipe").c_str(), 0600) == 0);
    std::filesystem::create_symlink("none", dir / "dangling");
    for (char const* name : {"file", "directory", "pipe", "dangling"}) {
        CAPTURE(name);
        CHECK(File::remove(dir.wide(name)));
        CHECK(!isThere(dir / name));
    }
}

TEST_CASE("remove deletes what is read-only") {
    test::TempDir const dir;
    for (mode_t const mode : {0444U, 0400U, 0000U}) {
        CAPTURE(mode);
        test::writeFile(dir / "file", "content");
        std::filesystem::create_directories(dir / "directory");
        REQUIRE(::chmod((dir / "file").c_str(), mode) == 0);
        REQUIRE(::chmod((dir / "directory").c_str(), mode) == 0);
        CHECK(File::remove(dir.wide("file")));
        CHECK(File::remove(dir.wide("directory")));
        CHECK(!isThere(dir / "file"));
        CHECK(!isThere(dir / "directory"));
    }
}

TEST_CASE("remove of what is missing is true") {
    test::TempDir const dir;
    test::writeFile(dir / "file", "content");
    for (char const* name : {"none", "none/none", "file/none", "file/"}) {
        CAPTURE(name);
        CHECK(File::remove(dir.wide(name)));
    }
    CHECK(File::remove(L""));
    CHECK(test::readFile(dir / "file") == "content");
}

TEST_CASE("remove of a directory that is not empty is false and leaves it its owner's alone") {
    test::TempDir const dir;
    std::filesystem::create_directories(dir / "full");
    test::writeFile(dir / "full/file", "content");
    REQUIRE(::chmod((dir / "full").c_str(), 0755) == 0);
    REQUIRE(::chmod((dir / "full/file").c_str(), 0640) == 0);

    CHECK(!File::remove(dir.wide("full")));
    CHECK(permissions(dir / "full") == 0600);

    REQUIRE(::chmod((dir / "full").c_str(), 0700) == 0);
    CHECK(test::readFile(dir / "full/file") == "content");
    CHECK(permissions(dir / "full/file") == 0640);
}

TEST_CASE("remove deletes a link, whose target only gets other permissions") {
    test::TempDir const dir;
    test::writeFile(dir / "file", "content");
    REQUIRE(::chmod((dir / "file").c_str(), 0444) == 0);
    std::filesystem::create_directories(dir / "directory");
    std::filesystem::create_symlink("file", dir / "link");
    std::filesystem::create_symlink("directory", dir / "link to directory");

    CHECK(File::remove(dir.wide("link")));
    CHECK(!isThere(dir / "link"));
    CHECK(test::readFile(dir / "file") == "content");
    CHECK(permissions(dir / "file") == 0600);

    CHECK(File::remove(dir.wide("link to directory")));
    CHECK(!isThere(dir / "link to directory"));
    CHECK(permissions(dir / "directory") == 0600);
}

TEST_CASE("remove takes away one name of a file, the others get other permissions") {
    test::TempDir const dir;
    test::writeFile(dir / "a", "content");
    REQUIRE(::chmod((dir / "a").c_str(), 0755) == 0);
    std::filesystem::create_hard_link(dir / "a", dir / "b");
    CHECK(File::remove(dir.wide("a")));
    CHECK(test::readFile(dir / "b") == "content");
    CHECK(permissions(dir / "b") == 0600);
}

namespace {

/// What the standard library writes for a pointer.
std::string pointerText(void const* pointer) {
    std::ostringstream os;
    os.imbue(std::locale::classic());
    os << pointer;
    return os.str();
}

/// Whether a text is what the standard library writes for some pointer that is not null.
bool isPointerText(std::string const& text) {
    std::istringstream is(text);
    is.imbue(std::locale::classic());
    void* pointer = nullptr;
    return is >> pointer && pointer != nullptr && pointerText(pointer) == text;
}

} // namespace

TEST_CASE("copy writes the text of a pointer, never the bytes of the source") {
    test::TempDir const dir;
    for (std::string const& content : {std::string(), std::string("content"), std::string("0"),
                                       std::string(100000, 'c'), std::string("\0\r\n\xFF", 4)}) {
        test::writeFile(dir / "a", content);
        std::filesystem::remove(dir / "b");
        CHECK(File::copy(dir.wide("a"), dir.wide("b")));
        CHECK(isPointerText(test::readFile(dir / "b")));
        CHECK((test::readFile(dir / "a") == content));
    }
}

TEST_CASE("copy empties its target first") {
    test::TempDir const dir;
    test::writeFile(dir / "a", "content");
    test::writeFile(dir / "b", std::string(100000, 'b'));
    CHECK(File::copy(dir.wide("a"), dir.wide("b")));
    CHECK(isPointerText(test::readFile(dir / "b")));
}

TEST_CASE("copy of a missing source writes the text of a null pointer and is false") {
    test::TempDir const dir;
    test::writeFile(dir / "b", "content");
    for (char const* target : {"b", "c"}) {
        CAPTURE(target);
        CHECK(!File::copy(dir.wide("a"), dir.wide(target)));
        CHECK(test::readFile(dir / target) == pointerText(nullptr));
        CHECK(!isThere(dir / "a"));
    }
    CHECK(!File::copy(L"", dir.wide("d")));
    CHECK(test::readFile(dir / "d") == pointerText(nullptr));
}

TEST_CASE("copy to a place where no file can be is false") {
    test::TempDir const dir;
    test::writeFile(dir / "a", "content");
    CHECK(!File::copy(dir.wide("a"), dir.wide("none/b")));
    CHECK(!File::copy(dir.wide("a"), dir.wide("a/b")));
    CHECK(!File::copy(dir.wide("a"), L""));
    CHECK(!File::copy(dir.wide("none"), dir.wide("none/b")));
    CHECK(test::readFile(dir / "a") == "content");
}

TEST_CASE("copy is true when both are there afterwards, even if nothing was written") {
    test::TempDir const dir;
    test::writeFile(dir / "a", "content");
    std::filesystem::create_directories(dir / "directory");
    CHECK(File::copy(dir.wide("a"), dir.wide("directory")));
    CHECK(std::filesystem::is_empty(dir / "directory"));
    CHECK(File::copy(dir.wide("a"), L"/dev/full"));
}

TEST_CASE("copy of a file to itself replaces its content") {
    test::TempDir const dir;
    test::writeFile(dir / "a", "content");
    std::filesystem::create_symlink("b", dir / "link");
    CHECK(File::copy(dir.wide("a"), dir.wide("a")));
    CHECK(isPointerText(test::readFile(dir / "a")));
    // The source is opened first, so a missing one is missing though it is the target.
    CHECK(File::copy(dir.wide("b"), dir.wide("b")));
    CHECK(test::readFile(dir / "b") == pointerText(nullptr));
    CHECK(File::copy(dir.wide("link"), dir.wide("b")));
    CHECK(isPointerText(test::readFile(dir / "b")));
}

TEST_CASE("copy gives its target the permissions of any new file") {
    test::TempDir const dir;
    test::writeFile(dir / "new", "");
    test::writeFile(dir / "a", "content");
    REQUIRE(::chmod((dir / "a").c_str(), 0751) == 0);
    CHECK(File::copy(dir.wide("a"), dir.wide("b")));
    CHECK(permissions(dir / "b") == permissions(dir / "new"));
    CHECK(permissions(dir / "a") == 0751);
}

TEST_CASE("what copy writes does not depend on the global locale") {
    struct Digits : std::numpunct<char> {
        char do_thousands_sep() const override { return '.'; }
        std::string do_grouping() const override { return "\1"; }
    };
    struct Output : std::num_put<char> {
        iter_type do_put(iter_type at, std::ios_base&, char, void const*) const override {
            *at++ = '!';
            return at;
        }
    };
    class Global {
    public:
        explicit Global(std::locale const& locale) : before_(std::locale::global(locale)) {}
        ~Global() { std::locale::global(before_); }

    private:
        std::locale before_;
    };
    test::TempDir const dir;
    test::writeFile(dir / "a", "content");
    for (bool const output : {false, true}) {
        CAPTURE(output);
        std::locale locale(std::locale::classic(), new Digits);
        if (output) locale = std::locale(locale, new Output);
        {
            Global const global(locale);
            CHECK(File::copy(dir.wide("a"), dir.wide("b")));
            CHECK(!File::copy(dir.wide("none"), dir.wide("c")));
        }
        CHECK(isPointerText(test::readFile(dir / "b")));
        CHECK(test::readFile(dir / "c") == pointerText(nullptr));
    }
}

TEST_CASE("create makes an empty file") {
    test::TempDir const dir;
    test::writeFile(dir / "new", "");
    CHECK(File::create(dir.wide("a")));
    CHECK(test::readFile(dir / "a") == "");
    CHECK(permissions(dir / "a") == permissions(dir / "new"));
}

TEST_CASE("create empties the file that is there and keeps its permissions") {
    test::TempDir const dir;
    test::writeFile(dir / "a", "content");
    REQUIRE(::chmod((dir / "a").c_str(), 0751) == 0);
    CHECK(File::create(dir.wide("a")));
    CHECK(test::readFile(dir / "a") == "");
    CHECK(permissions(dir / "a") == 0751);
}

TEST_CASE("create through a link empties or creates what it names") {
    test::TempDir const dir;
    test::writeFile(dir / "file", "content");
    std::filesystem::create_symlink("file", dir / "link");
    std::filesystem::create_symlink("new", dir / "dangling");
    CHECK(File::create(dir.wide("link")));
    CHECK(test::readFile(dir / "file") == "");
    CHECK(File::create(dir.wide("dangling")));
    CHECK(test::readFile(dir / "new") == "");
}

TEST_CASE("create is false where no file can be, and true of a directory, which exists") {
    test::TempDir const dir;
    test::writeFile(dir / "file", "content");
    std::filesystem::create_directories(dir / "directory");
    CHECK(!File::create(dir.wide("none/a")));
    CHECK(!File::create(dir.wide("file/a")));
    CHECK(!File::create(dir.wide(std::string(300, 'n'))));
    CHECK(!File::create(L""));
    CHECK(File::create(dir.wide("directory")));
    CHECK(std::filesystem::is_directory(dir / "directory"));
    CHECK(test::readFile(dir / "file") == "content");
}

TEST_CASE("the operations leave a stream's exceptions and open files alone") {
    test::TempDir const dir;
    File file(dir.wide("a"));
    file.open(READ | WRITE);
    file << "content" << std::flush;
    // While it is open it can be renamed and removed; the stream keeps its file.
    CHECK(File::rename(dir.wide("a"), dir.wide("b")));
    CHECK(contentOf(file) == "content");
    CHECK(File::remove(dir.wide("b")));
    CHECK(contentOf(file) == "content");
    CHECK(file.is_open());
}
