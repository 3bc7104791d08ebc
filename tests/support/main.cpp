// The main program of every test executable. A test that needs its own executable again, under
// another name or in another directory, starts it with a switch (support/selfexec.h), which is
// answered here instead of running the tests.
#define DOCTEST_CONFIG_IMPLEMENT
#include <doctest/doctest.h>

#include <cstring>

#include "support/selfexec.h"

int main(int argc, char** argv) {
    if (argc > 1 && std::strncmp(argv[1], "--self=", 7) == 0) {
        return test::runSelfSwitch(argv[1] + 7, argc - 2, argv + 2);
    }
    doctest::Context context(argc, argv);
    return context.run();
}
