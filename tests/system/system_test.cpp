// The host and the operations on whole files. The host is asked as it is, through functions that
// come before the C library's, and in a child process that has a host name of its own.
#include <koru/file.h>
#include <koru/string.h>
#include <koru/system.h>

#include <arpa/inet.h>
#include <dlfcn.h>
#include <netdb.h>
#include <nss.h>
#include <sched.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <sys/utsname.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstddef>
#include <cstdio>
#include <filesystem>
#include <set>
#include <string>
#include <type_traits>
#include <vector>

#include <doctest/doctest.h>

#include "support/skip.h"
#include "support/subprocess.h"
#include "support/tempdir.h"

namespace {

using Koru::File;
using Koru::System;
using Texts = std::vector<std::string>;

/// What the C library answers about the host while an object of this kind exists, and what it was
/// asked.
class Host {
public:
    Host() { current = this; }
    Host(char const* official, std::vector<char const*> const& addresses) : Host() {
        resolveTo(official, addresses);
    }
    Host(Host const&) = delete;
    Host& operator=(Host const&) = delete;
    ~Host() { current = nullptr; }

    /// Has the resolver answer with an official name (which may be null) and IPv4 addresses.
    void resolveTo(char const* official, std::vector<char const*> const& addresses) {
        official_ = official == nullptr ? "" : official;
        addresses_.clear();
        list_.clear();
        for (char const* address : addresses) addresses_.push_back(::inet_addr(address));
        for (in_addr_t& address : addresses_) list_.push_back(reinterpret_cast<char*>(&address));
        list_.push_back(nullptr);
        entry_ = {official == nullptr ? nullptr : official_.data(), aliases_, AF_INET,
                  sizeof(in_addr_t), list_.data()};
        entry = &entry_;
    }

    bool hasName = true;
    std::string name = "answered";
    hostent* entry = nullptr; ///< of the resolver

    std::vector<std::size_t> lengths; ///< of the buffers for the name
    bool buffersWereZero = true;
    Texts resolved;

    static Host* current;

private:
    std::string official_;
    std::string alias_ = "alias";
    char* aliases_[2] = {alias_.data(), nullptr};
    std::vector<in_addr_t> addresses_;
    std::vector<char*> list_;
    hostent entry_ = {};
};
Host* Host::current = nullptr;

template <class Function>
Function* real(char const* name) {
    return reinterpret_cast<Function*>(::dlsym(RTLD_NEXT, name));
}

} // namespace

extern "C" int gethostname(char* buffer, std::size_t length) noexcept {
    Host* const host = Host::current;
    if (host == nullptr) return real<int(char*, std::size_t)>("gethostname")(buffer, length);
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
    if (host == nullptr) return real<hostent*(char const*)>("gethostbyname")(name);
    host->resolved.push_back(name);
    return host->entry;
}

namespace {

/// Name, official name and address.
std::string answers() {
    return Koru::make_string(System::getName()) + "|" + Koru::make_string(System::getIpHostName()) +
           "|" + Koru::make_string(System::getIpAddress());
}

int const NOT_ALLOWED = 77;

/// Runs in a child process: gives it a host name and a hosts file of its own and prints what the
/// library says then. Nothing outside of the process changes, and no name server is asked.
int answerAs(std::string const& name, std::string const& hostsFile) {
    if (::unshare(CLONE_NEWUTS | CLONE_NEWNS) != 0 ||
        ::mount("none", "/", "none", MS_REC | MS_PRIVATE, nullptr) != 0 ||
        ::mount(hostsFile.c_str(), "/etc/hosts", "none", MS_BIND, nullptr) != 0 ||
        ::sethostname(name.data(), name.size()) != 0)
        return NOT_ALLOWED;
    if (::__nss_configure_lookup("hosts", "files") != 0) return 1;
    return std::fputs(answers().c_str(), stdout) < 0 ? 1 : 0;
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
        test::skipped("a host name and a hosts file of one's own are not allowed");
        return;
    }
    CHECK(outcome.exitCode == 0);
    CHECK(outcome.out == name + "|" + expected);
}

} // namespace

TEST_CASE("the system has nothing but static functions") {
    CHECK(std::is_empty_v<System>);
    CHECK(!std::is_polymorphic_v<System>);
    CHECK(std::is_trivially_destructible_v<System>);
}

TEST_CASE("the type is 0 and the version is empty, on every call") {
    for (int call = 0; call < 3; ++call) {
        CHECK(System::getType() == 0);
        CHECK(System::getVersion().empty());
    }
}

TEST_CASE("the name is the host's") {
    utsname system = {};
    REQUIRE(::uname(&system) == 0);
    CHECK(Koru::make_string(System::getName()) == system.nodename);
    char buffer[256] = {};
    REQUIRE(::gethostname(buffer, sizeof buffer) == 0);
    CHECK(Koru::make_string(System::getName()) == buffer);
}

