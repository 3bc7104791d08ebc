// The structured files when the system fails them: what cannot be opened, read, written or deleted.
#include <doctest/doctest.h>

#include <grp.h>
#include <sched.h>
#include <signal.h>
#include <sys/mount.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstddef>
#include <filesystem>
#include <string>

#include "support/structuredfile.h"
#include "support/subprocess.h"
#include "support/systemcalls.h"
#include "support/tempdir.h"
#include "support/throws.h"

using test::Call;
using test::complaint;
using test::FailingCall;
using test::Flat;
using test::holds;
using test::isWhole;
using test::NOT_OPENED;
using test::NOT_READ;
using test::NOT_WRITTEN;
using test::NOTHING;
using test::openState;
using test::Place;
using test::Records;
using test::Sectioned;
using test::ShortTransfers;
using test::sizeOf;
using test::stateOf;
using test::toldByChild;

namespace {

unsigned long const READ = Koru::File::READ;
unsigned long const WRITE = Koru::File::WRITE;
unsigned long const READ_WRITE = READ | WRITE;

/// What the callable throws while calls of one kind fail, but for the first ones.
template <class Callable>
std::string complaintWithout(Call call, int error, long before, Callable callable) {
    FailingCall const fault(call, error, before, FailingCall::FOR_EVER);
    return complaint(callable);
}

template <class File>
void writeBack(File& file, bool synchronize) {
    synchronize ? file.synchronize() : file.close();
}

bool isPrefix(std::string const& part, std::string const& whole) {
    return whole.compare(0, part.size(), part) == 0;
}

} // namespace

TEST_CASE_TEMPLATE("a write-back that cannot open the file again keeps the entries and closes it",
                   Family, Sectioned, Flat, Records) {
    test::TempDir const directory;
    std::string const folder = directory / "folder";
    std::string const path = folder + "/file";
    for (bool const synchronize : {false, true}) {
        for (bool const obstructed : {false, true}) {
            CAPTURE(synchronize);
            CAPTURE(obstructed);
            std::filesystem::create_directory(folder);
            typename Family::File file(path);
            file.open(READ_WRITE);
            Family::add(file, 1);
            Family::add(file, 0);
            std::filesystem::remove_all(folder);
            if (obstructed) std::filesystem::create_directories(path + "/content");
            CHECK(complaint([&] { writeBack(file, synchronize); }) == NOT_OPENED);
            CHECK(!file.is_open());
            CHECK(file.getMode() == 0);
            CHECK(holds<Family>(file, 0, 2));
            std::filesystem::remove_all(folder);
            std::filesystem::create_directory(folder);
            // They can be written once there is a place for them.
            file.setMode(WRITE);
            file.close();
            CHECK(isWhole<Family>(test::readFile(path), 0, 2));
            std::filesystem::remove_all(folder);
        }
    }
}

TEST_CASE_TEMPLATE("a destructor that cannot open the file again keeps the exception inside",
                   Family, Sectioned, Flat, Records) {
    test::Outcome const outcome = test::inChild([] {
        test::TempDir const directory;
        std::string const folder = directory / "folder";
        std::filesystem::create_directory(folder);
        {
            typename Family::File file(folder + "/file");
            file.open(WRITE);
            Family::set(file, 0);
            std::filesystem::remove_all(folder);
        }
        return 42;
    });
    CHECK(outcome.exitCode == 42);
    CHECK(outcome.out == "");
}

TEST_CASE_TEMPLATE("a directory cannot be read and cannot be opened for writing", Family, Sectioned,
                   Flat, Records) {
    Place const place;
    std::filesystem::create_directory(place.path());
    typename Family::File file(place.path());
    Family::set(file, 0);
    CHECK(complaint([&] { file.open(READ); }) == NOT_READ);
    CHECK(file.is_open());
    CHECK(file.getMode() == (READ | Family::ADDED_MODE));
    CHECK(sizeOf<Family>(file) == 0);
    CHECK(complaint([&] { file.synchronize(); }) == NOT_READ);
    CHECK(complaint([&] { file.close(); }) == NOTHING);
    CHECK(complaint([&] { file.open(READ_WRITE); }) == NOT_OPENED);
    CHECK(complaint([&] { file.open(WRITE); }) == NOT_OPENED);
    CHECK(std::filesystem::is_directory(place.path()));
}

