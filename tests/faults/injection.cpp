// The sweep of failing system calls once more, from outside: strace makes each call of a
// scenario fail, whichever function of the C library makes it. Not one of the tests:
// proof/injection runs it.
//
//     injection PART PARTS         every PARTS-th scenario, from PART on
//     injection --scenario NUMBER  one of them, for strace; between two calls of getppid
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <exception>
#include <iostream>
#include <map>
#include <sstream>
#include <stdexcept>
#include <string>
#include <vector>

#include "faults/scenarios.h"
#include "support/subprocess.h"
#include "support/tempdir.h"

using test::Outcome;
using test::Place;
using test::Result;
using test::Scenario;

namespace {

/// The calls that files are made of; the machine need not have all of them.
char const CALLS[] =
    "?open,?openat,?openat2,?read,?readv,?pread64,?write,?writev,?pwrite64,?lseek,?_llseek,?close,"
    "?unlink,?unlinkat,?rmdir,?rename,?renameat,?renameat2,?chmod,?fchmod,?fchmodat,?truncate,"
    "?truncate64,?ftruncate,?ftruncate64,?stat,?lstat,?fstat,?stat64,?lstat64,?fstat64,?fstatat64,"
    "?newfstatat,?statx,?access,?faccessat,?faccessat2,?readlink,?readlinkat,?getcwd";

struct Error {
    char const* name;
    int number;
};
constexpr Error ERRORS[] = {
    {"EIO", EIO}, {"ENOSPC", ENOSPC}, {"EINTR", EINTR}, {"EACCES", EACCES}, {"EMFILE", EMFILE}};

// ------------------------------------------------------------------------- within the scenario

/// Runs a scenario and prints how many descriptors it has left open, whether it says that it
/// succeeded, the size of what it has read, then that, and what it has left on the disk.
int runScenario(std::size_t number) {
    ::alarm(60); // A lock that is left held would not end.
    Scenario const scenario = test::allScenarios().at(number);
    Place const place;
    place.write(scenario.before);
    long const before = test::openDescriptors();
    ::getppid();
    test::Report const report = scenario.work(place);
    ::getppid();
    std::cout << test::openDescriptors() - before << ' ' << report.succeeded << ' '
              << report.seen.size() << ' ' << report.seen << test::onDisk(place) << std::flush;
    return 0;
}

struct Told {
    long descriptors = 0;
    Result result;
};

Told parse(std::string const& text) {
    std::istringstream in(text);
    Told told;
    std::size_t size = 0;
    in >> told.descriptors >> told.result.report.succeeded >> size;
    auto const at = static_cast<std::size_t>(in.tellg()) + 1;
    told.result.report.seen = text.substr(at, size);
    told.result.left = text.substr(at + size);
    return told;
}

// --------------------------------------------------------------------------------- under strace

Outcome trace(std::size_t number, std::vector<std::string> const& options) {
    std::vector<std::string> arguments = {"env", "strace", "-f", "-qq"};
    arguments.insert(arguments.end(), options.begin(), options.end());
    arguments.insert(arguments.end(),
                     {test::ownExecutable(), "--scenario", std::to_string(number)});
    return test::execute("/usr/bin/env", arguments);
}

/// Which calls of one name a scenario makes: those before its work, and those up to its end.
struct Range {
    long begin = 0;
    long end = 0;
};
using Ranges = std::map<std::string, Range>;

/// The name in a line "PID  NAME(ARGUMENTS", if the process is the first one.
std::string nameIn(std::string const& line, std::string& first) {
    std::istringstream in(line);
    std::string process;
    std::string call;
    in >> process >> call;
    if (first.empty()) first = process;
    std::size_t const end = call.find('(');
    return process != first || end == std::string::npos ? "" : call.substr(0, end);
}

Ranges rangesIn(std::string const& log) {
    std::istringstream lines(log);
    std::string first;
    Ranges ranges;
    int marks = 0;
    for (std::string line; std::getline(lines, line) && marks < 2;) {
        std::string const name = nameIn(line, first);
        if (name == "getppid") {
            ++marks;
        } else if (!name.empty()) {
            Range& range = ranges[name];
            if (marks == 0) ++range.begin;
            ++range.end;
        }
    }
    if (marks != 2) throw std::runtime_error("strace has not seen the scenario");
    for (auto each = ranges.begin(); each != ranges.end();) {
        each = each->second.begin == each->second.end ? ranges.erase(each) : std::next(each);
    }
    return ranges;
}

/// What is wrong with a scenario whose call fails, or nothing.
std::string complaintAbout(Outcome const& outcome, Result const& undisturbed, bool isClose) {
    if (outcome.signal != 0) return "ends by signal " + std::to_string(outcome.signal);
    if (outcome.exitCode != 0) return "ends with code " + std::to_string(outcome.exitCode);
    Told const told = parse(outcome.out);
    // strace does not make the call that fails, which for close the system would do.
    if (told.descriptors > 0 && !isClose) return "leaves a descriptor open";
    return test::complaintAbout(told.result, undisturbed);
}

/// Makes each call of one name fail in turn. Returns how many faults there were.
long failEach(std::size_t number, std::string const& name, Range const& range,
              Result const& undisturbed, long& complaints) {
    test::TempDir const directory;
    std::string const log = directory / "log";
    long faults = 0;
    for (long call = range.begin + 1; call <= range.end; ++call) {
        for (Error const& error : ERRORS) {
            std::string const fault =
                name + ":error=" + error.name + ":when=" + std::to_string(call);
            Outcome const outcome =
                trace(number, {"-o", log, "-e", "trace=" + name, "-e", "inject=" + fault});
            if (test::readFile(log).find("(INJECTED)") == std::string::npos)
                throw std::runtime_error("strace has injected nothing: " + fault);
            std::string const complaint = complaintAbout(outcome, undisturbed, name == "close");
            ++faults;
            if (complaint.empty()) continue;
            ++complaints;
            std::cout << "scenario " << number << ", " << test::allScenarios()[number].name << ", "
                      << fault << ": " << complaint << std::endl;
        }
    }
    return faults;
}

/// The scenario with every fault.
long failAll(std::size_t number, long& complaints) {
    test::TempDir const directory;
    std::string const log = directory / "log";
    std::string const calls = std::string("trace=getppid,") + CALLS;
    Outcome const outcome = trace(number, {"-o", log, "-e", calls});
    if (outcome.exitCode != 0) throw std::runtime_error("a scenario cannot be traced");
    Told const undisturbed = parse(outcome.out);
    if (!undisturbed.result.report.succeeded) throw std::runtime_error("a scenario fails");
    long faults = 0;
    for (auto const& [name, range] : rangesIn(test::readFile(log)))
        faults += failEach(number, name, range, undisturbed.result, complaints);
    return faults;
}

int runPart(std::size_t part, std::size_t parts) {
    test::TempDir const directory; // for what a scenario leaves that is ended
    ::setenv("TMPDIR", directory.path().c_str(), 1);
    long faults = 0;
    long complaints = 0;
    for (std::size_t number = part; number < test::allScenarios().size(); number += parts)
        faults += failAll(number, complaints);
    std::cout << "faults tried: " << faults << ", complaints: " << complaints << std::endl;
    return complaints == 0 && faults > 0 ? 0 : 1;
}

} // namespace

int main(int argc, char** argv) {
    if (argc != 3) return 2;
    auto const number = [argv](int i) { return static_cast<std::size_t>(std::atol(argv[i])); };
    try {
        if (std::strcmp(argv[1], "--scenario") == 0) return runScenario(number(2));
        return runPart(number(1), number(2));
    } catch (std::exception const& e) {
        std::cerr << "injection: " << e.what() << '\n';
        return 1;
    }
}
