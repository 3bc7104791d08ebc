#include <koru/initializationfile.h>
#include <koru/string.h>

#include <iostream>
#include <mutex>
#include <string>
#include <thread>

using Koru::File;

// Each operation takes the file's lock by itself. What must not be interrupted between two of them
// holds the lock for a scope, as for any mutex.
void countUp(Koru::InitializationFile& settings) {
    std::lock_guard<File> const lock(settings);
    std::wstring const count = settings.getValue(L"Run", L"count");
    settings.setValue(L"Run", L"count", std::to_wstring(count.empty() ? 1 : std::stoi(count) + 1));
}

int main() {
    Koru::InitializationFile settings(File::Path("count.ini"));
    settings.open(File::READ | File::WRITE);
    auto const work = [&settings] {
        for (int i = 0; i < 100; ++i) countUp(settings);
    };
    std::thread other(work);
    work();
    other.join();
    std::cout << Koru::make_string(settings.getValue(L"Run", L"count")).c_str() << '\n';
}
