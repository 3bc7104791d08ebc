// Every system call that a file operation makes fails once, or from then on, with every error that
// there may be: whatever says that it succeeded has done all of its work.
#include <doctest/doctest.h>

#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <string>
#include <vector>

#include "faults/scenarios.h"
#include "support/systemcalls.h"
#include "support/tempdir.h"

using test::Call;
using test::CALLS;
using test::FailingCall;
using test::openDescriptors;
using test::Place;
using test::Result;
using test::Scenario;
using test::ShortTransfers;

namespace {

template <class MakeFault>
Result run(Scenario const& scenario, Place const& place, MakeFault makeFault) {
    place.write(scenario.before);
    Result result;
    {
        [[maybe_unused]] auto const fault = makeFault();
        result.report = scenario.work(place);
    }
    result.left = test::onDisk(place);
    return result;
}

Result runUndisturbed(Scenario const& scenario, Place const& place) {
    return run(scenario, place, [] { return 0; });
}

/// Counts the calls of each kind that a scenario makes.
std::vector<long> countCalls(Scenario const& scenario, Place const& place) {
    std::vector<long> counts;
    for (Call const call : CALLS) {
        long made = 0;
        place.write(scenario.before);
        {
            FailingCall const counter(call, 0, 1000000);
            scenario.work(place);
            made = counter.made();
        }
        counts.push_back(made);
    }
    return counts;
}

/// Runs a scenario with one fault and says what is wrong with the result, or nothing.
std::string complaintAbout(Scenario const& scenario, Result const& undisturbed, Call call,
                           int error, long before, FailingCall::Times times) {
    Place const place;
    long const descriptors = openDescriptors();
    Result const result =
        run(scenario, place, [&] { return FailingCall(call, error, before, times); });
    if (openDescriptors() != descriptors) return "leaves a descriptor open";
    return test::complaintAbout(result, undisturbed);
}

} // namespace

TEST_CASE("no fault of a system call is passed over in silence") {
    ::alarm(250); // A lock that is left held would not end.
    std::vector<Scenario> const scenarios = test::allScenarios();
    REQUIRE(scenarios.size() >= 25);
    long points = 0;
    for (Scenario const& scenario : scenarios) {
        Place const place;
        Result const undisturbed = runUndisturbed(scenario, place);
        CAPTURE(scenario.name);
        REQUIRE(undisturbed.report.succeeded);
        std::vector<long> const counts = countCalls(scenario, place);
        for (std::size_t kind = 0; kind < CALLS.size(); ++kind) {
            for (long before = 0; before < counts[kind]; ++before) {
                for (int const error : {EIO, ENOSPC, EINTR, EACCES, EMFILE}) {
                    for (auto const times : {FailingCall::ONCE, FailingCall::FOR_EVER}) {
                        // A call that is interrupted for ever is made for ever.
                        if (error == EINTR && times == FailingCall::FOR_EVER) continue;
                        ++points;
                        std::string const complaint = complaintAbout(
                            scenario, undisturbed, CALLS[kind], error, before, times);
                        CAPTURE(kind);
                        CAPTURE(before);
                        CAPTURE(std::string(std::strerror(error)));
                        CAPTURE(times);
                        if (!complaint.empty()) FAIL_CHECK(complaint);
                    }
                }
            }
        }
    }
    CHECK(points >= 3000);
    MESSAGE("faults tried: ", points);
    ::alarm(0);
}

TEST_CASE("what is transferred in small pieces arrives whole") {
    ::alarm(250);
    for (Scenario const& scenario : test::allScenarios()) {
        Place const place;
        Result const undisturbed = runUndisturbed(scenario, place);
        for (std::size_t const bytes : {1U, 7U, 4096U}) {
            Result const result = run(scenario, place, [&] { return ShortTransfers(bytes); });
            CAPTURE(scenario.name);
            CAPTURE(bytes);
            CHECK(result.report == undisturbed.report);
            CHECK(result.left == undisturbed.left);
        }
    }
    ::alarm(0);
}
