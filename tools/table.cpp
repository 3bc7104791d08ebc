#include "table.h"

#include <koru/string.h>

#include <set>

namespace tool {

namespace {

struct NameLess {
    bool operator()(Entry const& a, Entry const& b) const {
        int const sections = Koru::compare(a.section, b.section);
        return sections != 0 ? sections < 0 : Koru::compare(a.key, b.key) < 0;
    }
};

} // namespace

bool haveSameName(Entry const& a, Entry const& b) {
    return Koru::compare(a.section, b.section) == 0 && Koru::compare(a.key, b.key) == 0;
}

std::vector<Entry> firstOfEach(std::vector<Entry> const& entries) {
    std::set<Entry, NameLess> seen;
    std::vector<Entry> result;
    for (Entry const& entry : entries) {
        if (seen.insert(entry).second) result.push_back(entry);
    }
    return result;
}

} // namespace tool
