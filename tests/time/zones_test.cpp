// Time zones as the C library has them: what a change of TZ does, and what it makes of the hours
// that come twice or not at all.
#include <doctest/doctest.h>

#include <stdlib.h>
#include <time.h>

#include <filesystem>
#include <string>

#include <koru/datetime.h>

#include "support/skip.h"
#include "support/zone.h"

using Koru::DateTime;
using test::Zone;

namespace {

char const CENTRAL_EUROPE[] = "CET-1CEST,M3.5.0,M10.5.0/3";

long seconds(char const* text) { return DateTime(text); }
std::string text(long seconds) { return DateTime(seconds); }

/// How many hours local time is ahead of UTC at that time of a zone.
long hoursAhead(char const* zone, char const* at) {
    Zone const utc("UTC0", Zone::UNTOLD);
    long const there = seconds(at);
    Zone const scope(zone, Zone::UNTOLD);
    return (there - seconds(at)) / 3600;
}

} // namespace

TEST_CASE("a zone that is set while the program runs counts from the next conversion") {
    DateTime const noon("2005-07-07 12:00:00");
    Zone const first(CENTRAL_EUROPE, Zone::UNTOLD);
    CHECK(static_cast<long>(noon) == 1120730400);
    CHECK(text(1120730400) == "2005-07-07 12:00:00");
    ::setenv("TZ", "EST5EDT,M3.2.0,M11.1.0", 1);
    CHECK(static_cast<long>(noon) == 1120752000);
    CHECK(text(1120730400) == "2005-07-07 06:00:00");
}

TEST_CASE("a comparison of dates that are far apart does not look at a changed zone") {
    DateTime const early("2005-07-07 12:00:00");
    DateTime const late("2005-07-14 12:00:00");
    Zone const before("UTC0", Zone::UNTOLD);
    CHECK(seconds("2005-07-07 12:00:00") == 1120737600);
    Zone const zone(CENTRAL_EUROPE, Zone::UNTOLD);
    CHECK(early < late);
    CHECK(std::string(::tzname[0]) == "UTC");
    CHECK(static_cast<long>(early) == 1120730400);
    CHECK(std::string(::tzname[0]) == "CET");
}

TEST_CASE("a zone of an unknown name is UTC") {
    CHECK(hoursAhead("Nowhere/Town", "2005-07-07 12:00:00") == 0);
}

TEST_CASE("a zone of a name has the rules of each year") {
    if (!std::filesystem::exists("/usr/share/zoneinfo/Europe/Berlin")) {
        test::skipped("there is no Europe/Berlin");
        return;
    }
    CHECK(hoursAhead("Europe/Berlin", "1979-07-01 12:00:00") == 1);
    CHECK(hoursAhead("Europe/Berlin", "1980-07-01 12:00:00") == 2);
    // A zone that is written out has the same rules in all years.
    CHECK(hoursAhead(CENTRAL_EUROPE, "1979-07-01 12:00:00") == 2);
}

TEST_CASE("of the hour that comes twice glibc takes the one that fits the conversion before") {
    Zone const zone(CENTRAL_EUROPE, Zone::UNTOLD);
    CHECK(seconds("2005-12-01 12:00:00") == 1133434800);
    CHECK(seconds("2005-10-30 02:30:00") == 1130635800);
    CHECK(seconds("2005-07-01 12:00:00") == 1120212000);
    CHECK(seconds("2005-10-30 02:30:00") == 1130632200);
}

TEST_CASE("the hour that is missing becomes one before or after it") {
    Zone const zone(CENTRAL_EUROPE, Zone::UNTOLD);
    CHECK(text(seconds("2005-03-27 02:30:00")) == "2005-03-27 03:30:00");
}

TEST_CASE("fields beyond the calendar are carried over") {
    Zone const zone("UTC0", Zone::UNTOLD);
    CHECK(text(seconds("2005-02-31 10:00:00")) == "2005-03-03 10:00:00");
    CHECK(DateTime("2005-02-31 10:00:00") == DateTime("2005-03-03 10:00:00"));
}
