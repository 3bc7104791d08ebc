// Callers whose stack is aligned to four bytes only, as i386 had it before vectors: objects of
// older compilers, and those built with -mpreferred-stack-boundary=2. 64-bit code has no such
// callers, and the frames of code with the address sanitizer have to be aligned.
#include <doctest/doctest.h>

#include "support/sanitizers.h"

#if defined(__i386__) && !defined(KORU_ADDRESS_SANITIZER)

#include <sstream>
#include <string>
#include <vector>

#include <koru/datafile.h>
#include <koru/datetime.h>
#include <koru/dynamiclibrary.h>
#include <koru/event.h>
#include <koru/file.h>
#include <koru/initializationfile.h>
#include <koru/logfile.h>
#include <koru/mutex.h>
#include <koru/propertyfile.h>
#include <koru/string.h>
#include <koru/system.h>
#include <koru/thread.h>
#include <koru/timer.h>
#include <koru/uuid.h>

#include "support/tempdir.h"

namespace {

using Koru::File;
using Koru::System;

/// Calls a function with the stack this many bytes off an address that sixteen divides.
__attribute__((noinline)) void callOff(unsigned bytes, void (*function)(void*), void* argument) {
    asm volatile("movl %%esp, %%esi\n\t"
                 "andl $-16, %%esp\n\t"
                 "subl $16, %%esp\n\t"
                 "subl %%eax, %%esp\n\t"
                 "movl %%edx, (%%esp)\n\t"
                 "call *%%edi\n\t"
                 "movl %%esi, %%esp\n\t"
                 : "+a"(bytes), "+d"(argument)
                 : "D"(function)
                 : "esi", "ecx", "memory", "cc");
}

/// Runs a step that tells whether all went well at each alignment that a multiple of four can have.
/// Exceptions end in the step, for they cannot pass what calls it.
template <class Step>
bool runsEverywhere(Step step) {
    struct Call {
        Step& step;
        bool well;
    } call{step, true};
    auto const run = [](void* argument) {
        Call& own = *static_cast<Call*>(argument);
        try {
            own.well = own.well && own.step();
        } catch (...) {
            own.well = false;
        }
    };
    for (unsigned const off : {0U, 4U, 8U, 12U}) callOff(off, run, &call);
    return call.well;
}

/// Texts of all lengths around those that are taken in one step, of one to four bytes a character.
std::vector<std::wstring> texts() {
    std::vector<std::wstring> result;
    for (wchar_t const c : {L'a', L'\u00E9', L'\u20AC', static_cast<wchar_t>(0x1F600)}) {
        for (std::size_t size : {1U, 4U, 15U, 16U, 17U, 40U, 1000U, 3000U})
            result.push_back(std::wstring(size, c) + L"x");
    }
    return result;
}

struct Adder : Koru::Thread {
    void* run(void* argument) override {
        ++*static_cast<int*>(argument);
        return argument;
    }
};

} // namespace

TEST_CASE("strings are converted, compared and written from any stack") {
    CHECK(runsEverywhere([] {
        bool well = true;
        for (std::wstring const& text : texts()) {
            std::string const narrow = Koru::make_string(text);
            std::ostringstream out;
            Koru::operator<<(out, text);
            Koru::operator<<(out, std::string("narrow"));
            well = well && Koru::make_wstring(narrow) == text && Koru::compare(text, text) == 0 &&
                   out.str().size() == text.size() + 6;
        }
        return well;
    }));
}

TEST_CASE("paths and whole files work from any stack") {
    test::TempDir const directory;
    std::wstring const file = directory.wide("file");
    std::wstring const copy = directory.wide("copy");
    std::wstring const moved = directory.wide("moved");
    CHECK(runsEverywhere([&] {
        File::Path const absolute(directory / "some/longer/folder/file");
        File::Path const relative("folder/file");
        return absolute != relative && !System::getProcessFileName().empty() &&
               File::create(file) && File::exists(file) && File::copy(file, copy) &&
               File::rename(copy, moved) && System::deleteFile(moved);
    }));
}

TEST_CASE("files of every kind are read and written from any stack") {
    test::TempDir const directory;
    CHECK(runsEverywhere([&] {
        Koru::InitializationFile settings(directory / "settings");
        Koru::PropertyFile properties(directory / "properties");
        Koru::DataFile records(directory / "records");
        Koru::LogFile log(directory / "log");
        File* const files[] = {&settings, &properties, &records};
        for (File* const file : files) file->open(File::READ | File::WRITE);
        log.open(3U);
        for (std::wstring const& text : texts()) {
            settings.setValue(text, text, text);
            properties.setValue(text, text);
            records.insert({L"k" + text, {1, 2, 3}});
            Koru::operator<<(log, text);
        }
        bool const held = settings.getValue(L"aX", L"ax") == L"ax" &&
                          properties.getValue(L"AX") == L"ax" && records.size() > 20;
        for (File* const file : files) file->synchronize();
        settings.removeSection(L"ax");
        properties.removeKey(L"ax");
        records.remove({L"kax", {}});
        bool const enumerated =
            settings.enumerateSections().size() > 20 && properties.enumerateKeys().size() > 20;
        for (File* const file : files) file->close();
        log.close();
        return held && enumerated;
    }));
}

TEST_CASE("dates, timers and identifiers work from any stack") {
    CHECK(runsEverywhere([] {
        Koru::DateTime const date(std::string("2005-03-07 09:05:00"), 3);
        Koru::DateTime const other(static_cast<long>(date), 3);
        Koru::Timer timer;
        Koru::Uuid const uuid(std::string("0123abcd-4567-89ab-cdef-0123456789ab"));
        std::ostringstream out;
        Koru::operator<<(out, date);
        Koru::operator<<(out, timer);
        Koru::operator<<(out, uuid);
        timer.reset();
        return date == other && uuid == Koru::Uuid(static_cast<std::string>(uuid)) &&
               out.str() == "2005-03-07 09:05:000.0000123abcd-4567-89ab-cdef-0123456789ab";
    }));
}

TEST_CASE("threads, events, locks, libraries and the host work from any stack") {
    CHECK(runsEverywhere([] {
        Koru::Mutex mutex;
        mutex.lock(1);
        Koru::Event event(true);
        event.signal();
        int count = 0;
        Adder adder;
        bool const joined = adder.start(&count) && adder.join() == &count && count == 1;
        Koru::Thread::sleep(1);
        Koru::DynamicLibrary library(L"libm.so.6");
        bool const loaded = library.load() && library.getSymbol(L"cos") != nullptr;
        bool const waited = event.wait(0) == 1;
        mutex.unlock();
        return joined && loaded && waited && event.test() && !System::getName().empty();
    }));
}

#else

TEST_CASE("callers have an aligned stack" * doctest::skip(true)) {}

#endif
