#include <koru/datetime.h>

#include <ctime>
#include <iostream>

#include <sys/time.h>

using Koru::DateTime;

int main() {
    DateTime const seconds(static_cast<long>(std::time(nullptr)));

    timeval now = {};
    gettimeofday(&now, nullptr);
    DateTime const milliseconds(now);

    std::cout << std::boolalpha << (seconds <= milliseconds) << ' '
              << (seconds.getMillisecond() == 0) << ' ' << (milliseconds.getMillisecond() < 1000)
              << '\n';
}
