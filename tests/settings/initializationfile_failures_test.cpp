// The sectioned settings file when the system fails it, and when several threads use it.
#include <doctest/doctest.h>

#include <grp.h>
#include <pthread.h>
#include <sched.h>
#include <signal.h>
#include <sys/mount.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/uio.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <cerrno>
#include <chrono>
#include <cstdarg>
#include <cstddef>
#include <cstdio>
#include <exception>
#include <filesystem>
#include <functional>
#include <stdexcept>
#include <string>
#include <thread>
#include <vector>

#include <koru/initializationfile.h>

#include "support/settingsfixture.h"
#include "support/settingsmodel.h"
#include "support/subprocess.h"
#include "support/tempdir.h"
#include "support/throws.h"

using Koru::InitializationFile;
using test::checkSame;
using test::drain;
using test::messageOf;
using test::READ;
using test::READ_WRITE;
using test::Settings;
using test::SettingsPlace;
using test::WRITE;
using test::written;

// The reading and writing system calls of this executable and the libraries it loaded pass through
// here, so that a test can make them fail or transfer less than they were asked for.
namespace {

std::atomic<int> readsBeforeFailure{-1};   // -1: none fails
std::atomic<int> writesBeforeFailure{-1};  // -1: none fails
std::atomic<std::size_t> transferLimit{0}; // bytes at once; 0: no limit
std::atomic<int> failedCalls{0};

bool _failsNow(std::atomic<int>& callsBeforeFailure, int error) {
    if (callsBeforeFailure < 0 || callsBeforeFailure-- > 0) return false;
    callsBeforeFailure = 0; // every later one fails as well
    ++failedCalls;
    errno = error;
    return true;
}

std::size_t _limited(std::size_t count) {
    std::size_t const limit = transferLimit;
    return limit != 0 && count > limit ? limit : count;
}

} // namespace

extern "C" ssize_t read(int fd, void* buffer, size_t count) {
    if (_failsNow(readsBeforeFailure, EIO)) return -1;
    return static_cast<ssize_t>(::syscall(SYS_read, fd, buffer, _limited(count)));
}

extern "C" ssize_t write(int fd, void const* buffer, size_t count) {
    if (_failsNow(writesBeforeFailure, ENOSPC)) return -1;
    return static_cast<ssize_t>(::syscall(SYS_write, fd, buffer, _limited(count)));
}

extern "C" ssize_t writev(int fd, iovec const* pieces, int count) {
    if (_failsNow(writesBeforeFailure, ENOSPC)) return -1;
    if (transferLimit != 0 && count > 0) {
        iovec first = pieces[0];
        if (first.iov_len == 0 && count > 1) first = pieces[1];
        first.iov_len = _limited(first.iov_len);
        return static_cast<ssize_t>(::syscall(SYS_writev, fd, &first, 1));
    }
    return static_cast<ssize_t>(::syscall(SYS_writev, fd, pieces, count));
}

namespace {

/// A report that a child process writes for its parent.
__attribute__((format(printf, 1, 2))) void say(char const* format, ...) {
    va_list arguments;
    va_start(arguments, format);
    std::vprintf(format, arguments);
    va_end(arguments);
}

} // namespace

// ------------------------------------------------------------------------------------ the failures

TEST_CASE("a close that cannot open the file again keeps the table and leaves the file closed") {
    SettingsPlace const place;
    std::string const folder = place.directory() / "folder";
    std::string const path = folder + "/settings.ini";
    std::filesystem::create_directory(folder);
    InitializationFile file(path);
    file.open(READ_WRITE);
    file.setValue(L"s", L"b", L"1");
    file.setValue(L"s", L"a", L"2");
    SUBCASE("its directory is gone") { std::filesystem::remove_all(folder); }
    SUBCASE("a directory with content is in its place") {
        std::filesystem::remove(path);
        std::filesystem::create_directories(path + "/content");
    }
    CHECK(messageOf<std::runtime_error>([&] { file.close(); }) == "failed to open file.");
    CHECK(!file.is_open());
    checkSame(file.getValue(L"s", L"a"), L"2");
    // The table was sorted before anything else happened.
    checkSame(drain(file), {{L"s", L"a", L"2"}, {L"s", L"b", L"1"}});
}

