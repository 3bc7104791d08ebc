// The main program of every test executable. A test that needs its own executable again, under
// another name or in another directory, starts it with a switch (support/selfexec.h), which is
// answered here instead of running the tests.
//
// A test case that leaves a descriptor open or a thread running makes the program fail. With
// `--twice` all tests run a second time, and then they may not leave memory either: the first time,
// the C library and the tests make what they keep for good, such as locales and time zones.
#define DOCTEST_CONFIG_IMPLEMENT
#include <doctest/doctest.h>

#include <algorithm>
#include <clocale>
#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>
#include <thread>

#include "support/leftovers.h"
#include "support/sanitizers.h"
#include "support/selfexec.h"
#include "support/skip.h"

namespace {

struct Notes {
    char const* testCase = "";
    bool memoryCounts = false;
    bool somethingLeft = false;
    bool somethingSkipped = false;
};
Notes notes;

/// Compares what the process has before and after each test case.
class Listener : public doctest::IReporter {
public:
    explicit Listener(doctest::ContextOptions const&) {}

    void test_case_start(doctest::TestCaseData const& testCase) override {
        notes.testCase = testCase.m_name;
        std::setlocale(LC_ALL, ""); // that of the environment, whatever the case before set
        subcases_ = 0;
        before_ = test::Possessions();
    }

    void subcase_start(doctest::SubcaseSignature const&) override { ++subcases_; }

    void test_case_end(doctest::CurrentTestCaseStats const&) override {
        constexpr std::size_t nameOfSubcase = 128; // doctest keeps the names of one test case
        std::size_t const allowed = notes.memoryCounts ? subcases_ * nameOfSubcase : SIZE_MAX;
        std::string const more = test::Possessions().moreThan(before_, allowed);
        if (more.empty()) return;
        std::printf("ERROR: left by the test case \"%s\": %s\n", notes.testCase, more.c_str());
        notes.somethingLeft = true;
    }

    void report_query(doctest::QueryData const&) override {}
    void test_run_start() override {}
    void test_run_end(doctest::TestRunStats const&) override {}
    void test_case_reenter(doctest::TestCaseData const&) override {}
    void test_case_exception(doctest::TestCaseException const&) override {}
    void subcase_end() override {}
    void log_assert(doctest::AssertData const&) override {}
    void log_message(doctest::MessageData const&) override {}
    void test_case_skipped(doctest::TestCaseData const&) override {}

private:
    std::size_t subcases_ = 0;
    test::Possessions before_;
};
REGISTER_LISTENER("leftovers", 1, Listener);

/// The exit code of a run that left something out: CTest has one for it, see tests/CMakeLists.txt.
int codeOfSkipped() {
    char const* const code = std::getenv("KORU_TEST_SKIPPED");
    return code == nullptr ? 0 : std::atoi(code);
}

int runTests(int argc, char** argv) {
#if defined(KORU_THREAD_SANITIZER)
    std::thread([] {}).join(); // With the first thread, the sanitizer starts one of its own.
#endif
    doctest::Context context(argc, argv);
    int failed = context.run();
    auto const isTwice = [](char const* argument) { return std::strcmp(argument, "--twice") == 0; };
    if (failed == 0 && std::any_of(argv, argv + argc, isTwice)) {
        notes.memoryCounts = true;
        failed = context.run();
    }
    if (failed != 0 || context.shouldExit()) return failed;
    if (notes.somethingLeft) return 1;
    return notes.somethingSkipped ? codeOfSkipped() : 0;
}

} // namespace

void test::skipped(std::string const& reason) {
    std::printf("skipped: %s: %s\n", notes.testCase, reason.c_str());
    notes.somethingSkipped = true;
}

int main(int argc, char** argv) {
    if (argc > 1 && std::strncmp(argv[1], "--self=", 7) == 0) {
        return test::runSelfSwitch(argv[1] + 7, argc - 2, argv + 2);
    }
    return runTests(argc, argv);
}
