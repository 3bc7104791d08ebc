// Timing by turns. Only ratios that were taken within one run mean anything: the machine's speed
// drifts, but ours and a peer that take turns drift together. So a row times ours, the peer,
// ours, the peer, ... and reports the median of the ratios of neighbours.
#ifndef KORU_BENCH_HARNESS_H
#define KORU_BENCH_HARNESS_H

#include <algorithm>
#include <cstddef>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <string>
#include <type_traits>
#include <utility>
#include <vector>

#include "work.h"

namespace bench {

/// Someone to be compared with. The goal of a job refers to the fastest of its peers; a limit (the
/// same bytes through the cheapest primitive, or something that does a part of the job) has a goal
/// of its own.
struct Peer {
    std::string name;
    Work work;            ///< empty when this machine lacks the library
    bool isLimit = false; ///< whether it does not count among the fastest
    double goal = 0;      ///< a limit's own goal; 0 for none
};

inline Peer peer(std::string name, Work work) {
    return {std::move(name), std::move(work), false, 0};
}
inline Peer limit(std::string name, Work work, double goal = 0) {
    return {std::move(name), std::move(work), true, goal};
}
inline Peer missing(std::string name) { return {std::move(name), Work(), false, 0}; }

/// The base of a library's class where this machine lacks the library; it has a name only.
struct Missing {};

template <class Library>
constexpr bool isMissing = std::is_base_of<Missing, Library>::value;

/// The peer of a library's class, with the work that the function makes of it.
template <class Library, class Make>
Peer peerOf(Make make) {
    if constexpr (isMissing<Library>) {
        return missing(Library::name);
    } else {
        return peer(Library::name, make(Library()));
    }
}

/// The command line of a benchmark: `[--quick] [--all] [--rounds=N] [--results=FILE] [filter]`.
/// Rows whose name contains the filter are run.
class Options {
public:
    Options(int argc, char** argv) {
        for (int i = 1; i < argc; ++i) take(argv[i]);
    }

    /// Fewer rounds: to see that all of it runs, not for numbers.
    bool quick() const { return quick_; }
    /// Shows every peer; otherwise only the fastest one, the limits and who is missing.
    bool all() const { return all_; }
    /// At least; quick work gets up to five times as many.
    std::size_t rounds() const { return rounds_; }
    /// Where every comparison is added as a line, for script/bench to sum up; empty for nowhere.
    std::string const& results() const { return results_; }
    bool wants(std::string const& row) const { return row.find(filter_) != std::string::npos; }

private:
    void take(char const* argument) {
        if (std::strcmp(argument, "--quick") == 0) {
            quick_ = true;
            rounds_ = 3;
        } else if (std::strcmp(argument, "--all") == 0) {
            all_ = true;
        } else if (std::strncmp(argument, "--rounds=", 9) == 0) {
            rounds_ = std::max<std::size_t>(1, std::strtoul(argument + 9, nullptr, 10));
        } else if (std::strncmp(argument, "--results=", 10) == 0) {
            results_ = argument + 10;
        } else {
            filter_ = argument;
        }
    }

    bool quick_ = false;
    bool all_ = false;
    std::size_t rounds_ = 9;
    std::string results_;
    std::string filter_;
};

/// One row of the table: ours against one peer.
struct Row {
    std::string job;
    std::string peer;
    bool isLimit = false;
    double ours = 0;   ///< median, in seconds for one piece of work
    double theirs = 0; ///< the same
    double ratio = 0;  ///< median of ours / theirs, neighbours in time; 0 when skipped
    double spread = 0; ///< the middle half of those ratios, as a part of their median
    double goal = 0;   ///< 0 for none

