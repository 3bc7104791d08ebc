// Objects of each class in a known state; script/check-gdb stops at `shown` and prints them.
#include <koru/datafile.h>
#include <koru/datetime.h>
#include <koru/dynamiclibrary.h>
#include <koru/event.h>
#include <koru/file.h>
#include <koru/initializationfile.h>
#include <koru/logfile.h>
#include <koru/mutex.h>
#include <koru/propertyfile.h>
#include <koru/thread.h>
#include <koru/timer.h>
#include <koru/uuid.h>

#include <fstream>
#include <string>
#include <vector>

using Koru::File;

namespace {

/// Where the debugger stops.
__attribute__((noinline)) void shown() { asm volatile(""); }

class Counter : public Koru::Thread {
public:
    void* run(void* argument) override { return ++*static_cast<int*>(argument), argument; }
};

void write(std::string const& path, char const* text) { std::ofstream(path) << text; }

void showFiles(std::string const& folder) {
    File::Path const emptyPath;
    File::Path const path("/etc//app/app.ini");
    File file((File::Path(folder + "file")));
    file.open(File::READ | File::WRITE);
    File& reference = file;
    File closed(L"gr\u00FC\u00DFe \"quoted\"");
    write(folder + "app.ini", "[Window]\nwidth=800\n[Net]\nproxy=\n");
    Koru::InitializationFile settings(File::Path(folder + "app.ini"));
    settings.open(File::READ | File::WRITE);
    settings.setValue(L"Window", L"title", L"Hello");
    write(folder + "app.properties", "language=sr\n");
    Koru::PropertyFile properties(File::Path(folder + "app.properties"));
    properties.open(File::READ);
    Koru::DataFile records(File::Path(folder + "records.dat"));
    records.open(File::READ | File::WRITE);
    records.insert(Koru::DataFile::Record(L"intro", {1, 2, 255}));
    records.insert(Koru::DataFile::Record(L"final", {}));
    Koru::LogFile log(File::Path(folder + "app.log"));
    log.open(File::WRITE);
    Koru::DataFile::Record const record(L"long", std::vector<unsigned char>(20, 7));
    Koru::DataFile::Record const emptyRecord;
    settings.lock();
    settings.lock();
    shown();
    reference.close();
    settings.unlock();
    settings.unlock();
}

void showValues() {
    Koru::Mutex freeMutex;
    Koru::Mutex heldMutex;
    heldMutex.lock();
    Koru::Event autoReset(true);
    autoReset.signal();
    Koru::Event manualReset(false);
    Counter unstarted;
    Counter toBeDetached;
    toBeDetached.detach();
    Counter joined;
    int count = 0;
    joined.start(&count);
    joined.join();
    Koru::DateTime date("2026-11-22 14:30:05");
    date.setMillisecond(250);
    date.setOffset(-90);
    Koru::DateTime const day("2026-11-22", Koru::DateTime::DATE);
    Koru::Timer const timer;
    Koru::Uuid const uuid(std::string("6BA7B810-9DAD-11D1-80B4-00C04FD430C8"));
    Koru::DynamicLibrary loaded(L"libm.so.6");
    loaded.load();
    Koru::DynamicLibrary const unloaded(L"none.so");
    shown();
    heldMutex.unlock();
}

} // namespace

int main(int, char** arguments) {
    showFiles(std::string(arguments[1]) + "/");
    showValues();
}
