// Commands that a test executable answers when it is started again by one of its tests.
#ifndef KORU_TESTS_SELFEXEC_H
#define KORU_TESTS_SELFEXEC_H

#include <cstdio>
#include <functional>
#include <map>
#include <string>

namespace test {

/// A command gets the arguments after its switch and returns the exit code of the process.
using SelfCommand = std::function<int(int, char**)>;

inline std::map<std::string, SelfCommand>& selfCommands() {
    static std::map<std::string, SelfCommand> commands;
    return commands;
}

/// Registers a command: `static test::RegisterSelf const r("name", [](int, char**) { ... });`. The
/// executable started with `--self=name` then runs it instead of the tests.
struct RegisterSelf {
    RegisterSelf(std::string const& name, SelfCommand command) {
        selfCommands()[name] = std::move(command);
    }
};

inline int runSelfSwitch(std::string const& name, int argc, char** argv) {
    auto const found = selfCommands().find(name);
    if (found == selfCommands().end()) {
        std::fprintf(stderr, "no command %s\n", name.c_str());
        return 125;
    }
    return found->second(argc, argv);
}

} // namespace test

#endif
