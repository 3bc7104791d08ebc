#include "lint.h"

#include <koru/string.h>

#include <algorithm>
#include <map>
#include <sstream>

#include "failure.h"
#include "text.h"

namespace tool {

namespace {

char const* const BLANKS = " \t";
char const* const BYTE_ORDER_MARK = "\xEF\xBB\xBF";

struct NameLess {
    bool operator()(std::string const& a, std::string const& b) const {
        return Koru::compare(a, b) < 0;
    }
};
using Lines = std::map<std::string, std::size_t, NameLess>;

bool _isBlank(char c) { return c == ' ' || c == '\t'; }

/// Goes through a file as the library does, line by line; see docs/formats.md for the grammar.
class Linter {
public:
    explicit Linter(bool hasSections) : hasSections_(hasSections), isInSection_(!hasSections) {}

    Report report(std::string const& bytes) {
        std::istringstream in(bytes);
        for (std::string line; std::getline(in, line);) {
            ++number_;
            line = trimmed(line);
            checkBytes(line);
            checkLine(line);
        }
        checkSectionHasEntries();
        std::stable_sort(report_.findings.begin(), report_.findings.end(), [](auto& a, auto& b) {
            return a.line < b.line; // Headers without entries are found late.
        });
        return report_;
    }

private:
    void find(std::string const& text, bool isLoss = false) {
        report_.findings.push_back({number_, text, isLoss});
    }
    void lose(std::string const& text) { find(text, true); }

    static std::string trimmed(std::string const& line) {
        std::size_t const begin = line.find_first_not_of(BLANKS);
        if (begin == std::string::npos) return "";
        return line.substr(begin, line.find_last_not_of(BLANKS) - begin + 1);
    }

    static bool isComment(std::string const& line) {
        return !line.empty() && (line[0] == '#' || line[0] == ';');
    }

    void checkBytes(std::string const& line) {
        if (number_ == 1 && line.rfind(BYTE_ORDER_MARK, 0) == 0)
            lose("a byte order mark is read as text of this line");
        if (line.find('\r') != std::string::npos)
            find("a carriage return is read as text of the line");
        if (line.find('\0') != std::string::npos)
            find("a NUL ends the name or value that it is in", !isComment(line));
        if (!isUtf8(line))
            find("a byte is no UTF-8, so the text is read as another one", !isComment(line));
    }

    void checkLine(std::string const& line) {
        if (line.empty() || line == "\r")
            ++report_.blanks;
        else if (isComment(line))
            ++report_.comments;
        else if (hasSections_ && line[0] == '[')
            checkHeader(line);
        else
            checkEntry(line);
    }

    void checkHeader(std::string const& line) {
        checkSectionHasEntries();
        std::string name = line;
        if (name.find_last_not_of(']') != std::string::npos)
            name.resize(name.find_last_not_of(']') + 1);
        if (name.find_first_not_of('[') != std::string::npos)
            name.erase(0, name.find_first_not_of('['));
        bool const isLoss = name[0] == '['; // It gains a bracket with every save.
        if (isLoss || "[" + name + "]" != line)
            find("the header is read as that of section " + quoted(name), isLoss);
        section_ = name;
        header_ = number_;
        isInSection_ = true;
        hasEntries_ = false;
    }

    void checkSectionHasEntries() {
        if (header_ == 0 || hasEntries_) return;
        report_.findings.push_back(
            {header_, "section " + quoted(section_) + " has no entry here, so its header is lost",
             false});
    }

    void checkEntry(std::string const& line) {
        std::size_t const equals = line.find('=');
        if (equals == std::string::npos) return lose("a line without = is ignored");
        std::string const key = line.substr(0, equals);
        if (key.empty()) return lose("an entry without a key is ignored");
        if (!isInSection_) return lose("an entry before the first header is ignored");
        hasEntries_ = true;
        checkBlanks(key, line.substr(equals + 1));
        checkDuplicate(key);
    }

    void checkBlanks(std::string const& key, std::string const& value) {
        if (_isBlank(key.back())) find("the blank before = belongs to the key");
        if (!value.empty() && _isBlank(value.front()))
            find("the blank after = belongs to the value");
        for (std::size_t i = 1; i < value.size(); ++i) {
            if (_isBlank(value[i - 1]) && (value[i] == ';' || value[i] == '#'))
                return find(std::string("the text after ") + value[i] + " belongs to the value");
        }
    }

    void checkDuplicate(std::string const& key) {
        auto const [first, isNew] = sections_[section_].emplace(key, number_);
        if (isNew) return;
        find("key " + quoted(key) + " is in line " + std::to_string(first->second) +
             " already, which counts");
    }

    bool const hasSections_;
    bool isInSection_;
    bool hasEntries_ = false;
    std::size_t number_ = 0;
    std::size_t header_ = 0;
    std::string section_;
    std::map<std::string, Lines, NameLess> sections_;
    Report report_;
};

} // namespace

Report lint(std::string const& bytes, bool hasSections) {
    return Linter(hasSections).report(bytes);
}

void refuseLoss(std::string const& bytes, bool hasSections) {
    for (Finding const& finding : lint(bytes, hasSections).findings) {
        if (finding.isLoss)
            throw Failure(REFUSED, "line " + std::to_string(finding.line) + " would be lost: " +
                                       finding.text + " (--force goes on all the same)");
    }
}

} // namespace tool