TEST_CASE("a destructor that cannot open the file again keeps the exception inside") {
    test::Outcome const outcome = test::inChild([] {
        test::TempDir const directory;
        std::string const folder = directory / "folder";
        std::filesystem::create_directory(folder);
        {
            InitializationFile file(folder + "/settings.ini");
            file.open(WRITE);
            file.setValue(L"s", L"k", L"v");
            std::filesystem::remove_all(folder);
        }
        return 42;
    });
    CHECK(outcome.exitCode == 42);
    CHECK(outcome.out == "");
}

TEST_CASE("a directory cannot be read and cannot be opened for writing") {
    test::TempDir const directory;
    std::string const path = directory / "folder";
    std::filesystem::create_directory(path);
    InitializationFile file(path);
    CHECK(messageOf<std::runtime_error>([&] { file.open(READ); }) == "failed to read from file");
    CHECK(file.is_open());
    CHECK(file.getMode() == READ);
    CHECK(file.enumerateSections().empty());
    file.close();
    file.clear();
    CHECK(messageOf<std::runtime_error>([&] { file.open(READ_WRITE); }) == "failed to open file.");
    CHECK(messageOf<std::runtime_error>([&] { file.open(WRITE); }) == "failed to open file.");
    CHECK(std::filesystem::is_directory(path));
}

TEST_CASE("a file whose first read fails is not an empty file") {
    InitializationFile file(std::string("/proc/self/mem"));
    CHECK(messageOf<std::runtime_error>([&] { file.open(READ); }) == "failed to read from file");
    CHECK(file.is_open());
    CHECK(file.getMode() == READ);
    CHECK(file.enumerateSections().empty());
}

TEST_CASE("a read that fails midway is not the end of the file") {
    SettingsPlace const place;
    std::string bytes = "[s]\n";
    std::vector<std::wstring> keys;
    for (int i = 20000; i > 0; --i) {
        bytes += "key" + std::to_string(i) + "=a value of some length\n";
        keys.push_back(L"key" + std::to_wstring(i));
    }
    place.write(bytes);
    int failures = 0;
    for (;; ++failures) {
        CAPTURE(failures);
        InitializationFile file(place.path());
        readsBeforeFailure = failures;
        std::string const message = messageOf<std::runtime_error>([&] { file.open(READ); });
        readsBeforeFailure = -1;
        if (message == "<nothing>") break;
        CHECK(message == "failed to read from file");
        CHECK(file.is_open());
        CHECK(file.getMode() == READ);
        // What was read so far is held, in the order of the file.
        std::vector<std::wstring> const read = file.enumerateKeys(L"s");
        CHECK(read.size() <= keys.size());
        CHECK(std::equal(read.begin(), read.end(), keys.begin()));
    }
    CHECK(failures > 0);
    // Once more with nothing in the way.
    InitializationFile file(place.path());
    file.open(READ);
    CHECK(file.enumerateKeys(L"s").size() == keys.size());
}

TEST_CASE("a file that could not be read is kept by taking the write bit away before close") {
    SettingsPlace const place;
    place.write("[s]\nk=v\n");
    InitializationFile file(place.path());
    readsBeforeFailure = 0;
    std::string const message = messageOf<std::runtime_error>([&] { file.open(READ_WRITE); });
    readsBeforeFailure = -1;
    CHECK(message == "failed to read from file");
    CHECK(file.getMode() == READ_WRITE);
    CHECK(place.bytes() == "[s]\nk=v\n");
    file.setMode(READ);
    file.close();
    CHECK(place.bytes() == "[s]\nk=v\n");
}

TEST_CASE("reads and writes that transfer little at a time make no difference") {
    SettingsPlace const place;
    Settings settings;
    for (int i = 0; i < 300; ++i) {
        settings.push_back({L"section " + std::to_wstring(i % 7), L"key " + std::to_wstring(i),
                            std::wstring(static_cast<std::size_t>(i) % 50, L'\u00E9')});
    }
    test::sortSettings(settings);
    for (std::size_t const limit : {1UL, 7UL, 1000UL}) {
        CAPTURE(limit);
        transferLimit = limit;
        std::string const bytes = written(settings);
        Settings const read = test::loaded(place, bytes);
        transferLimit = 0;
        CHECK(bytes == test::settingsText(settings));
        checkSame(read, settings);
    }
}

