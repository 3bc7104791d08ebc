#include <koru/uuid.h>

#include <iostream>
#include <string>
#include <vector>

int main() {
    // The library reads, keeps and writes identifiers. It does not make new ones.
    Koru::Uuid const id("6BA7B810-9DAD-11D1-80B4-00C04FD430C8");
    std::cout << id << '\n';
    std::vector<unsigned char> const bytes = id;
    std::cout << bytes.size() << " bytes, the first is " << int{bytes[0]} << '\n';
    std::cout << std::boolalpha << (id == Koru::Uuid(bytes)) << ' ' << (id == Koru::Uuid()) << '\n';
}