TEST_CASE_TEMPLATE("a file whose first read fails is not an empty file", Family, Sectioned, Flat,
                   Records) {
    typename Family::File file(std::string("/proc/self/mem"));
    CHECK(complaint([&] { file.open(READ); }) == NOT_READ);
    CHECK(file.is_open());
    CHECK(file.getMode() == (READ | Family::ADDED_MODE));
    CHECK(sizeOf<Family>(file) == 0);
}

TEST_CASE_TEMPLATE("a read that fails midway is an error and keeps the complete entries before it",
                   Family, Sectioned, Flat, Records) {
    Place const place;
    int const count = 200;
    std::string const bytes = Family::bytes(0, count);
    place.write(bytes);
    std::size_t const entry = Family::bytes(0, 2).size() - Family::bytes(0, 1).size();
    std::size_t const header = Family::bytes(0, 1).size() - entry;
    for (std::size_t const limit : {13UL, 100UL, 1000UL}) {
        ShortTransfers const limited(limit);
        for (std::size_t delivered = 0; delivered <= bytes.size(); delivered += limit) {
            CAPTURE(limit);
            CAPTURE(delivered);
            typename Family::File file(place.path());
            CHECK(complaintWithout(Call::READ, EIO, static_cast<long>(delivered / limit),
                                   [&] { file.open(READ); }) == NOT_READ);
            CHECK(file.is_open());
            CHECK(file.getMode() == (READ | Family::ADDED_MODE));
            auto const complete = delivered < header ? 0 : (delivered - header) / entry;
            CHECK(holds<Family>(file, 0, static_cast<int>(complete)));
        }
    }
}

TEST_CASE_TEMPLATE("a read that fails behind any block of a large file is an error", Family,
                   Sectioned, Flat, Records) {
    Place const place;
    int const count = 20000;
    place.write(Family::bytes(0, count));
    std::size_t most = 0;
    std::string message = NOT_READ;
    for (long before = 0; message != NOTHING; ++before) {
        CAPTURE(before);
        typename Family::File file(place.path());
        message = complaintWithout(Call::READ, EIO, before, [&] { file.open(READ); });
        if (message == NOTHING) CHECK(sizeOf<Family>(file) == static_cast<std::size_t>(count));
        if (message == NOTHING) break;
        CHECK(message == NOT_READ);
        most = sizeOf<Family>(file);
        CHECK(holds<Family>(file, 0, static_cast<int>(most)));
    }
    CHECK(most > 0);
}

TEST_CASE_TEMPLATE("a file that could not be read is kept by taking the write bit away", Family,
                   Sectioned, Flat, Records) {
    Place const place;
    place.write(Family::bytes(0, 1));
    typename Family::File file(place.path());
    CHECK(complaintWithout(Call::READ, EIO, 0, [&] { file.open(READ_WRITE); }) == NOT_READ);
    CHECK(file.getMode() == (READ_WRITE | Family::ADDED_MODE));
    CHECK(place.bytes() == Family::bytes(0, 1));
    file.setMode(READ);
    file.close();
    CHECK(place.bytes() == Family::bytes(0, 1));
}

TEST_CASE_TEMPLATE("reads and writes that transfer little at a time make no difference", Family,
                   Sectioned, Flat, Records) {
    Place const place;
    for (std::size_t const limit : {1UL, 7UL, 1000UL}) {
        CAPTURE(limit);
        ShortTransfers const limited(limit);
        typename Family::File file(place.path());
        file.open(WRITE);
        for (int i = 0; i < 300; ++i) Family::add(file, i);
        file.close();
        CHECK(isWhole<Family>(place.bytes(), 0, 300));
        file.open(READ);
        CHECK(holds<Family>(file, 0, 300));
    }
}