namespace {

/// What a caller sees of a file with one long entry.
std::string stateOf(InitializationFile& file) {
    return std::string(file.is_open() ? "open" : "closed") + ", mode " +
           std::to_string(file.getMode()) + ", value of " +
           std::to_string(file.getValue(L"s", L"k").size());
}

} // namespace

TEST_CASE("a write that fails leaves the table intact, the file open and the mode unchanged") {
    SettingsPlace const place;
    for (std::size_t const size : {1UL, 100UL, 5000UL, 300000UL}) {
        for (bool const synchronize : {false, true}) {
            for (unsigned long const mode : {WRITE, READ_WRITE}) {
                CAPTURE(size);
                CAPTURE(synchronize);
                CAPTURE(mode);
                std::string const value(size, 'x');
                std::string const complete = "[s]\nk=" + value + "\n";
                std::string const open =
                    "open, mode " + std::to_string(mode) + ", value of " + std::to_string(size);
                place.write("[s]\nk=old value\n");
                InitializationFile file(place.path());
                int failures = 0;
                for (;; ++failures) {
                    CAPTURE(failures);
                    if (!file.is_open()) {
                        file.open(mode);
                        file.setValue(L"s", L"k", std::wstring(size, L'x'));
                    }
                    failedCalls = 0;
                    writesBeforeFailure = failures;
                    std::string const message = messageOf<std::runtime_error>(
                        [&] { synchronize ? file.synchronize() : file.close(); });
                    writesBeforeFailure = -1;
                    if (failedCalls == 0) {
                        CHECK(message == "<nothing>");
                        break;
                    }
                    CHECK(message == "failed to write to file");
                    CHECK(stateOf(file) == open);
                    std::string const left = place.bytes();
                    CHECK(complete.compare(0, left.size(), left) == 0);
                }
                CHECK(failures > 0);
                if (!synchronize) CHECK(place.bytes() == complete);
                if (synchronize && mode == READ_WRITE) CHECK(stateOf(file) == open);
            }
        }
    }
}

TEST_CASE("after a write that failed the next close writes everything") {
    SettingsPlace const place;
    InitializationFile file(place.path());
    file.open(READ_WRITE);
    for (int i = 0; i < 2000; ++i) {
        file.setValue(L"s" + std::to_wstring(i % 10), L"k" + std::to_wstring(i), L"some value");
    }
    transferLimit = 10000;
    writesBeforeFailure = 1; // after the first 10000 bytes
    std::string const message = messageOf<std::runtime_error>([&] { file.close(); });
    writesBeforeFailure = -1;
    transferLimit = 0;
    CHECK(message == "failed to write to file");
    file.close();
    InitializationFile again(place.path());
    again.open(READ);
    for (int i = 0; i < 2000; ++i) {
        checkSame(again.getValue(L"S" + std::to_wstring(i % 10), L"K" + std::to_wstring(i)),
                  L"some value");
    }
}

namespace {

/// Limits the size of files that this process writes. Only for child processes.
void limitFileSize(rlim_t bytes) {
    ::signal(SIGXFSZ, SIG_IGN);
    rlimit limit = {};
    ::getrlimit(RLIMIT_FSIZE, &limit);
    limit.rlim_cur = bytes;
    ::setrlimit(RLIMIT_FSIZE, &limit);
}

} // namespace

