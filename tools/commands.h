// The subcommands. Each does its work and throws a `Failure` otherwise; main.cpp tells how they are
// called.
#ifndef KORU_TOOLS_COMMANDS_H
#define KORU_TOOLS_COMMANDS_H

#include <optional>
#include <string>
#include <vector>

#include "access.h"
#include "failure.h"
#include "table.h"

namespace tool {

/// What is on the command line. A command looks at what it needs.
struct Arguments {
    std::string file;
    std::vector<std::string> files; ///< of `lint`
    std::optional<std::string> section;
    std::optional<std::string> key;
    std::optional<std::string> value;
    std::string format = "text"; ///< or "json"
    std::string input = "-";     ///< of `import`
    Options options;             ///< of what changes a file
    bool isRaw = false;          ///< of records: data are bytes, not digits
    std::string program;         ///< of `path`
};

void list(Family const& family, Arguments const& arguments);
void get(Family const& family, Arguments const& arguments);
void set(Family const& family, Arguments const& arguments);
void remove(Family const& family, Arguments const& arguments);
void importFrom(Family const& family, Arguments const& arguments);
void exportTo(Family const& family, Arguments const& arguments);
/// False if there is something to complain about.
bool lintFiles(Family const& family, Arguments const& arguments);
void uuid(Arguments const& arguments);
void path(Arguments const& arguments);

/// Writes to standard output.
void print(std::string const& text);

} // namespace tool

#endif
