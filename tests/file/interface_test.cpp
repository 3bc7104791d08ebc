// How the file classes meet a caller's code: what converts to them, what does not compile, and what
// may be called while another thread is at work.
#include <doctest/doctest.h>

#include <atomic>
#include <ios>
#include <string>
#include <thread>
#include <type_traits>
#include <utility>

#include <koru/datafile.h>
#include <koru/event.h>
#include <koru/initializationfile.h>
#include <koru/logfile.h>
#include <koru/propertyfile.h>

#include "support/structuredfile.h"
#include "support/tempdir.h"

using Koru::DataFile;
using Koru::File;
using Koru::InitializationFile;
using Koru::LogFile;
using Koru::PropertyFile;

namespace {

template <class Object, class Mode, class = void>
struct OpensWith : std::false_type {};

template <class Object, class Mode>
struct OpensWith<Object, Mode, decltype(std::declval<Object&>().open(std::declval<Mode>()), void())>
    : std::true_type {};

} // namespace

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

TEST_CASE("the mode and the name may be asked for and the mode set while a file is opened") {
    test::TempDir const directory;
    std::string const path = directory / "file";
    test::writeFile(path, test::Flat::bytes(0, 10));
    PropertyFile file(path);
    std::atomic<bool> done{false};
    std::thread other([&] {
        unsigned long seen = 0;
        while (!done) {
            seen |= file.getMode();
            if (file.getName().empty()) seen |= 0x100;
            file.setMode(File::READ);
        }
        CHECK((seen & ~File::READ) == 0);
    });
    for (int i = 0; i < 200; ++i) {
        file.open(File::READ);
        file.close();
    }
    done = true;
    other.join();
}
