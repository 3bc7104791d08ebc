// The host and the operations on whole files. The host is asked as it is, through functions that
// stand before the C library's, and in a child process that has a host name of its own.
#include <koru/file.h>
#include <koru/string.h>
#include <koru/system.h>

#include <arpa/inet.h>
#include <errno.h>
#include <netdb.h>
#include <netinet/in.h>
#include <nss.h>
#include <sched.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <sys/utsname.h>
#include <unistd.h>

#include <dlfcn.h>

#include <algorithm>
#include <cstddef>
#include <cstdio>
#include <cstring>
#include <filesystem>
#include <functional>
#include <string>
#include <type_traits>
#include <vector>

#include <doctest/doctest.h>

#include "support/subprocess.h"
#include "support/tempdir.h"

namespace {

/// What the C library answers about the host while an object of this kind exists, and what it was
/// asked.
class Host {
public:
    Host() { current = this; }
    Host(Host const&) = delete;
    Host& operator=(Host const&) = delete;
    ~Host() { current = nullptr; }

    bool hasName = true;
    std::string name = "answered";
    hostent* entry = nullptr; ///< of the resolver

    std::vector<std::size_t> lengths; ///< of the buffers for the name
    bool buffersWereZero = true;
    std::vector<std::string> resolved;

    static Host* current;
};
Host* Host::current = nullptr;

template <class Function>
Function* next(char const* name) {
    return reinterpret_cast<Function*>(::dlsym(RTLD_NEXT, name));
}

} // namespace

extern "C" int gethostname(char* buffer, std::size_t length) noexcept {
    Host* const host = Host::current;
    if (host == nullptr) return next<int(char*, std::size_t)>("gethostname")(buffer, length);
    host->lengths.push_back(length);
    host->buffersWereZero = host->buffersWereZero &&
                            std::all_of(buffer, buffer + length, [](char c) { return c == '\0'; });
    // What a failing call leaves in the buffer is not to be used.
    std::copy_n(host->name.data(), std::min(length, host->name.size()), buffer);
    if (host->hasName) return 0;
    errno = EPERM;
    return -1;
}

extern "C" hostent* gethostbyname(char const* name) {
    Host* const host = Host::current;
    if (host == nullptr) return next<hostent*(char const*)>("gethostbyname")(name);
    host->resolved.push_back(name);
    return host->entry;
}

namespace {

using Koru::File;
using Koru::System;

std::string hostName() { return Koru::make_string(System::getName()); }
std::string ipHostName() { return Koru::make_string(System::getIpHostName()); }
std::string ipAddress() { return Koru::make_string(System::getIpAddress()); }

/// A resolver's entry with the given official name (which may be null) and IPv4 addresses.
class Entry {
public:
    Entry(char const* name, std::vector<std::string> const& addresses) : addresses_() {
        if (name != nullptr) name_ = name;
        for (std::string const& address : addresses) {
            in_addr binary = {};
            REQUIRE(::inet_pton(AF_INET, address.c_str(), &binary) == 1);
            addresses_.push_back(binary);
        }
        for (in_addr& address : addresses_) list_.push_back(reinterpret_cast<char*>(&address));
        list_.push_back(nullptr);
        aliases_.push_back(&alias_[0]);
        aliases_.push_back(nullptr);
        entry_.h_name = name == nullptr ? nullptr : &name_[0];
        entry_.h_aliases = aliases_.data();
        entry_.h_addrtype = AF_INET;
        entry_.h_length = sizeof(in_addr);
        entry_.h_addr_list = list_.data();
    }
    Entry(Entry const&) = delete;
    Entry& operator=(Entry const&) = delete;
    ~Entry() = default;