    /// As good as met: what is left of the goal is within what two runs differ by.
    bool near() const { return ratio <= 1.1 * goal; }
    char const* verdict() const {
        if (ratio == 0 || goal == 0) return "";
        return ratio <= goal ? "met" : near() ? "near" : "MISSED";
    }
};

/// Runs the rows of one program and prints them as a table that Markdown understands too.
class Report {
public:
    /// @param family  what the program measures; its name in the results
    Report(char const* family, Options options) : family_(family), options_(std::move(options)) {
        std::printf("%s: %s, %s, %s, %u-bit%s\n\n", family, processor().c_str(), compiler(),
                    KORU_BENCH_FLAGS, static_cast<unsigned>(8 * sizeof(void*)),
                    options_.quick() ? ", QUICK: not for numbers" : "");
        std::printf("| %-44s | %9s | %-26s | %9s | %6s | %6s | %5s | %-6s |\n", "work", "ours",
                    "peer", "theirs", "ratio", "spread", "goal", "");
        std::printf("|:%s|%s:|:%s|%s:|%s:|%s:|%s:|:%s|\n", dashes(45), dashes(10), dashes(27),
                    dashes(10), dashes(7), dashes(7), dashes(6), dashes(7));
        if (!options_.results().empty()) results_.open(options_.results(), std::ios::app);
    }

    Report(Report const&) = delete;
    Report& operator=(Report const&) = delete;

    /// Ends with the goals that were missed, the worst first.
    ~Report() {
        std::stable_sort(missed_.begin(), missed_.end(), [](Row const& a, Row const& b) {
            return a.ratio / a.goal > b.ratio / b.goal;
        });
        std::printf("\n%u of %u goals met%s\n", static_cast<unsigned>(goals_ - missed_.size()),
                    static_cast<unsigned>(goals_), missed_.empty() ? "" : "; missed, worst first:");
        for (Row const& row : missed_) {
            std::printf("- %s, against %s: %.2f instead of %.2f\n", row.job.c_str(),
                        row.peer.c_str(), row.ratio, row.goal);
        }
    }

    Options const& options() const { return options_; }
    bool wants(std::string const& job) const { return options_.wants(job); }

    /// Compares ours with each peer.
    /// @param goal   the ratio to reach against the fastest peer; 0 for none
    /// @param units  pieces in one run of the work; the times are given for one
    void compare(std::string const& job, Work const& ours, std::vector<Peer> const& peers,
                 double goal = 0, double units = 1) {
        if (!wants(job)) return;
        std::vector<Row> rows;
        for (Peer const& peer : peers) {
            rows.push_back(measure(job, ours, peer, units));
            if (!peer.isLimit) rows.back().goal = goal;
        }
        std::size_t const fastest = fastestPeer(rows);
        for (std::size_t i = 0; i < rows.size(); ++i) {
            record(rows[i]);
            bool const beaten = !rows[i].isLimit && rows[i].ratio != 0 && i != fastest;
            if (beaten) rows[i].goal = 0;
            if (!beaten || options_.all()) print(rows[i]);
        }
        std::fflush(stdout);
    }

private:
    /// The index of the peer that comes off best against ours, by the ratios, since only they hold
    /// on a busy machine; the number of rows when none takes part.
    static std::size_t fastestPeer(std::vector<Row> const& rows) {
        std::size_t fastest = rows.size();
        for (std::size_t i = 0; i < rows.size(); ++i) {
            if (rows[i].isLimit || rows[i].ratio == 0) continue;
            if (fastest == rows.size() || rows[i].ratio > rows[fastest].ratio) fastest = i;
        }
        return fastest;
    }

    Row measure(std::string const& job, Work const& ours, Peer const& peer, double units) {
        Row row;
        row.job = job;
        row.peer = peer.name;
        row.isLimit = peer.isLimit;
        row.goal = peer.goal;
        if (!peer.work) return row;
        std::size_t const ourCount = calibrate(ours);
        std::size_t const theirCount = calibrate(peer.work);
        std::vector<double> ourTimes;
        std::vector<double> theirTimes;
        std::vector<double> ratios;
        Stopwatch const watch;
        while (goesOn(ratios.size(), watch.seconds())) {
            ourTimes.push_back(ours.time(ourCount) / static_cast<double>(ourCount) / units);
            theirTimes.push_back(peer.work.time(theirCount) / static_cast<double>(theirCount) /
                                 units);
            ratios.push_back(ourTimes.back() / theirTimes.back());
        }
        row.ours = quantile(ourTimes, 0.5);
        row.theirs = quantile(theirTimes, 0.5);
        row.ratio = quantile(ratios, 0.5);
        row.spread = (quantile(ratios, 0.75) - quantile(ratios, 0.25)) / row.ratio;
        return row;
    }

