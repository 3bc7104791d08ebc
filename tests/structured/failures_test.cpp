// The structured files when the system fails them: what cannot be opened, read, written or deleted.
#include <doctest/doctest.h>

#include <grp.h>
#include <sched.h>
#include <stdlib.h>
#include <sys/mount.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstddef>
#include <filesystem>
#include <fstream>
#include <string>

#include "structured/fixture.h"
#include "support/filesizelimit.h"
#include "support/skip.h"
#include "support/subprocess.h"
#include "support/systemcalls.h"

using namespace structured;

namespace {

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

/// What a caller sees of a file that is open, with a value of this size, after a step.
std::string ended(std::string const& message, std::size_t size) {
    return message + ", open with " + std::to_string(size) + "; ";
}

/// The same of a file and its entry 0.
template <class Family, class Step>
std::string after(OwnFile<Family>& file, unsigned long mode, Step step) {
    std::string const message = complaint(step);
    if (!file.isOpen(mode)) return message + ", closed or in another mode; ";
    return ended(message, Family::value(file, 0).size());
}

bool isPrefix(std::string const& part, std::string const& whole) {
    return whole.compare(0, part.size(), part) == 0;
}

} // namespace

FAMILIES_TEST_CASE("a write-back that cannot open the file again keeps the entries and closes it") {
    for (bool const synchronize : {false, true}) {
        for (bool const obstructed : {false, true}) {
            CAPTURE(synchronize);
            CAPTURE(obstructed);
            OwnFile<Family> file("", READ_WRITE);
            file.put(1);
            file.put(0);
            std::string const folder = file.place.directory().path();
            std::filesystem::remove_all(folder);
            if (obstructed) std::filesystem::create_directories(file.place.path() + "/content");
            CHECK(complaint([&] { writeBack(file, synchronize); }) == NOT_OPENED);
            CHECK(!file.is_open());
            CHECK(file.getMode() == 0);
            CHECK(file.has(2));
            if (obstructed) test::removeTree(folder);
            std::filesystem::create_directory(folder);
            // They can be written once there is a place for them.
            file.setMode(WRITE);
            file.close();
            CHECK(isWhole<Family>(file.bytes(), 0, 2));
        }
    }
}

FAMILIES_TEST_CASE("a destructor that cannot open the file again keeps the exception inside") {
    CHECK(toldByChild([] {
              OwnFile<Family> file("", WRITE);
              file.put(0);
              std::filesystem::remove_all(file.place.directory().path());
              return "alive";
          }) == "alive");
}

FAMILIES_TEST_CASE("a directory cannot be read and cannot be opened for writing") {
    OwnFile<Family> file;
    std::filesystem::create_directory(file.place.path());
    file.put(0);
    CHECK(complaint([&] { file.open(READ); }) == NOT_READ);
    CHECK(file.isOpen(READ));
    CHECK(file.count() == 0);
    CHECK(complaint([&] { file.synchronize(); }) == NOT_READ);
    CHECK(complaint([&] { file.close(); }) == NOTHING);
    CHECK(complaint([&] { file.open(READ_WRITE); }) == NOT_OPENED);
    CHECK(complaint([&] { file.open(WRITE); }) == NOT_OPENED);
    CHECK(std::filesystem::is_directory(file.place.path()));
}

FAMILIES_TEST_CASE("a file whose first read fails is not an empty file") {
    OwnFile<Family> file;
    std::filesystem::create_symlink("/proc/self/mem", file.place.path());
    CHECK(complaint([&] { file.open(READ); }) == NOT_READ);
    CHECK(file.isOpen(READ));
    CHECK(file.count() == 0);
}

FAMILIES_TEST_CASE(
    "a read that fails midway is an error and keeps the complete entries before it") {
    OwnFile<Family> file(Family::bytes(0, 200));
    std::size_t const entry = Family::bytes(0, 2).size() - one<Family>().size();
    std::size_t const header = one<Family>().size() - entry;
    for (std::size_t const limit : {13UL, 100UL, 1000UL}) {
        ShortTransfers const limited(limit);
        for (std::size_t read = 0; read <= header + 200 * entry; read += limit) {
            CAPTURE(limit);
            CAPTURE(read);
            CHECK(complaintWithout(Call::READ, EIO, static_cast<long>(read / limit),
                                   [&] { file.open(READ); }) == NOT_READ);
            CHECK(file.isOpen(READ));
            CHECK(file.has(static_cast<int>(read < header ? 0 : (read - header) / entry)));
            file.close();
        }
    }
}

