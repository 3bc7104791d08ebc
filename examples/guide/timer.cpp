#include <koru/timer.h>

#include <iostream>
#include <sstream>

int main() {
    Koru::Timer const timer; // starts now
    std::ostringstream text;
    text << timer; // the seconds since then, in steps of 128
    std::cout << text.str() << '\n';
}