TEST_CASE("a file-size limit is a failure to write") {
    SettingsPlace const place;
    for (std::size_t const size : {1UL, 100UL, 200000UL}) {
        for (rlim_t const limit : {rlim_t(0), rlim_t(1), rlim_t(5)}) {
            CAPTURE(size);
            CAPTURE(limit);
            std::string const complete = "[s]\nk=" + std::string(size, 'x') + "\n";
            test::Outcome const outcome = test::inChild([&] {
                InitializationFile file(place.path());
                file.open(READ_WRITE);
                file.setValue(L"s", L"k", std::wstring(size, L'x'));
                limitFileSize(limit);
                say("%s; ", messageOf<std::runtime_error>([&] { file.close(); }).c_str());
                say("%s; ", stateOf(file).c_str());
                std::string const left = place.bytes();
                say("%s; ", complete.compare(0, left.size(), left) == 0 ? "prefix" : "other");
                say("%s; ", messageOf<std::runtime_error>([&] { file.synchronize(); }).c_str());
                say("%s; ", stateOf(file).c_str());
                limitFileSize(RLIM_INFINITY);
                say("%s; ", messageOf<std::runtime_error>([&] { file.synchronize(); }).c_str());
                say("%s; ", stateOf(file).c_str());
                say("%s", place.bytes() == complete ? "complete" : "incomplete");
                return 0;
            });
            CHECK(outcome.exitCode == 0);
            std::string const state = "open, mode 3, value of " + std::to_string(size) + "; ";
            CHECK(outcome.out == "failed to write to file; " + state + "prefix; " +
                                     "failed to write to file; " + state + "<nothing>; " + state +
                                     "complete");
        }
    }
}

TEST_CASE("a destructor that cannot write does not end the process") {
    SettingsPlace const place;
    for (std::size_t const size : {1UL, 200000UL}) {
        test::Outcome const outcome = test::inChild([&] {
            limitFileSize(2);
            {
                InitializationFile file(place.path());
                file.open(WRITE);
                file.setValue(L"s", L"k", std::wstring(size, L'x'));
            }
            {
                InitializationFile file(place.path());
                file.open(WRITE);
                file.setValue(L"s", L"k", std::wstring(size, L'x'));
                if (messageOf<std::runtime_error>([&] { file.close(); }) == "<nothing>") return 1;
            }
            return 42;
        });
        CHECK(outcome.exitCode == 42);
        CHECK(outcome.out == "");
    }
}

namespace {

int const CANNOT_MOUNT = 77;

/// A mount for the time of a scope, in a name space of this process's own where that can be had.
/// Only for child processes, and only onto something in a test's own directory.
class Mount {
public:
    Mount(char const* source, std::string const& target, char const* type, unsigned long flags,
          char const* options)
        : target_(target) {
        if (::unshare(CLONE_NEWNS) == 0) {
            static_cast<void>(::mount(nullptr, "/", nullptr, MS_REC | MS_PRIVATE, nullptr));
        }
        mounted_ = ::mount(source, target.c_str(), type, flags, options) == 0;
    }
    Mount(Mount const&) = delete;
    Mount& operator=(Mount const&) = delete;
    ~Mount() {
        if (mounted_) ::umount2(target_.c_str(), MNT_DETACH);
    }
    bool done() const { return mounted_; }

private:
    std::string target_;
    bool mounted_;
};

} // namespace

TEST_CASE("a full disk is a failure to write") {
    SettingsPlace const place;
    std::string const small = place.directory() / "small";
    std::filesystem::create_directory(small);
    test::Outcome const outcome = test::inChild([&] {
        Mount const disk("none", small, "tmpfs", 0, "size=64k");
        if (!disk.done()) return CANNOT_MOUNT;
        std::string const path = small + "/settings.ini";
        test::writeFile(path, "[s]\nk=old\n");
        InitializationFile file(path);
        file.open(READ_WRITE);
        file.setValue(L"s", L"k", std::wstring(100000, L'x'));
        say("%s; ", messageOf<std::runtime_error>([&] { file.close(); }).c_str());
        say("%s; ", stateOf(file).c_str());
        say("%s; ", messageOf<std::runtime_error>([&] { file.synchronize(); }).c_str());
        say("%s; ", stateOf(file).c_str());
        file.setValue(L"s", L"k", L"short");
        say("%s; ", messageOf<std::runtime_error>([&] { file.synchronize(); }).c_str());
        say("%s; ", stateOf(file).c_str());
        file.setValue(L"s", L"k", std::wstring(100000, L'x'));
        return 0; // the destructor meets the full disk once more
    });
    if (outcome.exitCode == CANNOT_MOUNT) {
        MESSAGE("no file system can be mounted here: the full disk was not tested");
        return;
    }
    CHECK(outcome.exitCode == 0);
    CHECK(outcome.out == "failed to write to file; open, mode 3, value of 100000; "
                         "failed to write to file; open, mode 3, value of 100000; "
                         "<nothing>; open, mode 3, value of 5; ");
}

