// Things that a piece of work takes one after the other.
#ifndef KORU_BENCH_CIRCLE_H
#define KORU_BENCH_CIRCLE_H

#include <cstddef>
#include <random>
#include <vector>

#include "work.h"

namespace bench {

/// Things that cannot be foreseen, handed out in a circle.
template <class Thing>
class Circle {
public:
    /// @param make  makes a thing of random numbers
    template <class Make>
    explicit Circle(Make make) {
        std::mt19937 random(1);
        for (std::size_t i = 0; i < COUNT; ++i) things_.push_back(make(random));
    }

    Thing const& next() { return things_[at_++ % COUNT]; }
    Thing const* begin() const { return things_.data(); }
    Thing const* end() const { return things_.data() + COUNT; }

    /// Work that does something with each thing in turn.
    template <class Use>
    Work each(Use use) const {
        return Work::repeated([circle = *this, use]() mutable { return use(circle.next()); });
    }

private:
    static constexpr std::size_t COUNT = 64;

    std::vector<Thing> things_;
    std::size_t at_ = 0;
};

} // namespace bench

#endif
