// Settings files without sections: load, look up, save and the whole cycle.
//
// What is compared: our names and values are wide at the interface, names match without regard to
// case, and the order of the lines is kept. "unordered_map" is what one writes by hand, with
// getline and an ofstream, when none of that is needed: narrow text, exact case, any order. With
// wide names and values it is a limit.
#include <koru/propertyfile.h>

#include <cstddef>
#include <cstdio>
#include <fstream>
#include <string>
#include <unordered_map>
#include <utility>
#include <vector>

#include "convert.h"
#include "harness.h"
#include "memorydirectory.h"
#include "settingswork.h"

#ifdef KORU_BENCH_HAS_BOOST
#include <boost/property_tree/ini_parser.hpp>
#include <boost/property_tree/ptree.hpp>
#endif

namespace {

using bench::Peer;
using Goals = bench::SettingsGoals;
using Step = bench::SettingsStep;
using Value = bench::SettingsValue;

/// A key in both forms.
struct Key {
    std::string narrow;
    std::wstring wide;
};
using Task = bench::SettingsTask<Key>;

/// Keys in no particular order; some fifty bytes a line.
std::vector<Key> _writeFile(std::string const& path, std::size_t count) {
    std::vector<Key> keys;
    std::ofstream out(path);
    char key[64];
    char value[64];
    for (std::size_t i = 0; i < count; ++i) {
        auto const number = static_cast<unsigned>(i * 7919 % 1000003);
        std::snprintf(key, sizeof key, "cache.%06u.maximum", number);
        std::snprintf(value, sizeof value, "/usr/share/application/%06u", number);
        out << key << '=' << value << '\n';
        keys.push_back({key, bench::widen(key)});
    }
    out.close();
    bench::require(!out.fail(), "cannot write a settings file");
    return keys;
}

/// Hands each line that is an entry to a function, as key and value. A line is trimmed, and a
/// comment is left out, as our format wants it.
template <class Use>
void _eachEntry(std::string const& path, Use use) {
    std::ifstream in(path);
    for (std::string line; std::getline(in, line);) {
        std::size_t const first = line.find_first_not_of(" \t");
        if (first == std::string::npos || line[first] == '#' || line[first] == ';') continue;
        std::size_t const end = line.find_last_not_of(" \t") + 1;
        std::size_t const equals = line.find('=', first);
        if (equals >= end || equals == first) continue;
        use(line.substr(first, equals - first), line.substr(equals + 1, end - equals - 1));
    }
}

// The libraries.

class Ours {
public:
    static constexpr char const* name = "ours";

    explicit Ours(std::string const& path) : file_(Koru::File::Path(path)) {}

    void load() { file_.open(Koru::File::READ | Koru::File::WRITE); }
    std::size_t get(Key const& key) { return file_.getValue(key.wide).size(); }
    void set(Key const& key, Value const& value) { file_.setValue(key.wide, value.wide); }
    void save() { file_.close(); }
    void abandon() { file_.setMode(Koru::File::READ); }

private:
    Koru::PropertyFile file_;
};

class NarrowMap {
public:
    static constexpr char const* name = "unordered_map";

    explicit NarrowMap(std::string const& path) : path_(path) {}

    void load() {
        _eachEntry(path_, [this](std::string&& key, std::string&& value) {
            table_.emplace(std::move(key), std::move(value));
        });
    }
    std::size_t get(Key const& key) const {
        auto const found = table_.find(key.narrow);
        std::string const value = found == table_.end() ? std::string() : found->second;
        return value.size();
    }
    void set(Key const& key, Value const& value) { table_[key.narrow] = value.narrow; }
    void save() const {
        std::ofstream out(path_);
        for (auto const& [key, value] : table_) out << key << '=' << value << '\n';
    }
    void abandon() {}

private:
    std::string path_;
    std::unordered_map<std::string, std::string> table_;
};

class WideMap {
public:
    static constexpr char const* name = "unordered_map, wide";

    explicit WideMap(std::string const& path) : path_(path) {}

    void load() {
        _eachEntry(path_, [this](std::string const& key, std::string const& value) {
            table_.emplace(bench::widen(key), bench::widen(value));
        });
    }
    std::size_t get(Key const& key) const {
        auto const found = table_.find(key.wide);
        std::wstring const value = found == table_.end() ? std::wstring() : found->second;
        return value.size();
    }
    void set(Key const& key, Value const& value) { table_[key.wide] = value.wide; }
    void save() const {
        std::ofstream out(path_);
        for (auto const& [key, value] : table_) {
            out << bench::narrow(key) << '=' << bench::narrow(value) << '\n';
        }
    }
    void abandon() {}

private:
    std::string path_;
    std::unordered_map<std::wstring, std::wstring> table_;
};

#ifdef KORU_BENCH_HAS_BOOST
class PropertyTree {
public:
    static constexpr char const* name = "Boost.PropertyTree";

    explicit PropertyTree(std::string const& path) : path_(path) {}

    void load() { boost::property_tree::read_ini(path_, tree_); }
    std::size_t get(Key const& key) { return bench::widen(node(key).data()).size(); }
    void set(Key const& key, Value const& value) { node(key).data() = bench::narrow(value.wide); }
    void save() { boost::property_tree::write_ini(path_, tree_); }
    void abandon() {}

private:
    // By find, since the keys contain the dot that paths through a tree are split at.
    boost::property_tree::ptree& node(Key const& key) {
        auto const found = tree_.find(bench::narrow(key.wide));
        bench::require(found != tree_.not_found(), "Boost.PropertyTree: key");
        return found->second;
    }

    std::string path_;
    boost::property_tree::ptree tree_;
};
#else
struct PropertyTree : bench::Missing {
    static constexpr char const* name = "Boost.PropertyTree";
};
#endif

std::vector<Peer> _peers(Task const& task, Step step) {
    Peer wide = bench::settingsPeer<WideMap, Ours>(task, step);
    wide.isLimit = true;
    return {bench::settingsPeer<NarrowMap, Ours>(task, step),
            bench::settingsPeer<PropertyTree, Ours>(task, step), wide};
}

void _size(bench::Report& report, bench::MemoryDirectory const& directory, std::size_t entries,
           std::string const& name, Goals const& goals) {
    std::string const path = directory / "settings.properties";
    Task const task(path, _writeFile(path, entries));
    for (Step const step : bench::settingsSteps) {
        std::string const row = name + ", " + bench::nameOf(step);
        if (!report.wants(row)) continue;
        report.compare(row, bench::settingsWork<Ours>(task, step), _peers(task, step),
                       bench::goalOf(step, goals), bench::unitsOf(step, task));
    }
}

} // namespace

int main(int argc, char** argv) {
    bench::Report report("properties", bench::Options(argc, argv));
    bench::MemoryDirectory const directory;
    // load, get, set, save, cycle
    _size(report, directory, 1, "1 entry", {0, 2.6, 2.3, 0, 0, 0, 0});
    _size(report, directory, 50, "50 entries", {0, 2.3, 2.3, 0, 0, 0, 0});
    _size(report, directory, 1000, "1,000 entries", {0.15, 2.2, 2.3, 0.5, 0.7, 0, 0});
    _size(report, directory, 20000, "20,000 entries", {0.3, 4.5, 4, 0.45, 0.42, 0, 0});
    if (report.options().quick()) return 0;
    _size(report, directory, 200000, "200,000 entries", {0, 30, 10, 0, 0, 0, 0});
}