namespace {

/// Old content, and the value that is to replace it: shorter, equally long, longer, none at all.
struct Replacement {
    std::string oldBytes;
    wchar_t const* newValue; // null: the table is emptied
    std::string newBytes;
};

Replacement const replacements[] = {
    {"# a comment\n[s]\nk=a rather long old value\nl=1\n", L"v", "[s]\nk=v\nl=1\n"},
    {"[s]\nk=old\nl=1\n", L"new", "[s]\nk=new\nl=1\n"},
    {"[s]\nk=v\nl=1\n", L"a rather long new value", "[s]\nk=a rather long new value\nl=1\n"},
    {"# a comment\n[s]\nk=a rather long old value\nl=1\n", nullptr, ""},
};

/// Puts the new value in and closes. For a child process: nothing is written to the terminal.
std::string replaceValue(std::string const& path, wchar_t const* value) {
    return messageOf<std::runtime_error>([&] {
        InitializationFile file(path);
        file.open(READ_WRITE);
        if (value != nullptr) {
            file.setValue(L"s", L"k", value);
        } else {
            drain(file);
        }
        file.close();
    });
}

} // namespace

TEST_CASE("a file that can be written but not deleted keeps no old tail: another file system") {
    SettingsPlace const place;
    for (Replacement const& row : replacements) {
        CAPTURE(row.newBytes);
        place.write(row.oldBytes);
        test::Outcome const outcome = test::inChild([&] {
            Mount const itself(place.path().c_str(), place.path(), nullptr, MS_BIND, nullptr);
            if (!itself.done()) return CANNOT_MOUNT;
            say("%s", replaceValue(place.path(), row.newValue).c_str());
            return 0;
        });
        if (outcome.exitCode == CANNOT_MOUNT) {
            MESSAGE("nothing can be mounted here: the undeletable file was not tested this way");
            return;
        }
        CHECK(outcome.exitCode == 0);
        CHECK(outcome.out == "<nothing>");
        CHECK(place.bytes() == row.newBytes);
    }
}

TEST_CASE("a file that can be written but not deleted keeps no old tail: a read-only directory") {
    SettingsPlace const place;
    for (Replacement const& row : replacements) {
        CAPTURE(row.newBytes);
        place.write(row.oldBytes);
        REQUIRE(::chmod(place.path().c_str(), 0666) == 0);
        REQUIRE(::chmod(place.directory().path().c_str(), 0555) == 0);
        test::Outcome const outcome = test::inChild([&] {
            // The administrator may delete everything, so become somebody else.
            unsigned const nobody = 65534;
            if (::geteuid() == 0 &&
                (::setgroups(0, nullptr) != 0 || ::setgid(nobody) != 0 || ::setuid(nobody) != 0)) {
                return 1;
            }
            say("%s", replaceValue(place.path(), row.newValue).c_str());
            return 0;
        });
        REQUIRE(::chmod(place.directory().path().c_str(), 0700) == 0);
        CHECK(outcome.exitCode == 0);
        CHECK(outcome.out == "<nothing>");
        CHECK(place.bytes() == row.newBytes);
    }
}

TEST_CASE("a pipe is read to its end") {
    test::TempDir const directory;
    std::string const path = directory / "pipe";
    REQUIRE(::mkfifo(path.c_str(), 0600) == 0);
    test::Outcome const outcome = test::inChild([&] {
        ::alarm(60);
        std::string bytes = "[s]\n";
        for (int i = 0; i < 10000; ++i) bytes += "key" + std::to_string(i) + "=value\n";
        std::thread writer([&] { test::writeFile(path, bytes + "[t]\nk=v"); });
        InitializationFile file(path);
        file.open(READ);
        writer.join();
        say("%d ", static_cast<int>(file.enumerateKeys(L"s").size()));
        say("%s ", test::shown(file.getValue(L"t", L"k")).c_str());
        file.close();
        return 0;
    });
    CHECK(outcome.exitCode == 0);
    CHECK(outcome.out == "10000 v ");
    CHECK(std::filesystem::is_fifo(path));
}