    /// Many short turns: the shorter a turn is, the fewer of them something else falls into, and
    /// the median forgets those.
    bool goesOn(std::size_t rounds, double seconds) const {
        if (rounds < options_.rounds()) return true;
        return !options_.quick() && rounds < 5 * options_.rounds() && seconds < 0.1;
    }

    /// How many runs make a series long enough for the clock; also warms up. Preparation, which is
    /// not timed, counts here, or a cheap body after a dear preparation would take forever.
    static std::size_t calibrate(Work const& work) {
        double const enough = 0.0005;
        for (std::size_t count = 1;; count *= 2) {
            Stopwatch const watch;
            double const timed = work.time(count);
            if (timed >= enough || watch.seconds() >= 5 * enough) return count;
        }
    }

    /// Family, job, peer, kind, nanoseconds of both, ratio, spread and goal, between tabs. Every
    /// peer has the job's goal here: which one is the fastest is for the sum of several runs to
    /// say.
    void record(Row const& row) {
        if (!results_.is_open()) return;
        results_ << family_ << '\t' << row.job << '\t' << row.peer << '\t'
                 << (row.isLimit ? "limit" : "peer") << '\t' << 1e9 * row.ours << '\t'
                 << 1e9 * row.theirs << '\t' << row.ratio << '\t' << row.spread << '\t' << row.goal
                 << std::endl;
    }

    void print(Row const& row) {
        if (row.ratio == 0) {
            std::printf("| %-44s | %9s | %-26s | %9s | %6s | %6s | %5s | %-6s |\n", row.job.c_str(),
                        "-", row.peer.c_str(), "skipped", "-", "-", "-", "");
            return;
        }
        char goal[16] = "-";
        if (row.goal > 0) {
            std::snprintf(goal, sizeof goal, "%.2f", row.goal);
            ++goals_;
            if (!row.near()) missed_.push_back(row);
        }
        std::printf("| %-44s | %9s | %-26s | %9s | %6.2f | %5.1f%% | %5s | %-6s |\n",
                    row.job.c_str(), duration(row.ours).c_str(), row.peer.c_str(),
                    duration(row.theirs).c_str(), row.ratio, 100 * row.spread, goal, row.verdict());
    }

    static double quantile(std::vector<double> values, double part) {
        std::sort(values.begin(), values.end());
        double const place = part * static_cast<double>(values.size() - 1);
        auto const low = static_cast<std::size_t>(place);
        std::size_t const high = std::min(low + 1, values.size() - 1);
        return values[low] + (values[high] - values[low]) * (place - static_cast<double>(low));
    }

    static std::string duration(double seconds) {
        static char const* const names[] = {"ns", "us", "ms", "s"};
        double value = seconds * 1e9;
        std::size_t unit = 0;
        for (; value >= 1000 && unit < 3; ++unit) value /= 1000;
        char text[32];
        std::snprintf(text, sizeof text, "%.*f %s",
                      value < 10    ? 2
                      : value < 100 ? 1
                                    : 0,
                      value, names[unit]);
        return text;
    }

    static std::string processor() {
        std::ifstream in("/proc/cpuinfo");
        for (std::string line; std::getline(in, line);) {
            if (line.compare(0, 10, "model name") == 0) return line.substr(line.find(": ") + 2);
        }
        return "unknown processor";
    }

    static char const* compiler() {
#if defined(__clang__)
        return __VERSION__; // begins with the compiler's name
#else
        return "g++ " __VERSION__;
#endif
    }

    static char const* dashes(std::size_t count) {
        static char const dashes[] = "--------------------------------------------------";
        return dashes + (sizeof dashes - 1 - count);
    }

    char const* family_;
    Options options_;
    std::ofstream results_;
    std::size_t goals_ = 0;
    std::vector<Row> missed_;
};

} // namespace bench

#endif
