// Prints what the library tells about the host and this program.
//
//     hostinfo
//
// A hyphen replaces what the system does not tell: a host whose name does not resolve has no
// official name and no address.
#include <koru/string.h>
#include <koru/system.h>

#include <iostream>
#include <string>

namespace {

void line(char const* label, std::wstring const& value) {
    // The library's own inserters do not write text of any length, so UTF-8 goes through the
    // standard one, which the compiler finds here, outside of namespace Koru.
    std::cout << label << (value.empty() ? "-" : Koru::make_string(value)) << '\n';
}

} // namespace

int main() {
    using Koru::System;
    std::cout << "type:          " << System::getType() << '\n';
    line("version:       ", System::getVersion());
    line("name:          ", System::getName());
    line("official name: ", System::getIpHostName());
    line("address:       ", System::getIpAddress());
    line("executable:    ", System::getProcessFileName());
    return 0;
}