// ------------------------------------------------------------------------------- lock and threads

namespace {

struct Action {
    std::string label;
    std::function<void(InitializationFile&)> run;
};

/// Every operation that takes the lock, on a file whose path can be opened.
std::vector<Action> allOperations() {
    return {
        {"open", [](InitializationFile& f) { f.open(READ_WRITE); }},
        {"close", [](InitializationFile& f) { f.close(); }},
        {"synchronize", [](InitializationFile& f) { f.synchronize(); }},
        {"enumerateSections", [](InitializationFile& f) { f.enumerateSections(); }},
        {"createSection", [](InitializationFile& f) { f.createSection(L"n"); }},
        {"createSection that exists", [](InitializationFile& f) { f.createSection(L"s"); }},
        {"removeSection", [](InitializationFile& f) { f.removeSection(L"s"); }},
        {"enumerateKeys", [](InitializationFile& f) { f.enumerateKeys(L"s"); }},
        {"createKey", [](InitializationFile& f) { f.createKey(L"s", L"n"); }},
        {"createKey that exists", [](InitializationFile& f) { f.createKey(L"s", L"k"); }},
        {"removeKey", [](InitializationFile& f) { f.removeKey(L"s", L"k"); }},
        {"removeKey of nothing", [](InitializationFile& f) { f.removeKey(L"s", L"n"); }},
        {"getValue", [](InitializationFile& f) { f.getValue(L"s", L"k"); }},
        {"getValue of nothing", [](InitializationFile& f) { f.getValue(L"s", L"n"); }},
        {"setValue", [](InitializationFile& f) { f.setValue(L"s", L"k", L"w"); }},
        {"setValue of a new key", [](InitializationFile& f) { f.setValue(L"s", L"n", L"w"); }},
    };
}

/// Runs the action on an open file in a child process and says how it ended: "free" when another
/// thread could use the file afterwards. With the lock still held the alarm ends the child.
std::string lockAfter(Action const& action) {
    SettingsPlace const place;
    place.write("[s]\nk=v\n");
    test::Outcome const outcome = test::inChild([&] {
        ::alarm(30);
        InitializationFile file(place.path());
        file.open(READ_WRITE);
        try {
            action.run(file);
        } catch (std::exception const& e) {
            say("%s, ", e.what());
        }
        readsBeforeFailure = -1;
        writesBeforeFailure = -1;
        std::thread([&] { file.getValue(L"s", L"k"); }).join();
        say("free");
        file.setMode(0); // the destructor has nothing to write
        return 0;
    });
    return outcome.signal == SIGALRM ? outcome.out + "still held" : outcome.out;
}

} // namespace

TEST_CASE("every operation leaves the lock free") {
    for (Action const& action : allOperations()) {
        CAPTURE(action.label);
        CHECK(lockAfter(action) == "free");
    }
}

TEST_CASE("every exception leaves the lock free") {
    CHECK(lockAfter({"open", [](InitializationFile& f) {
                         f.close();
                         f.open(0);
                     }}) == "failed to open file., free");
    CHECK(lockAfter({"read", [](InitializationFile& f) {
                         f.close();
                         readsBeforeFailure = 0;
                         f.open(READ);
                     }}) == "failed to read from file, free");
    CHECK(lockAfter({"close", [](InitializationFile& f) {
                         writesBeforeFailure = 0;
                         f.close();
                     }}) == "failed to write to file, free");
    CHECK(lockAfter({"synchronize, writing", [](InitializationFile& f) {
                         writesBeforeFailure = 0;
                         f.synchronize();
                     }}) == "failed to write to file, free");
    CHECK(lockAfter({"synchronize, reading", [](InitializationFile& f) {
                         readsBeforeFailure = 0;
                         f.synchronize();
                     }}) == "failed to read from file, free");
    CHECK(lockAfter({"synchronize, opening", [](InitializationFile& f) {
                         f.setMode(0);
                         f.synchronize();
                     }}) == "failed to open file., free");
}

