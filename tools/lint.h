// What is dangerous in a settings file or a property file.
#ifndef KORU_TOOLS_LINT_H
#define KORU_TOOLS_LINT_H

#include <cstddef>
#include <string>
#include <vector>

namespace tool {

struct Finding {
    std::size_t line; ///< from 1
    std::string text; ///< what is read there, and how
    bool isLoss;      ///< whether a save loses or garbles what the line is meant to say
};

struct Report {
    std::vector<Finding> findings;
    std::size_t comments = 0; ///< which every save drops, as blank lines
    std::size_t blanks = 0;
};

Report lint(std::string const& bytes, bool hasSections);

/// @throws Failure for the first loss
void refuseLoss(std::string const& bytes, bool hasSections);

} // namespace tool

#endif
