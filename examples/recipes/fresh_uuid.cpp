#include <koru/uuid.h>

#include <fstream>
#include <iostream>
#include <map>
#include <string>

// The kernel makes a new identifier at each reading.
Koru::Uuid fresh() {
    std::string text;
    std::getline(std::ifstream("/proc/sys/kernel/random/uuid"), text);
    return Koru::Uuid(text);
}

// Identifiers have no order of their own; their text has.
struct ByText {
    bool operator()(Koru::Uuid const& a, Koru::Uuid const& b) const {
        return static_cast<std::string>(a) < static_cast<std::string>(b);
    }
};

int main() {
    std::map<Koru::Uuid, int, ByText> places;
    Koru::Uuid const first = fresh();
    places[first] = 1;
    places[fresh()] = 2;
    std::cout << places.size() << ' ' << places[first] << '\n';
}
