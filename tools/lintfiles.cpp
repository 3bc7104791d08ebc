// Tells what is dangerous in files, in the form in which compilers complain.
#include "commands.h"
#include "lint.h"
#include "text.h"

namespace tool {

namespace {

/// What every save drops: that is intended and no finding.
std::string _note(Report const& report) {
    if (report.comments + report.blanks == 0) return "";
    return "note: a save drops comments (" + std::to_string(report.comments) +
           ") and blank lines (" + std::to_string(report.blanks) + ")\n";
}

/// Whether there is nothing to complain about.
bool _isClean(Family const& family, std::string const& file) {
    Report const report = about(file, [&] { return lint(readAll(file), family.hasSections); });
    std::string text;
    for (Finding const& finding : report.findings)
        text += file + ":" + std::to_string(finding.line) + ": " + finding.text + "\n";
    std::string const note = _note(report);
    if (!note.empty()) text += file + ": " + note;
    print(text);
    return report.findings.empty();
}

} // namespace

bool lintFiles(Family const& family, Arguments const& arguments) {
    bool isClean = true;
    for (std::string const& file : arguments.files) isClean = _isClean(family, file) && isClean;
    return isClean;
}

} // namespace tool
