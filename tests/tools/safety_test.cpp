// What else `koru` does to files: nothing where it reads, and where it writes it loses no file.
#include <doctest/doctest.h>

#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstdlib>
#include <filesystem>
#include <string>

#include "support/filesizelimit.h"
#include "support/sanitizers.h"
#include "support/skip.h"
#include "support/tracedprocess.h"
#include "tools/koru.h"

namespace fs = std::filesystem;
using test::Desk;
using test::NOBODY;
using test::Words;

namespace {

std::string const MESSY = "# mine\n\n[b]\nx = 1\n[a]\ny=2\n";

struct stat statusOf(std::string const& path) {
    struct stat status = {};
    if (::stat(path.c_str(), &status) != 0) throw std::runtime_error("stat failed");
    return status;
}

/// All of a file's status that a change of it would change.
std::string fingerprint(std::string const& path) {
    struct stat const status = statusOf(path);
    std::string result;
    for (long long const part :
         {static_cast<long long>(status.st_ino), static_cast<long long>(status.st_mode),
          static_cast<long long>(status.st_nlink), static_cast<long long>(status.st_size),
          static_cast<long long>(status.st_mtim.tv_sec),
          static_cast<long long>(status.st_mtim.tv_nsec),
          static_cast<long long>(status.st_ctim.tv_sec),
          static_cast<long long>(status.st_ctim.tv_nsec)})
        result += std::to_string(part) + " ";
    return result;
}

/// The commands that only read, on the file `f`.
std::vector<Words> readers(std::string const& family) {
    std::vector<Words> result = {
        {family, "list", "f"}, {family, "export", "f"}, {family, "export", "f", "--format=json"}};
    if (family == "settings")
        result.push_back({family, "get", "f", "a", "y"});
    else
        result.push_back({family, "get", "f", "y"});
    if (family != "records") result.push_back({family, "lint", "f"});
    return result;
}

mode_t modeOf(std::string const& path) { return statusOf(path).st_mode & 07777U; }

} // namespace

TEST_CASE("a command that reads changes nothing of the file, and needs no write permission") {
    for (std::string const family : {"settings", "properties", "records"}) {
        Desk const desk;
        desk.write("f", family == "records" ? std::string("\2\0\0\0\0y\1\0\0\0z", 11) : MESSY);
        REQUIRE(::chmod((desk / "f").c_str(), 0444) == 0);
        REQUIRE(::chmod(desk.path().c_str(), 0555) == 0);
        std::string const before = fingerprint(desk / "f") + fingerprint(desk.path());
        for (Words const& words : readers(family)) {
            CAPTURE(words[1]);
            CHECK(desk.koru(words).err == "");
            CHECK(fingerprint(desk / "f") + fingerprint(desk.path()) == before);
        }
        REQUIRE(::chmod(desk.path().c_str(), 0755) == 0);
    }
}

TEST_CASE("a command that reads creates nothing where the file is missing") {
    for (std::string const family : {"settings", "properties", "records"}) {
        Desk const desk;
        for (Words const& words : readers(family)) {
            CAPTURE(words[1]);
            CHECK(desk.koru(words).exitCode == 3);
            CHECK(desk.names().empty());
        }
    }
}

TEST_CASE("a change keeps the permissions of the file") {
    Desk const desk;
    for (mode_t const mode : {0600U, 0640U, 0664U, 0755U}) {
        desk.write("f", "[s]\nk=v\n");
        REQUIRE(::chmod((desk / "f").c_str(), mode) == 0);
        CHECK(desk.output({"settings", "set", "f", "s", "k", std::to_string(mode)}) == "");
        CHECK(modeOf(desk / "f") == mode);
    }
}

TEST_CASE("a change by the administrator keeps owner and group, those of a link's file") {
    Desk const desk;
    desk.write("f", "[s]\nk=v\n");
    if (::chown((desk / "f").c_str(), NOBODY, NOBODY) != 0)
        return test::skipped("only the administrator gives files away");
    fs::create_symlink("f", desk / "link");
    CHECK(desk.output({"settings", "set", "link", "s", "k", "w"}) == "");
    CHECK(statusOf(desk / "f").st_uid == NOBODY);
    CHECK(statusOf(desk / "f").st_gid == NOBODY);
}

TEST_CASE("a file that has the value already is left alone") {
    Desk const desk;
    desk.write("f", MESSY);
    std::string const before = fingerprint(desk / "f");
    CHECK(desk.output({"settings", "set", "f", "A", "Y", "2"}) == "");
    CHECK(fingerprint(desk / "f") == before);
    CHECK(desk.names() == Words{"f"});
}

TEST_CASE("a change through links goes to the file that they lead to") {
    Desk const desk;
    desk.write("f", "[s]\nk=v\n");
    fs::create_directory(desk / "d");
    fs::create_symlink("../f", desk / "d/first");
    fs::create_symlink("d/first", desk / "second");
    CHECK(desk.output({"settings", "set", "second", "s", "k", "w"}) == "");
    CHECK(desk.read("f") == "[s]\nk=w\n");
    CHECK(fs::is_symlink(desk / "d/first"));
    CHECK(fs::is_symlink(desk / "second"));
    CHECK(!fs::is_symlink(desk / "f"));
}