TEST_CASE("stream exceptions that a caller enabled leave the lock free") {
    std::string const result =
        lockAfter({"close and open", [](InitializationFile& f) {
                       f.clear();
                       f.exceptions(std::ios::badbit | std::ios::failbit | std::ios::eofbit);
                       f.synchronize();
                   }});
    CAPTURE(result);
    CHECK(result.size() >= 4);
    CHECK(result.substr(result.size() - 4) == "free");
    std::string const writing = lockAfter({"close", [](InitializationFile& f) {
                                               f.clear();
                                               f.exceptions(std::ios::badbit | std::ios::failbit);
                                               writesBeforeFailure = 0;
                                               f.close();
                                           }});
    CAPTURE(writing);
    CHECK(writing != "free");
    CHECK(writing.substr(writing.size() - 4) == "free");
}

TEST_CASE("every operation waits while another thread holds the lock") {
    for (Action const& action : allOperations()) {
        CAPTURE(action.label);
        SettingsPlace const place;
        place.write("[s]\nk=v\n");
        InitializationFile file(place.path());
        file.open(READ_WRITE);
        CHECK(file.lock());
        std::atomic<bool> done{false};
        std::thread other([&] {
            action.run(file);
            done = true;
        });
        std::this_thread::sleep_for(std::chrono::milliseconds(20));
        CHECK(!done);
        CHECK(file.unlock());
        other.join();
        CHECK(done);
    }
}

TEST_CASE("every operation works for the thread that holds the lock") {
    for (Action const& action : allOperations()) {
        CAPTURE(action.label);
        SettingsPlace const place;
        place.write("[s]\nk=v\n");
        InitializationFile file(place.path());
        file.open(READ_WRITE);
        CHECK(file.lock());
        CHECK(messageOf<std::exception>([&] { action.run(file); }) == "<nothing>");
        CHECK(file.unlock());
    }
}

TEST_CASE("the destructor waits while another thread holds the lock") {
    SettingsPlace const place;
    auto* const file = new InitializationFile(place.path());
    file->open(WRITE);
    file->setValue(L"s", L"k", L"v");
    CHECK(file->lock());
    std::atomic<bool> done{false};
    std::thread other([&] {
        delete file;
        done = true;
    });
    std::this_thread::sleep_for(std::chrono::milliseconds(20));
    CHECK(!done);
    CHECK(place.bytes() == "");
    file->unlock();
    other.join();
    CHECK(place.bytes() == "[s]\nk=v\n");
}

TEST_CASE("edits of several threads are not lost while others synchronize") {
    SettingsPlace const place;
    InitializationFile file(place.path());
    file.open(READ_WRITE);
    int const count = 60;
    std::vector<std::thread> threads;
    for (int t = 0; t < 3; ++t) {
        threads.emplace_back([&file, t] {
            for (int i = 0; i < count; ++i) {
                std::wstring const key = std::to_wstring(t) + L"." + std::to_wstring(i);
                file.setValue(L"section " + std::to_wstring(i % 4), key, L"value " + key);
                file.createKey(L"section 0", L"removed " + key);
                file.removeKey(L"section 0", L"removed " + key);
            }
        });
    }
    threads.emplace_back([&file] {
        for (int i = 0; i < 15; ++i) file.synchronize();
    });
    threads.emplace_back([&file] {
        for (int i = 0; i < 15; ++i) {
            for (std::wstring const& section : file.enumerateSections()) {
                file.enumerateKeys(section);
            }
        }
    });
    for (std::thread& thread : threads) thread.join();
    file.synchronize();
    checkSame(file.enumerateSections(),
              std::vector<std::wstring>{L"section 0", L"section 1", L"section 2", L"section 3"});
    for (int t = 0; t < 3; ++t) {
        for (int i = 0; i < count; ++i) {
            std::wstring const key = std::to_wstring(t) + L"." + std::to_wstring(i);
            checkSame(file.getValue(L"section " + std::to_wstring(i % 4), key), L"value " + key);
        }
    }
    CHECK(file.enumerateKeys(L"section 1").size() == 3U * count / 4);
}