TEST_CASE("each query asks for the name with a buffer of 128 zero bytes") {
    Host const host("official.example", {"192.0.2.1"});
    CHECK(answers() == "answered|official.example|192.0.2.1");
    CHECK(host.lengths == std::vector<std::size_t>{128, 128, 128});
    CHECK(host.buffersWereZero);
    CHECK(host.resolved == Texts{"answered", "answered"});
}

TEST_CASE("all three are empty when the host does not tell its name") {
    Host host("official.example", {"192.0.2.1"});
    host.hasName = false;
    CHECK(answers() == "||");
    CHECK(host.resolved.empty());
}

TEST_CASE("the name is read as UTF-8 up to its first zero byte") {
    struct Row {
        char const* label;
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
        CHECK(System::getName() == row.expected);
        CHECK(System::getIpHostName().empty());
        CHECK(host.resolved == Texts{row.bytes.c_str()});
    }
}

TEST_CASE("an empty name is looked up like any other") {
    Host host("official.example", {"192.0.2.1"});
    host.name.clear();
    CHECK(answers() == "|official.example|192.0.2.1");
    CHECK(host.resolved == Texts{"", ""});
}

TEST_CASE("official name and address are empty when the name does not resolve, and only they") {
    Host const host;
    CHECK(answers() == "answered||");
}

TEST_CASE("an entry without an official name has an address") {
    Host const host(nullptr, {"198.51.100.7"});
    CHECK(answers() == "answered||198.51.100.7");
}

TEST_CASE("an entry without addresses has an official name") {
    Host const host("official.example", {});
    CHECK(answers() == "answered|official.example|");
    host.entry->h_addr_list = nullptr;
    CHECK(answers() == "answered|official.example|");
}

TEST_CASE("of several addresses the first counts, in dotted decimal") {
    for (char const* first :
         {"127.0.0.1", "203.0.113.9", "0.0.0.0", "255.255.255.255", "1.2.3.4"}) {
        Host host("official.example", {first});
        CHECK(answers() == std::string("answered|official.example|") + first);
        host.resolveTo("official.example", {first, "127.0.0.1", "10.0.0.1"});
        CHECK(answers() == std::string("answered|official.example|") + first);
    }
}

TEST_CASE("the official name is the resolver's, read as UTF-8, not the name that was asked for") {
    Host const host("b\303\274cher.example", {"192.0.2.1"});
    CHECK(System::getIpHostName() == L"b\u00FCcher.example");
}

TEST_CASE("every query asks again") {
    Host host("first.example", {"192.0.2.1"});
    host.name = "before";
    CHECK(answers() == "before|first.example|192.0.2.1");
    host.name = "after";
    host.resolveTo("second.example", {"192.0.2.2"});
    CHECK(answers() == "after|second.example|192.0.2.2");
}

TEST_CASE("what was returned stays as it is when the C library's storage changes") {
    Host host("first.example", {"192.0.2.1"});
    std::wstring const name = System::getIpHostName();
    std::wstring const address = System::getIpAddress();
    host.resolveTo("other.example", {"192.0.2.222"});
    CHECK(answers() == "answered|other.example|192.0.2.222");
    CHECK(name == L"first.example");
    CHECK(address == L"192.0.2.1");
}

TEST_CASE("a host that is in its hosts file has an official name and an address") {
    checkHost("koru-host", "127.0.0.1 localhost\n192.0.2.17 koru-host.example koru-host\n",
              "koru-host.example|192.0.2.17");
}

TEST_CASE("a host that is not in its hosts file has a name alone") {
    checkHost("koru-absent", "127.0.0.1 localhost\n192.0.2.17 koru-host\n", "|");
}

TEST_CASE("a host with a name of 64 bytes is found by the whole of it") {
    std::string const name = "h" + std::string(62, 'o') + "t";
    checkHost(name, "192.0.2.64 " + name + "\n", name + "|192.0.2.64");
    checkHost(name, "192.0.2.64 " + name.substr(0, 63) + "\n", "|");
}

