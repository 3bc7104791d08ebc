// What applications do with files, each as one step that either says that it failed or has done all
// of its work. The sweeps run them under every fault.
#ifndef KORU_TESTS_SCENARIOS_H
#define KORU_TESTS_SCENARIOS_H

#include <exception>
#include <filesystem>
#include <functional>
#include <iterator>
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include <koru/file.h>
#include <koru/logfile.h>

#include "support/structuredfile.h"
#include "support/tempdir.h"

namespace test {

/// What a step said, and what it has read.
struct Report {
    bool succeeded = false;
    std::string seen;
};

inline bool operator==(Report const& a, Report const& b) {
    return a.succeeded == b.succeeded && a.seen == b.seen;
}

struct Scenario {
    std::string name;
    std::string before; ///< what the file holds
    std::function<Report(Place const&)> work;
};

/// What a scenario has left on the disk.
inline std::string onDisk(Place const& place) { return place.exists() ? place.bytes() : "nothing"; }

/// How a sweep keeps its faults off what a scenario does only to check; null where they are no
/// hindrance.
inline void (*keepFaultsOff)(bool) = nullptr;

/// Lets another thread lock the file, which hangs if this one has left the lock held.
inline void lockElsewhere(Koru::File& file) {
    if (keepFaultsOff != nullptr) keepFaultsOff(true);
    std::thread([&] {
        file.lock();
        file.unlock();
    }).join();
    if (keepFaultsOff != nullptr) keepFaultsOff(false);
}

/// Works with a file object. That failed if it throws or leaves a failed stream.
template <class File, class Work>
Report workWith(Place const& place, Work work) {
    Report report;
    try {
        File file(Koru::File::Path(place.path()));
        try {
            report.seen = work(file);
            report.succeeded = !file.fail(); // A load ends at the end of the file.
        } catch (std::exception const&) {
        }
        lockElsewhere(file);
        // What cannot be written any more is not tried again by the destructor, which could not
        // tell.
        file.setMode(0);
    } catch (std::exception const&) {
    }
    return report;
}

constexpr unsigned long READ_MODE = Koru::File::READ;
constexpr unsigned long WRITE_MODE = Koru::File::WRITE;
constexpr unsigned long UPDATE_MODE = READ_MODE | WRITE_MODE;

/// Each scenario of a structured file with this many entries and values of this size.
template <class Family>
void addStructured(std::vector<Scenario>& scenarios, int entries, std::size_t size) {
    using File = typename Family::File;
    std::string const value(size, 'v');
    std::string const before = Family::bytes(0, entries, value);
    auto const add = [&](char const* name, auto work) {
        scenarios.push_back(
            {std::string(Family::label()) + ", value of " + std::to_string(size) + ": " + name,
             before, [work](Place const& place) { return workWith<File>(place, work); }});
    };
    auto const told = [](std::wstring const& text) {
        return std::string(text.begin(), text.end());
    };
    add("loads", [told](File& file) {
        file.open(READ_MODE);
        return told(Family::value(file, 0));
    });
    add("loads and closes", [told](File& file) {
        file.open(READ_MODE);
        std::string const seen = told(Family::value(file, 0));
        file.close();
        return seen;
    });
    add("is written back unchanged", [](File& file) {
        file.open(UPDATE_MODE);
        file.close();
        return "";
    });
    add("is changed and closed", [](File& file) {
        file.open(UPDATE_MODE);
        Family::set(file, 0, "other");
        file.close();
        return "";
    });
    add("is changed and synchronized", [told](File& file) {
        file.open(UPDATE_MODE);
        Family::set(file, 0, std::string(20000, 'w'));
        file.synchronize();
        return told(Family::value(file, 0));
    });
    add("is replaced", [](File& file) {
        file.open(WRITE_MODE);
        Family::add(file, 0);
        file.close();
        return "";
    });
    add("is emptied", [](File& file) {
        file.open(UPDATE_MODE);
        Family::remove(file, 0);
        file.close();
        return "";
    });
}

/// Adds a scenario of a file that holds something.
inline void addTo(std::vector<Scenario>& scenarios, char const* name,
                  std::function<Report(Place const&)> work) {
    scenarios.push_back({name, std::string(10000, 'b'), std::move(work)});
}

/// Scenarios of a plain file and of a log.
inline void addStreams(std::vector<Scenario>& scenarios) {
    using Koru::File;
    using Koru::LogFile;
    auto const add = [&](char const* name, std::function<Report(Place const&)> work) {
        addTo(scenarios, name, std::move(work));
    };
    add("a file is read", [](Place const& place) {
        return workWith<File>(place, [](File& file) {
            file.open(READ_MODE);
            std::string bytes(10000, '\0');
            file.read(&bytes[0], 10000);
            return bytes;
        });
    });
    add("a file is written", [](Place const& place) {
        return workWith<File>(place, [](File& file) {
            file.open(WRITE_MODE);
            file.write(std::string(30000, 'w').c_str(), 30000);
            file.close();
            return "";
        });
    });
    add("a file is updated and synchronized", [](Place const& place) {
        return workWith<File>(place, [](File& file) {
            file.open(UPDATE_MODE);
            file.seekp(5000);
            file.write("new", 3);
            file.synchronize();
            return "";
        });
    });
    add("a log is appended to", [](Place const& place) {
        return workWith<LogFile>(place, [](LogFile& log) {
            log.open(3U);
            log << std::string(2000, 'x').c_str() << std::flush;
            log.close();
            return "";
        });
    });
    add("a log is begun", [](Place const& place) {
        return workWith<LogFile>(place, [](LogFile& log) {
            log.open(2U);
            log << "one\n" << std::flush << "two\n";
            log.close();
            return "";
        });
    });
}

/// Scenarios of the operations on whole files, and of a path.
inline void addWholeFiles(std::vector<Scenario>& scenarios) {
    using Koru::File;
    auto const addWhole = [&](char const* name, std::function<bool(std::wstring const&)> work) {
        addTo(scenarios, name, [work](Place const& place) {
            Report report;
            report.succeeded = work(std::wstring(place.path().begin(), place.path().end()));
            return report;
        });
    };
    // It says only whether a file is there, so one that was there before would prove nothing.
    addWhole("a file is created",
             [](std::wstring const& path) { return File::create(path + L".new"); });
    addWhole("a file is removed", [](std::wstring const& path) { return File::remove(path); });
    addWhole("a file is renamed",
             [](std::wstring const& path) { return File::rename(path, path + L".to"); });
    addWhole("a file is found", [](std::wstring const& path) { return File::exists(path); });
    // What it comes to without the name of the executable is no failure.
    addTo(scenarios, "a relative path is resolved", [](Place const&) {
        Report report;
        try {
            report.succeeded = !File::Path(L"some/file").getName().empty();
        } catch (std::exception const&) {
        }
        return report;
    });
}

/// Scenarios of the structured files.
inline void addStructured(std::vector<Scenario>& scenarios, int entries, std::size_t size) {
    addStructured<Sectioned>(scenarios, entries, size);
    addStructured<Flat>(scenarios, entries, size);
    addStructured<Records>(scenarios, entries, size);
}

/// All of them, with a value that is small, and one that is larger than any buffer.
inline std::vector<Scenario> allScenarios() {
    std::vector<Scenario> scenarios;
    addStructured(scenarios, 1, 5);
    addStructured(scenarios, 1, 20000);
    addStreams(scenarios);
    addWholeFiles(scenarios);
    return scenarios;
}

/// What a scenario comes to.
struct Result {
    Report report;
    std::string left;
};

/// What is wrong with a result under a fault, or nothing: to fail is allowed, silence is not.
inline std::string complaintAbout(Result const& result, Result const& undisturbed) {
    if (!result.report.succeeded) return "";
    if (result.report.seen != undisturbed.report.seen) return "has read something else";
    return result.left == undisturbed.left ? "" : "has left something else";
}

/// Including one for the folder itself.
inline long openDescriptors() {
    auto const all = std::filesystem::directory_iterator("/proc/self/fd");
    return std::distance(begin(all), end(all));
}

} // namespace test

#endif
