// The test executable under another name or in another directory, answering in a list of texts.
#ifndef KORU_TESTS_RELOCATE_H
#define KORU_TESTS_RELOCATE_H

#include <cstdio>
#include <filesystem>
#include <stdexcept>
#include <string>
#include <vector>

#include "support/subprocess.h"

namespace test {

/// Copies the running executable. The copy finds the library by its RUNPATH, so it runs anywhere.
inline void copyOwnExecutable(std::string const& target) {
    std::filesystem::copy_file(ownExecutable(), target);
}

/// One text of an answer, in the process that answers.
inline void answer(std::string const& text) {
    std::fwrite(text.c_str(), 1, text.size() + 1, stdout);
}

/// Starts an executable of the tests in a directory with a chosen argv[0], has it run a registered
/// command (support/selfexec.h) and returns the texts of its answer.
inline std::vector<std::string> ask(std::string const& program, std::string const& argv0,
                                    std::string const& directory, std::string const& command,
                                    std::vector<std::string> const& arguments) {
    std::vector<std::string> all{argv0, "--self=" + command};
    all.insert(all.end(), arguments.begin(), arguments.end());
    Outcome const outcome = execute(program, all, directory);
    if (outcome.exitCode != 0) {
        throw std::runtime_error(program + " --self=" + command + " exits with " +
                                 std::to_string(outcome.exitCode) + ", signal " +
                                 std::to_string(outcome.signal));
    }
    std::vector<std::string> texts;
    for (std::size_t from = 0; from < outcome.out.size();) {
        std::size_t const end = outcome.out.find('\0', from);
        if (end == std::string::npos) throw std::runtime_error("an answer without an end");
        texts.push_back(outcome.out.substr(from, end - from));
        from = end + 1;
    }
    return texts;
}

} // namespace test

#endif