TEST_CASE("a link that leads nowhere names the file that is created") {
    Desk const desk;
    fs::create_symlink("new", desk / "link");
    CHECK(desk.koru({"settings", "get", "link", "s", "k"}).exitCode == 3);
    CHECK(desk.names() == Words{"link"});
    CHECK(desk.output({"settings", "set", "link", "s", "k", "v"}) == "");
    CHECK(desk.names() == Words{"link", "new"});
    CHECK(fs::is_symlink(desk / "link"));
    fs::create_symlink("loop", desk / "loop");
    CHECK(desk.complaint({"settings", "set", "loop", "s", "k", "v"}) ==
          "3 koru: loop: Too many levels of symbolic links\n");
}

TEST_CASE("a change that cannot be written leaves the old file and nothing else") {
    Desk const desk;
    desk.write("f", "[s]\nk=v\n");
    test::Outcome const outcome = test::inChild([&] {
        test::limitFileSize(2000);
        test::redirect("/dev/null", O_WRONLY, STDERR_FILENO);
        return test::become(desk.path(),
                            {"settings", "set", "f", "s", "k", std::string(4000, 'x')});
    });
    CHECK(outcome.exitCode == 3);
    CHECK(desk.read("f") == "[s]\nk=v\n");
    CHECK(desk.names() == Words{"f"});
}

TEST_CASE("what its user may not change is told and left alone") {
    struct Row {
        mode_t file;
        mode_t folder;
        char const* complaint;
    };
    Row const rows[] = {
        {0444, 0755, "koru: f: Permission denied\n"},
        {0644, 0555, "koru: f: cannot make a folder beside it: Permission denied\n"},
        {0644, 0300, "koru: f: cannot open its folder: Permission denied\n"},
    };
    for (Row const& row : rows) {
        Desk const desk;
        desk.write("f", "[s]\nk=v\n");
        for (std::string const& path : {desk / "f", desk.path()})
            REQUIRE((::geteuid() != 0 || ::chown(path.c_str(), NOBODY, NOBODY) == 0));
        REQUIRE(::chmod((desk / "f").c_str(), row.file) == 0);
        REQUIRE(::chmod(desk.path().c_str(), row.folder) == 0);
        test::Run const run = desk.koru({"settings", "set", "f", "s", "k", "w"}, "", true);
        REQUIRE(::chmod(desk.path().c_str(), 0755) == 0);
        if (run.exitCode == 127) return test::skipped("an ordinary user cannot reach the program");
        CHECK(run.exitCode == 3);
        CHECK(run.err == row.complaint);
        CHECK(desk.read("f") == "[s]\nk=v\n");
        CHECK(desk.names() == Words{"f"});
    }
}

TEST_CASE("killed at any system call, a change leaves the old file or the new one, whole") {
    Desk const desk;
    long call = 0;
    long oldOnes = 0;
    long const step = test::SANITIZED ? 9 : 1; // a sanitizer takes its time to begin
    for (bool isKilled = true; isKilled; call += step) {
        desk.write("f", "[s]\nk=old\n");
        isKilled = test::killedAtCall(call, [&] {
            ::setenv("ASAN_OPTIONS", "detect_leaks=0", 1); // It traces the program itself.
            ::_exit(test::become(desk.path(), {"settings", "set", "f", "s", "k", "new"}));
        });
        std::string const left = desk.read("f");
        if (left != "[s]\nk=old\n" && left != "[s]\nk=new\n") FAIL_CHECK("lost at call ", call);
        if (left == "[s]\nk=old\n") ++oldOnes;
    }
    CHECK(desk.read("f") == "[s]\nk=new\n");
    CHECK(oldOnes > 10);
}

TEST_CASE("commands that change one file at the same time lose no change") {
    Desk const desk;
    int const count = 8;
    std::vector<pid_t> children;
    for (int i = 0; i < count; ++i) {
        pid_t const child = ::fork();
        if (child == 0)
            ::_exit(
                test::become(desk.path(), {"properties", "set", "f", "k" + std::to_string(i), ""}));
        children.push_back(child);
    }
    for (pid_t const child : children) {
        int status = 0;
        CHECK(::waitpid(child, &status, 0) == child);
        CHECK(status == 0);
    }
    for (int i = 0; i < count; ++i)
        CHECK(desk.read("f").find("k" + std::to_string(i) + "=\n") != std::string::npos);
    CHECK(desk.names() == Words{"f"});
}

TEST_CASE("a change waits for the lock of the folder") {
    Desk const desk;
    int const folder = ::open(desk.path().c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC);
    REQUIRE(::flock(folder, LOCK_EX) == 0);
    pid_t const child = ::fork();
    if (child == 0) ::_exit(test::become(desk.path(), {"properties", "set", "f", "k", "v"}));
    ::usleep(50000);
    int status = 0;
    CHECK(::waitpid(child, &status, WNOHANG) == 0);
    CHECK(desk.names().empty());
    ::close(folder); // and with it the lock
    CHECK(::waitpid(child, &status, 0) == child);
    CHECK(desk.read("f") == "k=v\n");
}
