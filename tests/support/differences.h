// Very many comparisons in one assertion, and the random numbers to make them with.
#ifndef KORU_TESTS_DIFFERENCES_H
#define KORU_TESTS_DIFFERENCES_H

#include <cstddef>
#include <cstdint>
#include <random>
#include <string>

namespace test {

/// Counts comparisons and keeps the first that fails: an assertion takes far longer than most.
class Differences {
public:
    template <class Describe>
    void note(bool same, Describe describe) {
        ++compared_;
        if (!same && first_.empty()) first_ = describe();
    }
    void expect(std::string const& label, std::string const& actual, std::string const& expected) {
        note(actual == expected, [&] { return label + ": " + actual + ", not " + expected; });
    }

    /// Empty if there was none.
    std::string const& first() const { return first_; }
    /// The same, or how many comparisons were made if these were not as many.
    std::string firstOf(std::size_t expected) const {
        if (!first_.empty() || compared_ == expected) return first_;
        return std::to_string(compared_) + " comparisons";
    }

private:
    std::string first_;
    std::size_t compared_ = 0;
};

/// The same numbers in every run and on every machine.
class Random {
public:
    explicit Random(std::uint32_t seed) : engine_(seed) {}
    std::uint32_t next() { return static_cast<std::uint32_t>(engine_()); }
    /// 0 to limit - 1.
    std::uint32_t below(std::uint32_t limit) { return next() % limit; }
    template <class T, std::size_t size>
    T const& of(T const (&all)[size]) {
        return all[next() % size];
    }

private:
    std::mt19937 engine_;
};

} // namespace test

#endif
