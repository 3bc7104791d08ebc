#include <koru/system.h>

#include <arpa/inet.h>
#include <netdb.h>
#include <unistd.h>

#include <array>
#include <cstring>

#include <koru/file.h>
#include <koru/string.h>

namespace Koru {

namespace {

constexpr std::size_t NAME_SIZE = 128;

/// The host's name, which ends with a zero byte even if it fills NAME_SIZE; empty on failure.
class HostName {
public:
    HostName() : bytes_(), known_(::gethostname(bytes_.data(), NAME_SIZE) == 0) {
        if (!known_) bytes_[0] = '\0';
    }

    char const* bytes() const { return bytes_.data(); }

    /// The resolver's entry for the host, in static storage; null if it has none.
    hostent const* entry() const { return known_ ? ::gethostbyname(bytes()) : nullptr; }

private:
    std::array<char, NAME_SIZE + 1> bytes_;
    bool known_;
};

} // namespace

int System::getType() { return 0; }

std::wstring System::getVersion() { return std::wstring(); }

std::wstring System::getName() { return make_wstring(HostName().bytes()); }

std::wstring System::getIpHostName() {
    HostName const name;
    hostent const* const entry = name.entry();
    return entry == nullptr ? std::wstring() : make_wstring(entry->h_name);
}

std::wstring System::getIpAddress() {
    HostName const name;
    hostent const* const entry = name.entry();
    if (entry == nullptr || entry->h_addr_list == nullptr || entry->h_addr_list[0] == nullptr)
        return std::wstring();
    in_addr address;
    std::memcpy(&address, entry->h_addr_list[0], sizeof address);
    return make_wstring(::inet_ntoa(address));
}

bool System::existsFile(std::wstring const& path) { return File::exists(path); }

bool System::renameFile(std::wstring const& from, std::wstring const& to) {
    return File::rename(from, to);
}

bool System::deleteFile(std::wstring const& path) { return File::remove(path); }

bool System::copyFile(std::wstring const& from, std::wstring const& to) {
    return File::copy(from, to);
}

bool System::createFile(std::wstring const& path) { return File::create(path); }

} // namespace Koru
