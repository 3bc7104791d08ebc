// A thread is cancelled at every cancellation point of every operation on files. The process goes
// on, and so does the file: it is the old one or the new one.
#include <doctest/doctest.h>

#include <pthread.h>
#include <unistd.h>

#include <cstdint>
#include <string>
#include <vector>

#include <koru/file.h>

#include "faults/scenarios.h"
#include "support/cancellation.h"
#include "support/leftovers.h"
#include "support/systemcalls.h"
#include "support/tempdir.h"

using test::Place;
using test::Report;
using test::Scenario;

namespace {

/// What a scenario comes to in a thread that is cancelled at one of its cancellation points, or at
/// the next one if the library holds the cancellation off there.
struct Outcome {
    bool wasReached = false; ///< whether the scenario has that many points
    std::string left;
};

Outcome cancelledAt(long point, Scenario const& scenario, Place const& place) {
    place.write(scenario.before);
    Outcome outcome;
    bool const unwound = test::endsCancelled(
        [&] {
            test::callsBeforeCancellation = point;
            scenario.work(place);
            outcome.wasReached = test::callsBeforeCancellation < 0;
            test::callsBeforeCancellation = -1;
        },
        [](pthread_t) {});
    outcome.wasReached = outcome.wasReached || unwound;
    outcome.left = test::onDisk(place);
    return outcome;
}

/// Tries every point of a scenario, which may leave one of these on the disk. An empty list allows
/// anything.
/// @return how many there were
long sweep(Scenario const& scenario, std::vector<std::string> const& allowed) {
    CAPTURE(scenario.name);
    long point = 0;
    for (bool wasReached = true; wasReached; ++point) {
        CAPTURE(point);
        REQUIRE(point < 1000);
        Place const place;
        test::Possessions const before;
        Outcome const outcome = cancelledAt(point, scenario, place);
        wasReached = outcome.wasReached;
        bool isAllowed = allowed.empty();
        for (std::string const& content : allowed) isAllowed = isAllowed || outcome.left == content;
        CHECK(isAllowed);
        CHECK(test::Possessions().moreThan(before, SIZE_MAX) == "");
    }
    return point - 1;
}

/// What a scenario leaves where nothing disturbs it.
std::string doneBy(Scenario const& scenario) {
    Place const place;
    place.write(scenario.before);
    REQUIRE(scenario.work(place).succeeded);
    return test::onDisk(place);
}

/// A scenario's own look at the lock is not to be cancelled: that would end the process.
void holdCancellationOff(bool off) {
    ::pthread_setcancelstate(off ? PTHREAD_CANCEL_DISABLE : PTHREAD_CANCEL_ENABLE, nullptr);
}

} // namespace

TEST_CASE("a structured file keeps its content or gets the new one wherever its thread is "
          "cancelled") {
    test::keepFaultsOff = holdCancellationOff;
    std::vector<Scenario> scenarios;
    test::addStructured(scenarios, 1, 5);
    test::addStructured(scenarios, 1, 20000);
    long points = 0;
    for (Scenario const& scenario : scenarios) {
        std::vector<std::string> allowed{scenario.before, doneBy(scenario)};
        // A mode of WRITE alone empties the file when it is opened.
        if (scenario.name.find("is replaced") != std::string::npos) allowed.emplace_back();
        points += sweep(scenario, allowed);
    }
    MESSAGE("structured files, cancelled at: ", points);
    CHECK(points > 200);
}

TEST_CASE("a cancelled thread leaves no descriptor of a stream or a log") {
    test::keepFaultsOff = holdCancellationOff;
    std::vector<Scenario> scenarios;
    test::addStreams(scenarios);
    for (Scenario const& scenario : scenarios) CHECK(sweep(scenario, {}) > 0);
}

TEST_CASE("an operation on a whole file is done or not where its thread is cancelled") {
    std::vector<Scenario> scenarios;
    test::addWholeFiles(scenarios);
    test::addTo(scenarios, "a file is copied", [](Place const& place) {
        std::wstring const path(place.path().begin(), place.path().end());
        Report report;
        report.succeeded = Koru::File::copy(path, path + L".copy");
        return report;
    });
    test::addTo(scenarios, "a file is destroyed open", [](Place const& place) {
        Koru::File file(Koru::File::Path(place.path()));
        file.open(test::READ_MODE);
        return Report{true, ""};
    });
    for (Scenario const& scenario : scenarios) {
        sweep(scenario, {scenario.before, doneBy(scenario)});
    }
}