    hostent* get() { return &entry_; }

private:
    std::string name_;
    std::string alias_ = "alias";
    std::vector<in_addr> addresses_;
    std::vector<char*> list_;
    std::vector<char*> aliases_;
    hostent entry_ = {};
};

/// A line for each answer, as a child process prints them.
std::string answers() {
    return "name=" + hostName() + "\nofficial=" + ipHostName() + "\naddress=" + ipAddress() + "\n";
}

int const NOT_ALLOWED = 77;

/// Runs in a child process: gives it a host name and a hosts file of its own and prints what the
/// library says then. Nothing outside of the process changes, and no name server is asked.
int answerAs(std::string const& name, std::string const& hostsFile) {
    if (::unshare(CLONE_NEWUTS | CLONE_NEWNS) != 0) return NOT_ALLOWED;
    if (::mount("none", "/", nullptr, MS_REC | MS_PRIVATE, nullptr) != 0) return NOT_ALLOWED;
    if (::mount(hostsFile.c_str(), "/etc/hosts", nullptr, MS_BIND, nullptr) != 0) {
        return NOT_ALLOWED;
    }
    if (::sethostname(name.data(), name.size()) != 0) return NOT_ALLOWED;
    if (::__nss_configure_lookup("hosts", "files") != 0) return 1;
    std::string const text = answers();
    return std::fwrite(text.data(), 1, text.size(), stdout) == text.size() ? 0 : 1;
}

/// Checks what the library says on a host with this name, these lines in its hosts file and nobody
/// else to ask.
void checkHost(std::string const& name, std::string const& hosts, std::string const& expected) {
    CAPTURE(name);
    CAPTURE(hosts);
    test::TempDir const directory;
    test::writeFile(directory / "hosts", hosts);
    test::Outcome const outcome =
        test::inChild([&] { return answerAs(name, directory / "hosts"); });
    if (outcome.exitCode == NOT_ALLOWED) {
        MESSAGE("not allowed to make a host name of one's own here: not checked");
        return;
    }
    CHECK(outcome.exitCode == 0);
    CHECK(outcome.out == expected);
}

} // namespace

// =========================================================================================
// platform

TEST_CASE("the system has nothing but static functions") {
    CHECK(std::is_empty<System>::value);
    CHECK(!std::is_polymorphic<System>::value);
    CHECK(std::is_trivially_destructible<System>::value);
}

TEST_CASE("the type is 0 and the version is empty, on every call") {
    for (int call = 0; call < 3; ++call) {
        CHECK(System::getType() == 0);
        CHECK(System::getVersion().empty());
    }
}

// ========================================================================================= host

TEST_CASE("the name is the host's") {
    utsname system = {};
    REQUIRE(::uname(&system) == 0);
    CHECK(hostName() == system.nodename);
    char buffer[256] = {};
    REQUIRE(::gethostname(buffer, sizeof buffer) == 0);
    CHECK(hostName() == buffer);
}

TEST_CASE("each query asks for the name with a buffer of 128 zero bytes") {
    Host host;
    Entry entry("official.example", {"192.0.2.1"});
    host.entry = entry.get();
    CHECK(hostName() == "answered");
    CHECK(ipHostName() == "official.example");
    CHECK(ipAddress() == "192.0.2.1");
    CHECK(host.lengths == std::vector<std::size_t>{128, 128, 128});
    CHECK(host.buffersWereZero);
    CHECK(host.resolved == std::vector<std::string>{"answered", "answered"});
}

TEST_CASE("all three are empty when the host does not tell its name") {
    Host host;
    Entry entry("official.example", {"192.0.2.1"});
    host.entry = entry.get();
    host.hasName = false;
    CHECK(hostName().empty());
    CHECK(ipHostName().empty());
    CHECK(ipAddress().empty());
    CHECK(host.resolved.empty());
}

TEST_CASE("the name is read as UTF-8 up to its first zero byte") {
    struct Row {
        std::string label;
        std::string bytes;
        std::wstring expected;
    };
    Row const rows[] = {
        {"64 bytes, the system's longest", std::string(64, 'h'), std::wstring(64, L'h')},
        {"127 bytes, the buffer's longest", std::string(127, 'h'), std::wstring(127, L'h')},
        {"128 bytes, none of them zero", std::string(128, 'h'), std::wstring(128, L'h')},
        {"zero byte inside", std::string("ab\0cd", 5), L"ab"},
        {"UTF-8", "gr\303\266\303\237e", L"gr\u00F6\u00DFe"},
        {"cut UTF-8", "abc\303", L"abc?"},
    };
    for (Row const& row : rows) {
        CAPTURE(row.label);
        Host host;
        host.name = row.bytes;
        bool const same = System::getName() == row.expected;
        CHECK(same);
        CHECK(ipHostName().empty());
        CHECK(host.resolved == std::vector<std::string>{row.bytes.substr(0, row.bytes.find('\0'))});
    }
}