TEST_CASE_TEMPLATE("a write that fails leaves the entries, the file open and the mode unchanged",
                   Family, Sectioned, Flat, Records) {
    Place const place;
    for (std::size_t const size : {1UL, 100UL, 5000UL, 300000UL}) {
        for (bool const synchronize : {false, true}) {
            for (unsigned long const mode : {WRITE, READ_WRITE}) {
                CAPTURE(size);
                CAPTURE(synchronize);
                CAPTURE(mode);
                std::string const value(size, 'x');
                std::string const open = openState(mode | Family::ADDED_MODE, size);
                place.write(Family::bytes(0, 1, "old value"));
                typename Family::File file(place.path());
                file.open(mode);
                Family::set(file, 0, value);
                std::string message = NOT_WRITTEN;
                long failures = 0;
                for (; message != NOTHING; ++failures) {
                    CAPTURE(failures);
                    message = complaintWithout(Call::WRITE, ENOSPC, failures,
                                               [&] { writeBack(file, synchronize); });
                    if (message == NOTHING) break;
                    CHECK(message == NOT_WRITTEN);
                    CHECK(stateOf<Family>(file) == open);
                    CHECK(isPrefix(place.bytes(), Family::bytes(0, 1, value)));
                }
                CHECK(failures > 0);
                if (!synchronize) CHECK((place.bytes() == Family::bytes(0, 1, value)));
                if (synchronize && mode == READ_WRITE) CHECK(stateOf<Family>(file) == open);
            }
        }
    }
}

