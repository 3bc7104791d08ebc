// Every allocation of an operation fails once, or from then on, those of the C library included:
// whatever says that it succeeded has done all of its work, nothing is leaked, and a file that is
// written back keeps its old content or gets its new one.
#include <doctest/doctest.h>

#include <unistd.h>

#include <array>
#include <cstdio>
#include <exception>
#include <sstream>
#include <stdexcept>
#include <string>
#include <utility>
#include <vector>

#include <koru/datetime.h>
#include <koru/dynamiclibrary.h>
#include <koru/string.h>
#include <koru/system.h>
#include <koru/uuid.h>

#include "faults/scenarios.h"
#include "support/failingmalloc.h"
#include "support/tempdir.h"

using test::FailingMalloc;
using test::mallocPlan;
using test::Place;
using test::Report;
using test::Scenario;

namespace {

/// What a stream took; a failed one has said that it did not take all.
std::string taken(std::ostringstream const& out) {
    if (!out) throw std::runtime_error("the stream failed");
    return out.str();
}

/// Adds an operation that touches no file; it returns what it came to.
template <class Operation>
void add(std::vector<Scenario>& scenarios, char const* name, Operation operation) {
    scenarios.push_back({name, "", [operation](Place const&) {
                             Report report;
                             report.seen = operation();
                             report.succeeded = true;
                             return report;
                         }});
}

void addValues(std::vector<Scenario>& scenarios) {
    add(scenarios, "text is encoded",
        [] { return Koru::make_string(std::wstring(9000, L'\u20AC')); });
    add(scenarios, "text is decoded", [] {
        return std::to_string(Koru::make_wstring(std::string(9000, 'x') + "\xC3\xA9").size());
    });
    add(scenarios, "text goes to a stream", [] {
        std::ostringstream out;
        Koru::operator<<(out, std::wstring(3000, L'w'));
        return taken(out);
    });
    add(scenarios, "a path is parsed, copied and compared", [] {
        Koru::File::Path const path(L"/a/long/directory/name/that/needs/memory/file.txt");
        Koru::File::Path copy;
        copy = path;
        return std::string(copy == path ? "same" : "other");
    });
    add(scenarios, "a date is read and written", [] {
        Koru::DateTime const date(std::string("2005-03-07 09:05:00"), 3);
        std::ostringstream out;
        out << date;
        return taken(out) + std::string(date);
    });
    add(scenarios, "an identifier is read and written", [] {
        Koru::Uuid const uuid(std::string("00112233-4455-6677-8899-aabbccddeeff"));
        std::ostringstream out;
        out << uuid;
        return taken(out) + std::string(uuid);
    });
    add(scenarios, "the process's file name is asked for",
        [] { return Koru::make_string(Koru::System::getProcessFileName()); });
    add(scenarios, "records are copied", [] {
        Koru::DataFile::Record const record(L"a key that is longer than a short string",
                                            std::vector<unsigned char>(100, 'x'));
        Koru::DataFile::Record copy;
        copy = record;
        copy.setKey(L"another key that is longer than a short string");
        return std::to_string(copy.getData().size());
    });
}

std::vector<Scenario> allScenarios() {
    std::vector<Scenario> scenarios;
    test::addStructured(scenarios, 1, 20000);
    test::addStructured(scenarios, 350, 40);
    test::addStreams(scenarios);
    test::addWholeFiles(scenarios);
    addValues(scenarios);
    return scenarios;
}

/// How often each byte is there: what a record file holds is the same in any order of its records.
std::array<long, 256> countBytes(std::string const& bytes) {
    std::array<long, 256> counts = {};
    for (char const c : bytes) ++counts[static_cast<unsigned char>(c)];
    return counts;
}

struct Result {
    Report report;
    std::string left;
    long made, failed, leaked;
};

Result run(Scenario const& scenario, Place const& place, long before, bool forever) {
    Result result = {};
    place.write(scenario.before);
    // What it returns is compared where there is memory again.
    Report report;
    {
        FailingMalloc const fault(before, forever);
        try {
            report = scenario.work(place);
        } catch (std::exception const&) {
        }
        result.made = mallocPlan.made;
        result.failed = mallocPlan.failed;
        result.leaked = mallocPlan.held;
    }
    if (report.seen.capacity() > std::string().capacity()) --result.leaked;
    result.report = std::move(report);
    result.left = test::onDisk(place);
    return result;
}

/// What is wrong with a result, or nothing.
std::string complaintAbout(Scenario const& scenario, Result const& result,
                           Result const& undisturbed) {
    if (result.leaked != 0) return "leaks " + std::to_string(result.leaked);
    bool const isNew =
        result.left == undisturbed.left || countBytes(result.left) == countBytes(undisturbed.left);
    if (result.report.succeeded) {
        if (!(result.report == undisturbed.report)) return "says something else";
        return isNew ? "" : "has left something else";
    }
    // To open a file for writing alone is to empty it.
    bool const isOld = result.left == scenario.before || result.left.empty();
    return isOld || isNew ? "" : "has lost the file";
}

} // namespace

TEST_CASE("whichever allocation fails, nothing is lost, leaked or passed over in silence") {
    ::alarm(280);
    // Its buffer would belong to whoever prints first.
    std::setvbuf(stdout, nullptr, _IONBF, 0);
    test::keepFaultsOff = [](bool off) { mallocPlan.isAside = off; };
    std::vector<Scenario> const scenarios = allScenarios();
    REQUIRE(scenarios.size() >= 40);
    long failures = 0;
    for (Scenario const& scenario : scenarios) {
        Place const place;
        CAPTURE(scenario.name);
        run(scenario, place, -1, false); // What is made once and kept is made now.
        Result const undisturbed = run(scenario, place, -1, false);
        REQUIRE(undisturbed.report.succeeded);
        REQUIRE(undisturbed.leaked == 0);
        for (bool const forever : {false, true}) {
            for (long before = 0; before < undisturbed.made; ++before) {
                Result const result = run(scenario, place, before, forever);
                failures += result.failed;
                CAPTURE(before);
                CAPTURE(forever);
                std::string const complaint = complaintAbout(scenario, result, undisturbed);
                if (!complaint.empty()) FAIL_CHECK(complaint);
            }
        }
    }
    CHECK(failures >= 20000);
    MESSAGE("failed allocations: ", failures);
    ::alarm(0);
}
