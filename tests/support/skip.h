// Tests that cannot run on every machine say so.
#ifndef KORU_TESTS_SKIP_H
#define KORU_TESTS_SKIP_H

#include <string>

namespace test {

/// Says what the running test case does not test here, and why. Prints "skipped: CASE: REASON",
/// which script/test collects; under CTest, the whole program counts as skipped unless it fails.
void skipped(std::string const& reason);

} // namespace test

#endif