TEST_CASE("an empty name is looked up like any other") {
    Host host;
    host.name.clear();
    Entry entry("official.example", {"192.0.2.1"});
    host.entry = entry.get();
    CHECK(hostName().empty());
    CHECK(ipHostName() == "official.example");
    CHECK(ipAddress() == "192.0.2.1");
    CHECK(host.resolved == std::vector<std::string>{"", ""});
}

TEST_CASE("official name and address are empty when the name does not resolve, and only they") {
    Host const host;
    CHECK(hostName() == "answered");
    CHECK(ipHostName().empty());
    CHECK(ipAddress().empty());
}

TEST_CASE("an entry without an official name has an address") {
    Host host;
    Entry entry(nullptr, {"198.51.100.7"});
    host.entry = entry.get();
    CHECK(ipHostName().empty());
    CHECK(ipAddress() == "198.51.100.7");
}

TEST_CASE("an entry without addresses has an official name") {
    Host host;
    Entry entry("official.example", {});
    host.entry = entry.get();
    CHECK(ipHostName() == "official.example");
    CHECK(ipAddress().empty());
}

TEST_CASE("of several addresses the first counts, in dotted decimal") {
    struct Row {
        std::vector<std::string> addresses;
        char const* expected;
    };
    Row const rows[] = {
        {{"127.0.0.1"}, "127.0.0.1"},
        {{"203.0.113.9", "127.0.0.1", "10.0.0.1"}, "203.0.113.9"},
        {{"0.0.0.0", "10.0.0.1"}, "0.0.0.0"},
        {{"255.255.255.255"}, "255.255.255.255"},
        {{"1.2.3.4"}, "1.2.3.4"},
    };
    for (Row const& row : rows) {
        CAPTURE(row.expected);
        Host host;
        Entry entry("official.example", row.addresses);
        host.entry = entry.get();
        CHECK(ipAddress() == row.expected);
    }
}

TEST_CASE("the official name is the resolver's, read as UTF-8, not the name that was asked for") {
    Host host;
    Entry entry("b\303\274cher.example", {"192.0.2.1"});
    host.entry = entry.get();
    bool const same = System::getIpHostName() == L"b\u00FCcher.example";
    CHECK(same);
}

TEST_CASE("every query asks anew") {
    Host host;
    host.name = "before";
    CHECK(hostName() == "before");
    host.name = "after";
    CHECK(hostName() == "after");
    Entry first("first.example", {"192.0.2.1"});
    host.entry = first.get();
    CHECK(ipHostName() == "first.example");
    CHECK(ipAddress() == "192.0.2.1");
    Entry second("second.example", {"192.0.2.2"});
    host.entry = second.get();
    CHECK(ipHostName() == "second.example");
    CHECK(ipAddress() == "192.0.2.2");
}

TEST_CASE("what was returned stays as it is when the C library's storage changes") {
    Host host;
    Entry first("first.example", {"192.0.2.1"});
    host.entry = first.get();
    std::wstring const name = System::getIpHostName();
    std::wstring const address = System::getIpAddress();
    Entry second("other.example", {"192.0.2.222"});
    host.entry = second.get();
    CHECK(ipAddress() == "192.0.2.222");
    bool const same = name == L"first.example" && address == L"192.0.2.1";
    CHECK(same);
}

TEST_CASE("a host that is in its hosts file has an official name and an address") {
    checkHost("koru-host", "127.0.0.1 localhost\n192.0.2.17 koru-host.example koru-host\n",
              "name=koru-host\nofficial=koru-host.example\naddress=192.0.2.17\n");
}

TEST_CASE("a host that is not in its hosts file has a name alone") {
    checkHost("koru-absent", "127.0.0.1 localhost\n192.0.2.17 koru-host\n",
              "name=koru-absent\nofficial=\naddress=\n");
}