namespace {

std::atomic<bool> survived{false};

/// Destroys a file with a cancellation of this thread pending.
void* destroyWhileCancelled(void* file) {
    ::pthread_cancel(::pthread_self());
    delete static_cast<InitializationFile*>(file);
    survived = true;
    ::pthread_testcancel();
    return nullptr;
}

void* closeWhileCancelled(void* file) {
    ::pthread_cancel(::pthread_self());
    static_cast<InitializationFile*>(file)->close();
    return nullptr;
}

void* getWhileLocked(void* file) {
    static_cast<InitializationFile*>(file)->getValue(L"s", L"k");
    return nullptr;
}

} // namespace

TEST_CASE("the destructor completes its work in a thread that is being cancelled") {
    SettingsPlace const place;
    place.write("[s]\nk=old\n");
    std::size_t const size = 300000;
    test::Outcome const outcome = test::inChild([&] {
        ::alarm(60);
        auto* const file = new InitializationFile(place.path());
        file->open(READ_WRITE);
        file->setValue(L"s", L"k", std::wstring(size, L'n'));
        pthread_t thread;
        if (::pthread_create(&thread, nullptr, destroyWhileCancelled, file) != 0) return 1;
        void* result = nullptr;
        ::pthread_join(thread, &result);
        say("%s, ", survived ? "survived" : "interrupted");
        say("%s", result == PTHREAD_CANCELED ? "cancelled after it" : "not cancelled");
        return 0;
    });
    CHECK(outcome.exitCode == 0);
    CHECK(outcome.out == "survived, cancelled after it");
    CHECK(place.bytes() == "[s]\nk=" + std::string(size, 'n') + "\n");
}

TEST_CASE("the destructor waits for the lock in a thread that is being cancelled") {
    SettingsPlace const place;
    test::Outcome const outcome = test::inChild([&] {
        ::alarm(60);
        auto* const file = new InitializationFile(place.path());
        file->open(WRITE);
        file->setValue(L"s", L"k", L"v");
        file->lock();
        pthread_t thread;
        if (::pthread_create(&thread, nullptr, destroyWhileCancelled, file) != 0) return 1;
        ::usleep(20000);
        file->unlock();
        void* result = nullptr;
        ::pthread_join(thread, &result);
        say("%s, ", survived ? "survived" : "interrupted");
        say("%s", result == PTHREAD_CANCELED ? "cancelled after it" : "not cancelled");
        return 0;
    });
    CHECK(outcome.exitCode == 0);
    CHECK(outcome.out == "survived, cancelled after it");
    CHECK(place.bytes() == "[s]\nk=v\n");
}

TEST_CASE("a thread cancelled in close leaves the lock free") {
    SettingsPlace const place;
    place.write("[s]\nk=old\n");
    test::Outcome const outcome = test::inChild([&] {
        ::alarm(60);
        InitializationFile file(place.path());
        file.open(READ_WRITE);
        file.setValue(L"s", L"k", std::wstring(300000, L'n'));
        pthread_t thread;
        if (::pthread_create(&thread, nullptr, closeWhileCancelled, &file) != 0) return 1;
        ::pthread_join(thread, nullptr);
        file.enumerateSections(); // waits for ever while the lock is held
        say("free");
        return 0;
    });
    CHECK(outcome.signal == 0);
    CHECK(outcome.out == "free");
}

TEST_CASE("a thread cancelled while it waits for the lock does no harm") {
    SettingsPlace const place;
    place.write("[s]\nk=v\n");
    test::Outcome const outcome = test::inChild([&] {
        ::alarm(60);
        InitializationFile file(place.path());
        file.open(READ);
        file.lock();
        pthread_t thread;
        if (::pthread_create(&thread, nullptr, getWhileLocked, &file) != 0) return 1;
        ::usleep(20000);
        ::pthread_cancel(thread);
        void* result = nullptr;
        ::pthread_join(thread, &result);
        say("%s, ", result == PTHREAD_CANCELED ? "cancelled" : "not cancelled");
        file.unlock();
        std::thread([&] { say("%s", test::shown(file.getValue(L"s", L"k")).c_str()); }).join();
        return 0;
    });
    CHECK(outcome.signal == 0);
    CHECK(outcome.out == "cancelled, v");
}