TEST_CASE_TEMPLATE("after a write that failed the next close writes everything", Family, Sectioned,
                   Flat, Records) {
    Place const place;
    typename Family::File file(place.path());
    file.open(READ_WRITE);
    for (int i = 0; i < 2000; ++i) Family::add(file, i * 7 % 2000);
    {
        ShortTransfers const limited(10000);
        CHECK(complaintWithout(Call::WRITE, ENOSPC, 1, [&] { file.close(); }) == NOT_WRITTEN);
    }
    std::string const left = place.bytes();
    CHECK(!left.empty());
    CHECK(holds<Family>(file, 0, 2000));
    file.close();
    CHECK(isWhole<Family>(place.bytes(), 0, 2000));
    CHECK(isPrefix(left, place.bytes()));
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

TEST_CASE_TEMPLATE("a file-size limit is a failure to write", Family, Sectioned, Flat, Records) {
    Place const place;
    for (std::size_t const size : {1UL, 100UL, 200000UL}) {
        for (rlim_t const limit : {rlim_t(0), rlim_t(1), rlim_t(5)}) {
            CAPTURE(size);
            CAPTURE(limit);
            std::string const complete = Family::bytes(0, 1, std::string(size, 'x'));
            std::string const told = toldByChild([&] {
                typename Family::File file(place.path());
                file.open(READ_WRITE);
                Family::set(file, 0, std::string(size, 'x'));
                limitFileSize(limit);
                std::string text = complaint([&] { file.close(); }) + ": " + stateOf<Family>(file);
                text += isPrefix(place.bytes(), complete) ? "prefix; " : "other; ";
                text += complaint([&] { file.synchronize(); }) + ": " + stateOf<Family>(file);
                limitFileSize(RLIM_INFINITY);
                text += complaint([&] { file.synchronize(); }) + ": " + stateOf<Family>(file);
                return text + (place.bytes() == complete ? "complete" : "incomplete");
            });
            std::string const state = ": " + openState(READ_WRITE | Family::ADDED_MODE, size);
            CHECK(told == NOT_WRITTEN + state + "prefix; " + NOT_WRITTEN + state + NOTHING + state +
                              "complete");
        }
    }
}

TEST_CASE_TEMPLATE("a destructor that cannot write does not end the process", Family, Sectioned,
                   Flat, Records) {
    Place const place;
    for (std::size_t const size : {1UL, 200000UL}) {
        CAPTURE(size);
        CHECK(toldByChild([&] {
                  limitFileSize(2);
                  std::string messages;
                  for (bool const closes : {false, true}) {
                      for (bool const throws : {false, true}) {
                          typename Family::File file(place.path());
                          file.open(WRITE);
                          Family::set(file, 0, std::string(size, 'x'));
                          if (closes) messages += complaint([&] { file.close(); }) + "; ";
                          file.clear();
                          std::ios::iostate const all = std::ios::badbit | std::ios::failbit;
                          if (throws) file.exceptions(all | std::ios::eofbit);
                      }
                  }
                  return messages;
              }) == std::string(NOT_WRITTEN) + "; " + NOT_WRITTEN + "; ");
    }
}

namespace {

char const* const CANNOT_MOUNT = "cannot mount";

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

TEST_CASE_TEMPLATE("a full disk is a failure to write", Family, Sectioned, Flat, Records) {
    test::TempDir const directory;
    std::string const small = directory / "small";
    std::filesystem::create_directory(small);
    std::string const told = toldByChild([&] {
        Mount const disk("none", small, "tmpfs", 0, "size=8k");
        if (!disk.done()) return std::string(CANNOT_MOUNT);
        test::writeFile(small + "/file", Family::bytes(0, 1));
        typename Family::File file(small + "/file");
        file.open(READ_WRITE);
        Family::set(file, 0, std::string(100000, 'x'));
        std::string text = complaint([&] { file.close(); }) + ": " + stateOf<Family>(file);
        text += complaint([&] { file.synchronize(); }) + ": " + stateOf<Family>(file);
        Family::set(file, 0, "short");
        text += complaint([&] { file.synchronize(); }) + ": " + stateOf<Family>(file);
        // A disk that somebody else filled before.
        std::ofstream(small + "/filler") << std::string(20000, 'f');
        Family::set(file, 0, std::string(5000, 'y'));
        text += complaint([&] { file.close(); }) + ": " + stateOf<Family>(file);
        return text; // the destructor meets the full disk once more
    });
    if (told == CANNOT_MOUNT) {
        MESSAGE("no file system can be mounted here: the full disk was not tested");
        return;
    }
    unsigned long const mode = READ_WRITE | Family::ADDED_MODE;
    std::string const notWritten = std::string(NOT_WRITTEN) + ": ";
    CHECK(told == notWritten + openState(mode, 100000) + notWritten + openState(mode, 100000) +
                      NOTHING + ": " + openState(mode, 5) + notWritten + openState(mode, 5000));
}

namespace {

/// Values to take the place of "a rather long old value" and "v": shorter, equally long, longer.
/// Then all entries are removed.
std::string const OLD_VALUES[] = {"a rather long old value", "old", "v"};
std::string const NEW_VALUES[] = {"v", "new", "a rather long new value"};

/// Puts the value in or removes the entry and closes. For a child process.
template <class Family>
std::string replaceValue(std::string const& path, std::string const* value) {
    return complaint([&] {
        typename Family::File file(path);
        file.open(READ_WRITE);
        if (value != nullptr)
            Family::set(file, 0, *value);
        else
            Family::remove(file, 0);
        file.close();
    });
}

/// Runs the callable, given a place, with every replacement, and checks what the file is after it.
template <class Family, class Replace>
void checkReplacements(Place const& place, Replace replace) {
    for (std::size_t i = 0; i < 4; ++i) {
        CAPTURE(i);
        place.write(Family::bytes(0, 1, OLD_VALUES[i % 3]));
        std::string const* const value = i < 3 ? &NEW_VALUES[i] : nullptr;
        std::string const told = replace(value);
        if (told == CANNOT_MOUNT) {
            MESSAGE("nothing can be mounted here: the undeletable file was not tested this way");
            return;
        }
        CHECK(told == NOTHING);
        CHECK(place.bytes() == (i < 3 ? Family::bytes(0, 1, *value) : ""));
    }
}

} // namespace

TEST_CASE_TEMPLATE(
    "a file that can be written but not deleted keeps no old tail: another file system", Family,
    Sectioned, Flat, Records) {
    Place const place;
    checkReplacements<Family>(place, [&](std::string const* value) {
        return toldByChild([&]() -> std::string {
            Mount const itself(place.path().c_str(), place.path(), nullptr, MS_BIND, nullptr);
            if (!itself.done()) return CANNOT_MOUNT;
            return replaceValue<Family>(place.path(), value);
        });
    });
}

TEST_CASE_TEMPLATE(
    "a file that can be written but not deleted keeps no old tail: a read-only directory", Family,
    Sectioned, Flat, Records) {
    Place const place;
    checkReplacements<Family>(place, [&](std::string const* value) {
        REQUIRE(::chmod(place.path().c_str(), 0666) == 0);
        REQUIRE(::chmod(place.directory().path().c_str(), 0555) == 0);
        std::string const told = toldByChild([&]() -> std::string {
            // The administrator may delete everything, so become somebody else.
            unsigned const nobody = 65534;
            if (::geteuid() == 0 &&
                (::setgroups(0, nullptr) != 0 || ::setgid(nobody) != 0 || ::setuid(nobody) != 0)) {
                return "still the administrator";
            }
            return replaceValue<Family>(place.path(), value);
        });
        REQUIRE(::chmod(place.directory().path().c_str(), 0700) == 0);
        return told;
    });
}