TEST_CASE("a host with a name of 64 bytes is found by the whole of it") {
    std::string const name = "h" + std::string(62, 'o') + "t";
    checkHost(name, "192.0.2.64 " + name + "\n",
              "name=" + name + "\nofficial=" + name + "\naddress=192.0.2.64\n");
    checkHost(name, "192.0.2.64 " + name.substr(0, 63) + "\n",
              "name=" + name + "\nofficial=\naddress=\n");
}

// ========================================================================================= files

namespace {

/// A file operation and its counterpart: called on the two names of a row, of which operations on
/// one file take the first.
struct Operation {
    char const* label;
    bool hasTarget;
    std::function<bool(std::wstring const&, std::wstring const&)> system;
    std::function<bool(std::wstring const&, std::wstring const&)> file;
};

std::vector<Operation> operations() {
    using Name = std::wstring const&;
    return {
        {"exists", false, [](Name a, Name) { return System::existsFile(a); },
         [](Name a, Name) { return File::exists(a); }},
        {"rename", true, [](Name a, Name b) { return System::renameFile(a, b); },
         [](Name a, Name b) { return File::rename(a, b); }},
        {"remove", false, [](Name a, Name) { return System::deleteFile(a); },
         [](Name a, Name) { return File::remove(a); }},
        {"copy", true, [](Name a, Name b) { return System::copyFile(a, b); },
         [](Name a, Name b) { return File::copy(a, b); }},
        {"create", false, [](Name a, Name) { return System::createFile(a); },
         [](Name a, Name) { return File::create(a); }},
    };
}

/// A directory with something of each kind.
void fill(test::TempDir const& directory) {
    test::writeFile(directory / "full", "content");
    test::writeFile(directory / "other", "other content");
    test::writeFile(directory / "empty", "");
    test::writeFile(directory / "readonly", "kept");
    REQUIRE(::chmod((directory / "readonly").c_str(), 0400) == 0);
    test::writeFile(directory / "gr\303\266\303\237e", "beyond ASCII");
    std::filesystem::create_directory(directory / "directory");
    std::filesystem::create_directory(directory / "occupied");
    test::writeFile(directory / "occupied/inside", "x");
    std::filesystem::create_symlink("full", directory / "link");
    std::filesystem::create_symlink("nowhere", directory / "dangling");
}

/// The text of a file; an address in it, which differs from call to call, as "<address>".
std::string contentOf(std::filesystem::path const& path) {
    std::string const text = test::readFile(path.string());
    bool const address = text.size() > 2 && text.compare(0, 2, "0x") == 0 &&
                         text.find_first_not_of("0123456789abcdef", 2) == std::string::npos;
    return address ? "<address>" : text;
}

/// Everything in a directory: names, permissions, contents and targets, in order.
std::string stateOf(test::TempDir const& directory) {
    std::vector<std::string> lines;
    for (auto const& entry : std::filesystem::recursive_directory_iterator(directory.path())) {
        std::string line = entry.path().string().substr(directory.path().size()) + " ";
        if (entry.is_symlink()) {
            line += "-> " + std::filesystem::read_symlink(entry.path()).string();
        } else {
            struct stat status = {};
            REQUIRE(::stat(entry.path().c_str(), &status) == 0);
            line += std::to_string(status.st_mode);
            if (entry.is_regular_file()) line += " " + contentOf(entry.path());
        }
        lines.push_back(line);
    }
    std::sort(lines.begin(), lines.end());
    std::string state;
    for (std::string const& line : lines) state += line + "\n";
    return state;
}

} // namespace