FAMILIES_TEST_CASE("a read that fails midway is not the end of the file") {
    int const count = 4000;
    OwnFile<Family> file(Family::bytes(0, count));
    std::size_t most = 0;
    for (long before = 0;; ++before) {
        CAPTURE(before);
        std::string const message =
            complaintWithout(Call::READ, EIO, before, [&] { file.open(READ); });
        if (message == NOTHING) break;
        CHECK(message == NOT_READ);
        most = file.count();
        CHECK(file.has(static_cast<int>(most)));
        file.close();
    }
    CHECK(most > 0);
    CHECK(file.has(count));
}

FAMILIES_TEST_CASE(
    "a file that could not be read is kept by taking the write bit away before close") {
    OwnFile<Family> file(one<Family>());
    CHECK(complaintWithout(Call::READ, EIO, 0, [&] { file.open(READ_WRITE); }) == NOT_READ);
    CHECK(file.isOpen(READ_WRITE));
    CHECK(file.bytes() == one<Family>());
    file.setMode(READ);
    file.close();
    CHECK(file.bytes() == one<Family>());
}

FAMILIES_TEST_CASE("reads and writes that transfer little at a time make no difference") {
    for (std::size_t const limit : {1UL, 7UL, 1000UL}) {
        CAPTURE(limit);
        ShortTransfers const limited(limit);
        OwnFile<Family> file("", WRITE);
        for (int i = 0; i < 300; ++i) file.put(i);
        file.close();
        CHECK(isWhole<Family>(file.bytes(), 0, 300));
        file.open(READ);
        CHECK(file.has(300));
    }
}

FAMILIES_TEST_CASE("a write that fails leaves the entries, the file open and the mode unchanged") {
    for (std::size_t const size : {1UL, 100UL, 5000UL, 300000UL}) {
        for (bool const synchronize : {false, true}) {
            for (unsigned long const mode : {WRITE, READ_WRITE}) {
                CAPTURE(size);
                CAPTURE(synchronize);
                CAPTURE(mode);
                std::string const complete = one<Family>(std::string(size, 'x'));
                OwnFile<Family> file(one<Family>("old value"), mode);
                file.put(0, std::string(size, 'x'));
                for (long before = 0;; ++before) {
                    CAPTURE(before);
                    std::string const result = after(file, mode, [&] {
                        FailingCall const fault(Call::WRITE, ENOSPC, before, FailingCall::FOR_EVER);
                        writeBack(file, synchronize);
                    });
                    if (before > 0 && result.rfind(NOTHING, 0) == 0) break;
                    CHECK(result == ended(NOT_WRITTEN, size));
                    CHECK(isPrefix(file.bytes(), complete));
                }
                if (!synchronize) CHECK((file.bytes() == complete));
                if (synchronize && mode == READ_WRITE) CHECK(Family::value(file, 0).size() == size);
            }
        }
    }
}

FAMILIES_TEST_CASE("after a write that failed the next close writes everything") {
    OwnFile<Family> file("", READ_WRITE);
    for (int i = 0; i < 2000; ++i) file.put(i * 7 % 2000);
    {
        ShortTransfers const limited(10000);
        CHECK(complaintWithout(Call::WRITE, ENOSPC, 1, [&] { file.close(); }) == NOT_WRITTEN);
    }
    std::string const left = file.bytes();
    CHECK(!left.empty());
    CHECK(file.has(2000));
    file.close();
    CHECK(isWhole<Family>(file.bytes(), 0, 2000));
    CHECK(isPrefix(left, file.bytes()));
}