namespace {

/// Calls an operation on one file with the first of two names.
template <bool (*operation)(std::wstring const&)>
bool onFirst(std::wstring const& from, std::wstring const&) {
    return operation(from);
}

/// A directory with something of each kind.
struct Filled : test::TempDir {
    Filled() {
        test::writeFile(*this / "full", "content");
        test::writeFile(*this / "other", "other content");
        test::writeFile(*this / "empty", "");
        test::writeFile(*this / "readonly", "kept");
        REQUIRE(::chmod((*this / "readonly").c_str(), 0400) == 0);
        test::writeFile(*this / "gr\303\266\303\237e", "beyond ASCII");
        std::filesystem::create_directory(*this / "directory");
        std::filesystem::create_directory(*this / "occupied");
        test::writeFile(*this / "occupied/inside", "x");
        std::filesystem::create_symlink("full", *this / "link");
        std::filesystem::create_symlink("nowhere", *this / "dangling");
    }
};

/// The text of a file; an address in it, which differs from call to call, as "<address>".
std::string contentOf(std::string const& path) {
    std::string const text = test::readFile(path);
    bool const address = text.size() > 2 && text.compare(0, 2, "0x") == 0 &&
                         text.find_first_not_of("0123456789abcdef", 2) == std::string::npos;
    return address ? "<address>" : text;
}

/// Adds a line for what is at a path and for everything below: name, permissions, content or target.
void addState(std::filesystem::path const& path, std::string const& name,
              std::set<std::string>& lines) {
    if (std::filesystem::is_symlink(path)) {
        lines.insert(name + " -> " + std::filesystem::read_symlink(path).string() + "\n");
        return;
    }
    struct stat status = {};
    REQUIRE(::stat(path.c_str(), &status) == 0);
    std::string const line = name + " " + std::to_string(status.st_mode);
    lines.insert(line + (S_ISREG(status.st_mode) ? " " + contentOf(path) : "") + "\n");
    if (!S_ISDIR(status.st_mode)) return;
    test::letIn(path);
    for (auto const& entry : std::filesystem::directory_iterator(path))
        addState(entry.path(), name + "/" + entry.path().filename().string(), lines);
}

/// Everything in a directory, in order.
std::string stateOf(test::TempDir const& directory) {
    std::set<std::string> lines;
    addState(directory.path(), "", lines);
    std::string state;
    for (std::string const& line : lines) state += line;
    return state;
}

using Operation = bool (*)(std::wstring const&, std::wstring const&);

/// Calls both in directories that are alike: on names of what can be there and, where the second
/// name counts, for each of them on names of what can be in their way.
void checkAlike(Operation ofSystem, Operation ofFile, bool secondCounts) {
    std::wstring const sources[] = {
        L"full",
        L"empty",
        L"readonly",
        L"gr\u00F6\u00DFe",
        L"link",
        L"dangling",
        L"directory",
        L"occupied",
        L"missing",
        L"missing/x",
        L"full/x",
        L"",
        std::wstring(L"full\0ignored", 12),
    };
    std::vector<std::wstring> targets = {L"other"};
    if (secondCounts)
        targets = {L"other",  L"full",    L"dangling",  L"directory", L"directory/new",
                   L"absent", L"missing", L"missing/x", L""};
    int succeeded = 0;
    int failed = 0;
    for (std::wstring const& from : sources) {
        CAPTURE(Koru::make_string(from));
        for (std::wstring const& to : targets) {
            CAPTURE(Koru::make_string(to));
            Filled const bySystem;
            Filled const byFile;
            std::wstring const system = bySystem.wide("");
            std::wstring const file = byFile.wide("");
            bool const result = ofSystem(system + from, system + to);
            CHECK(result == ofFile(file + from, file + to));
            CHECK(stateOf(bySystem) == stateOf(byFile));
            ++(result ? succeeded : failed);
        }
    }
    CHECK(succeeded > 1);
    CHECK(failed > 1);
}

} // namespace

TEST_CASE("existsFile does what File::exists does, whatever is there") {
    checkAlike(onFirst<System::existsFile>, onFirst<File::exists>, false);
}

TEST_CASE("renameFile does what File::rename does, whatever is in its way") {
    checkAlike(System::renameFile, File::rename, true);
}

TEST_CASE("deleteFile does what File::remove does, whatever is in its way") {
    checkAlike(onFirst<System::deleteFile>, onFirst<File::remove>, false);
}

TEST_CASE("copyFile leaves the text of a pointer, null when there was nothing to copy") {
    checkAlike(System::copyFile, File::copy, true);
    Filled const directory;
    CHECK(System::copyFile(directory.wide("full"), directory.wide("copy")));
    CHECK(contentOf(directory / "copy") == "<address>");
    CHECK(!System::copyFile(directory.wide("missing"), directory.wide("null")));
    CHECK(test::readFile(directory / "null") == "0");
}

TEST_CASE("createFile does what File::create does, whatever is in its way") {
    checkAlike(onFirst<System::createFile>, onFirst<File::create>, false);
}

TEST_CASE("the operations on files do nothing for a name that is empty") {
    CHECK(!System::existsFile(L""));
    CHECK(System::deleteFile(L""));
    CHECK(!System::renameFile(L"", L""));
    CHECK(!System::copyFile(L"", L""));
    CHECK(!System::createFile(L""));
}

TEST_CASE("existsFile is true for files, directories and the targets of links") {
    Filled const directory;
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
