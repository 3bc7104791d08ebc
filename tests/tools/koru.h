// Runs the program `koru` in a folder of a test's own.
#ifndef KORU_TESTS_TOOLS_KORU_H
#define KORU_TESTS_TOOLS_KORU_H

#include <doctest/doctest.h>

#include <fcntl.h>
#include <grp.h>
#include <unistd.h>

#include <algorithm>
#include <filesystem>
#include <string>
#include <vector>

#include "support/subprocess.h"
#include "support/tempdir.h"

namespace test {

using Words = std::vector<std::string>;

/// How a run of the program ended, and what it wrote.
struct Run {
    int exitCode = -1;
    std::string out;
    std::string err;
};

inline void redirect(std::string const& path, int flags, int descriptor) {
    int const opened = ::open(path.c_str(), flags, 0600);
    ::dup2(opened, descriptor);
    ::close(opened);
}

/// Becomes the program, in the folder.
inline int become(std::string const& folder, Words words) {
    words.insert(words.begin(), KORU_TOOL);
    std::vector<char*> argv;
    for (std::string& word : words) argv.push_back(&word[0]);
    argv.push_back(nullptr);
    if (::chdir(folder.c_str()) != 0) return 126;
    ::execv(KORU_TOOL, argv.data());
    return 127;
}

unsigned const NOBODY = 65534;

/// The administrator may do everything, so become somebody else.
inline bool becomeOrdinary() {
    return ::geteuid() != 0 ||
           (::setgroups(0, nullptr) == 0 && ::setgid(NOBODY) == 0 && ::setuid(NOBODY) == 0);
}

/// A folder in which the program is run.
class Desk {
public:
    std::string operator/(std::string const& name) const { return folder_ / name; }
    std::string const& path() const { return folder_.path(); }

    void write(std::string const& name, std::string const& bytes) const {
        writeFile(folder_ / name, bytes);
    }
    std::string read(std::string const& name) const { return readFile(folder_ / name); }

    /// The names of what is in the folder.
    Words names() const {
        Words result;
        for (auto const& entry : std::filesystem::directory_iterator(path()))
            result.push_back(entry.path().filename().string());
        std::sort(result.begin(), result.end());
        return result;
    }

    Run koru(Words const& words, std::string const& input = "", bool isOrdinary = false) const {
        writeFile(channels_ / "in", input);
        Outcome const outcome = inChild([&] {
            redirect(channels_ / "in", O_RDONLY, STDIN_FILENO);
            redirect(channels_ / "err", O_WRONLY | O_CREAT | O_TRUNC, STDERR_FILENO);
            return isOrdinary && !becomeOrdinary() ? 125 : become(path(), words);
        });
        CHECK(outcome.signal == 0);
        return {outcome.exitCode, outcome.out, readFile(channels_ / "err")};
    }

    /// What a successful run writes.
    std::string output(Words const& words, std::string const& input = "") const {
        Run const run = koru(words, input);
        CHECK(run.exitCode == 0);
        CHECK(run.err == "");
        return run.out;
    }

    /// The exit code and the complaint of a run that fails and writes nothing else.
    std::string complaint(Words const& words, std::string const& input = "") const {
        Run const run = koru(words, input);
        CHECK(run.out == "");
        return std::to_string(run.exitCode) + " " + run.err;
    }

private:
    TempDir folder_;
    TempDir channels_;
};

} // namespace test

#endif