FAMILIES_TEST_CASE("a file-size limit is a failure to write") {
    for (std::size_t const size : {1UL, 100UL, 200000UL}) {
        for (rlim_t const limit : {0UL, 1UL, 5UL}) {
            CAPTURE(size);
            CAPTURE(limit);
            std::string const complete = one<Family>(std::string(size, 'x'));
            std::string const told = toldByChild([&] {
                OwnFile<Family> file("", READ_WRITE);
                file.put(0, std::string(size, 'x'));
                test::limitFileSize(limit);
                std::string text = after(file, READ_WRITE, [&] { file.close(); });
                text += isPrefix(file.bytes(), complete) ? "prefix; " : "other; ";
                text += after(file, READ_WRITE, [&] { file.synchronize(); });
                test::limitFileSize(RLIM_INFINITY);
                text += after(file, READ_WRITE, [&] { file.synchronize(); });
                return text + (file.bytes() == complete ? "complete" : "incomplete");
            });
            std::string const notWritten = ended(NOT_WRITTEN, size);
            CHECK(told == notWritten + "prefix; " + notWritten + ended(NOTHING, size) + "complete");
        }
    }
}

FAMILIES_TEST_CASE("a destructor that cannot write does not end the process") {
    for (std::size_t const size : {1UL, 200000UL}) {
        for (bool const closes : {false, true}) {
            for (bool const throws : {false, true}) {
                CAPTURE(size);
                CAPTURE(closes);
                CAPTURE(throws);
                CHECK(toldByChild([&] {
                          test::limitFileSize(2);
                          OwnFile<Family> file("", WRITE);
                          file.put(0, std::string(size, 'x'));
                          std::string const message =
                              closes ? complaint([&] { file.close(); }) : NOT_WRITTEN;
                          file.clear();
                          auto const all = std::ios::badbit | std::ios::failbit | std::ios::eofbit;
                          if (throws) file.exceptions(all);
                          return message;
                      }) == NOT_WRITTEN);
            }
        }
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

FAMILIES_TEST_CASE("a full disk is a failure to write") {
    TempDir const directory;
    std::string const told = toldByChild([&] {
        Mount const disk("none", directory.path(), "tmpfs", 0, "size=8k");
        if (!disk.done()) return std::string(CANNOT_MOUNT);
        ::setenv("TMPDIR", directory.path().c_str(), 1);
        OwnFile<Family> file("", READ_WRITE);
        file.put(0, std::string(100000, 'x'));
        std::string text = after(file, READ_WRITE, [&] { file.close(); });
        text += after(file, READ_WRITE, [&] { file.synchronize(); });
        file.put(0, "short");
        text += after(file, READ_WRITE, [&] { file.synchronize(); });
        // A disk that somebody else filled before.
        std::ofstream(directory / "filler") << std::string(20000, 'f');
        file.put(0, std::string(5000, 'y'));
        return text + after(file, READ_WRITE, [&] { file.close(); });
    }); // the destructor met the full disk once more
    if (told == CANNOT_MOUNT) {
        test::skipped("no file system can be mounted");
        return;
    }
    CHECK(told == ended(NOT_WRITTEN, 100000) + ended(NOT_WRITTEN, 100000) + ended(NOTHING, 5) +
                      ended(NOT_WRITTEN, 5000));
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
        place.write(one<Family>(OLD_VALUES[i % 3]));
        std::string const* const value = i < 3 ? &NEW_VALUES[i] : nullptr;
        std::string const told = replace(value);
        if (told == CANNOT_MOUNT) {
            test::skipped("no file system can be mounted");
            return;
        }
        CHECK(told == NOTHING);
        CHECK(place.bytes() == (i < 3 ? one<Family>(*value) : ""));
    }
}

} // namespace

FAMILIES_TEST_CASE(
    "a file that can be written but not deleted keeps no old tail: another file system") {
    Place const place;
    checkReplacements<Family>(place, [&](std::string const* value) {
        return toldByChild([&]() -> std::string {
            Mount const itself(place.path().c_str(), place.path(), nullptr, MS_BIND, nullptr);
            if (!itself.done()) return CANNOT_MOUNT;
            return replaceValue<Family>(place.path(), value);
        });
    });
}

FAMILIES_TEST_CASE(
    "a file that can be written but not deleted keeps no old tail: a read-only directory") {
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