TEST_CASE("the operations on files do what those of File do, whatever is in their way") {
    std::wstring const sources[] = {
        L"full",
        L"readonly",
        L"gr\u00F6\u00DFe",
        L"link",
        L"dangling",
        L"directory",
        L"occupied",
        L"missing",
        L"full/x",
        L"",
        std::wstring(L"full\0ignored", 12),
    };
    std::wstring const targets[] = {
        L"other", L"full", L"dangling", L"directory", L"directory/new", L"missing/x", L"",
    };
    int done = 0;
    int succeeded = 0;
    for (Operation const& operation : operations()) {
        for (std::wstring const& from : sources) {
            for (std::wstring const& to : targets) {
                if (!operation.hasTarget && &to != &targets[0]) break;
                CAPTURE(operation.label);
                CAPTURE(Koru::make_string(from));
                CAPTURE(Koru::make_string(to));
                test::TempDir const bySystem;
                test::TempDir const byFile;
                fill(bySystem);
                fill(byFile);
                std::wstring const system = bySystem.wide("");
                std::wstring const file = byFile.wide("");
                bool const result = operation.system(system + from, system + to);
                CHECK(result == operation.file(file + from, file + to));
                CHECK(stateOf(bySystem) == stateOf(byFile));
                ++done;
                if (result) ++succeeded;
            }
        }
    }
    CHECK(done == 3 * 11 + 2 * 11 * 7);
    CHECK(succeeded > 40);
    CHECK(succeeded < done - 40);
}

TEST_CASE("the operations on files do nothing for a name that is empty") {
    CHECK(!System::existsFile(L""));
    CHECK(System::deleteFile(L""));
    CHECK(!System::renameFile(L"", L""));
    CHECK(!System::copyFile(L"", L""));
    CHECK(!System::createFile(L""));
}

TEST_CASE("existsFile is true for files, directories and the targets of links") {
    test::TempDir const directory;
    fill(directory);
    for (char const* name : {"full", "empty", "readonly", "directory", "link"}) {
        CAPTURE(name);
        CHECK(System::existsFile(directory.wide(name)));
    }
    for (char const* name : {"missing", "dangling", "full/x"}) {
        CAPTURE(name);
        CHECK(!System::existsFile(directory.wide(name)));
    }
    CHECK(System::existsFile(directory.wide("gr") + L"\u00F6\u00DFe"));
}

TEST_CASE("renameFile tells by what is there afterwards whether it succeeded") {
    test::TempDir const directory;
    fill(directory);
    CHECK(System::renameFile(directory.wide("full"), directory.wide("other")));
    CHECK(test::readFile(directory / "other") == "content");
    CHECK(!System::renameFile(directory.wide("missing"), directory.wide("absent")));
    CHECK(System::renameFile(directory.wide("missing"), directory.wide("other")));
    CHECK(test::readFile(directory / "other") == "content");
    CHECK(!System::renameFile(directory.wide("other"), directory.wide("other")));
}

TEST_CASE("deleteFile deletes what is read-only and is content with what is not there") {
    test::TempDir const directory;
    fill(directory);
    CHECK(System::deleteFile(directory.wide("readonly")));
    CHECK(!std::filesystem::exists(directory / "readonly"));
    CHECK(System::deleteFile(directory.wide("readonly")));
    CHECK(System::deleteFile(directory.wide("directory")));
    CHECK(!System::deleteFile(directory.wide("occupied")));
    struct stat status = {};
    REQUIRE(::stat((directory / "occupied").c_str(), &status) == 0);
    CHECK((status.st_mode & 07777) == 0600);
    REQUIRE(::chmod((directory / "occupied").c_str(), 0700) == 0);
}

TEST_CASE("copyFile leaves the text of a pointer, null when there was nothing to copy") {
    test::TempDir const directory;
    fill(directory);
    CHECK(System::copyFile(directory.wide("full"), directory.wide("copy")));
    CHECK(contentOf(directory / "copy") == "<address>");
    CHECK(System::copyFile(directory.wide("empty"), directory.wide("other")));
    CHECK(contentOf(directory / "other") == "<address>");
    CHECK(!System::copyFile(directory.wide("missing"), directory.wide("null")));
    CHECK(test::readFile(directory / "null") == "0");
    CHECK(test::readFile(directory / "full") == "content");
}

TEST_CASE("createFile makes an empty file and empties one that is there") {
    test::TempDir const directory;
    fill(directory);
    CHECK(System::createFile(directory.wide("new")));
    CHECK(test::readFile(directory / "new").empty());
    CHECK(System::createFile(directory.wide("full")));
    CHECK(test::readFile(directory / "full").empty());
    CHECK(!System::createFile(directory.wide("missing/new")));
}
