// Part of the library and of every test program where coverage is measured. Both count what runs and
// write their counts when the process exits; this writes them as well when it ends by _exit.
#include <cstdlib>

// NOLINTNEXTLINE(bugprone-reserved-identifier,readability-identifier-naming)
extern "C" void __gcov_dump();

// Each has its own counts and registers its own handler. Only `quick_exit` calls the handlers of all.
static int const registered = std::at_quick_exit(__gcov_dump);

extern "C" void _exit(int code) { std::quick_exit(code); }
