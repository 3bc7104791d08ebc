// Settings files without sections: load, look up, save and the whole cycle.
//
// What is compared: our names and values are wide at the interface, names match without regard to
// case, and the order of the lines is kept. The rivals match case exactly, and a hash table loses
// the order, which is less work. "unordered_map" is what one writes by hand to have the same
// interface: a table of wide strings, filled by getline and written with an ofstream; the
// conversions are the library's own. A table that is kept narrow and converts at look-ups stands
// beside it.
#include <koru/propertyfile.h>
#include <koru/string.h>

#include <algorithm>
#include <cstddef>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <memory>
#include <random>
#include <string>
#include <unordered_map>
#include <utility>
#include <vector>

#include "harness.h"
#include "memorydirectory.h"

#ifdef KORU_BENCH_HAS_PROPERTY_TREE
#include <boost/property_tree/ini_parser.hpp>
#include <boost/property_tree/ptree.hpp>
#endif

namespace {

using bench::Rival;
using bench::Work;

/// Keys in no particular order; some fifty bytes a line.
std::vector<std::wstring> _writeFile(std::string const& path, std::size_t count) {
    std::vector<std::wstring> keys;
    std::ofstream out(path);
    char key[64];
    char value[64];
    for (std::size_t i = 0; i < count; ++i) {
        auto const number = static_cast<unsigned>(i * 7919 % 1000003);
        std::snprintf(key, sizeof key, "cache.%06u.maximum", number);
        std::snprintf(value, sizeof value, "/usr/share/application/%06u", number);
        out << key << '=' << value << '\n';
        keys.push_back(Koru::make_wstring(key));
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

// The contenders. Each is made for a path and used once.

class Ours {
public:
    static constexpr char const* name = "ours";

    explicit Ours(std::string const& path) : file_(Koru::File::Path(path)) {}

    void load() { file_.open(Koru::File::READ | Koru::File::WRITE); }
    std::wstring get(std::wstring const& key) { return file_.getValue(key); }
    void set(std::wstring const& key, std::wstring const& value) { file_.setValue(key, value); }
    void save() { file_.close(); }
    /// Before the object is destroyed without being saved: the destructor would write.
    void abandon() { file_.setMode(Koru::File::READ); }

private:
    Koru::PropertyFile file_;
};

class WideMap {
public:
    static constexpr char const* name = "unordered_map";

    explicit WideMap(std::string const& path) : path_(path) {}

    void load() {
        _eachEntry(path_, [this](std::string const& key, std::string const& value) {
            table_.emplace(Koru::make_wstring(key), Koru::make_wstring(value));
        });
    }
    std::wstring get(std::wstring const& key) const {
        auto const found = table_.find(key);
        return found == table_.end() ? std::wstring() : found->second;
    }
    void set(std::wstring const& key, std::wstring const& value) { table_[key] = value; }
    void save() const {
        std::ofstream out(path_);
        for (auto const& [key, value] : table_) {
            out << Koru::make_string(key) << '=' << Koru::make_string(value) << '\n';
        }
    }
    void abandon() {}

private:
    std::string path_;
    std::unordered_map<std::wstring, std::wstring> table_;
};

class NarrowMap {
public:
    static constexpr char const* name = "unordered_map, kept narrow";

    explicit NarrowMap(std::string const& path) : path_(path) {}

    void load() {
        _eachEntry(path_, [this](std::string&& key, std::string&& value) {
            table_.emplace(std::move(key), std::move(value));
        });
    }
    std::wstring get(std::wstring const& key) const {
        auto const found = table_.find(Koru::make_string(key));
        return found == table_.end() ? std::wstring() : Koru::make_wstring(found->second);
    }
    void set(std::wstring const& key, std::wstring const& value) {
        table_[Koru::make_string(key)] = Koru::make_string(value);
    }
    void save() const {
        std::ofstream out(path_);
        for (auto const& [key, value] : table_) out << key << '=' << value << '\n';
    }
    void abandon() {}

private:
    std::string path_;
    std::unordered_map<std::string, std::string> table_;
};

#ifdef KORU_BENCH_HAS_PROPERTY_TREE
class PropertyTree {
public:
    static constexpr char const* name = "Boost.PropertyTree";

    explicit PropertyTree(std::string const& path) : path_(path) {}

    void load() { boost::property_tree::read_ini(path_, tree_); }
    std::wstring get(std::wstring const& key) { return Koru::make_wstring(node(key).data()); }
    void set(std::wstring const& key, std::wstring const& value) {
        node(key).data() = Koru::make_string(value);
    }
    void save() { boost::property_tree::write_ini(path_, tree_); }
    void abandon() {}

private:
    // By find, since the keys contain the dot that paths through a tree are split at.
    boost::property_tree::ptree& node(std::wstring const& key) {
        auto const found = tree_.find(Koru::make_string(key));
        bench::require(found != tree_.not_found(), "Boost.PropertyTree: key");
        return found->second;
    }

    std::string path_;
    boost::property_tree::ptree tree_;
};
#endif

/// A file and what is done with it: 1,000 look-ups and 100 changes, spread over all entries.
class Task {
public:
    Task(bench::MemoryDirectory const& directory, std::size_t entries)
        : path_(directory / "settings.properties") {
        std::vector<std::wstring> const keys = _writeFile(path_, entries);
        std::mt19937 random(2);
        for (int i = 0; i < 1000; ++i) lookedUp_.push_back(keys[random() % keys.size()]);
        for (int i = 0; i < 100; ++i) changed_.push_back(keys[random() % keys.size()]);
    }

    std::string const& path() const { return path_; }

    template <class Settings>
    std::size_t lookUpOne(Settings& settings) const {
        return settings.get(lookedUp_.front()).size();
    }

    template <class Settings>
    std::size_t lookUp(Settings& settings) const {
        std::size_t total = 0;
        for (std::wstring const& key : lookedUp_) total += settings.get(key).size();
        return total;
    }

    /// Changes values to text of the same length, so that the file keeps its size.
    template <class Settings>
    void change(Settings& settings) const {
        static std::wstring const value = L"/var/cache/application/change";
        for (std::wstring const& key : changed_) settings.set(key, value);
    }

    static constexpr double lookUps = 1000;

private:
    std::string path_;
    std::vector<std::wstring> lookedUp_;
    std::vector<std::wstring> changed_;
};

/// A fresh object for each run, on a copy of the file that is this contender's own. Destroying the
/// last object is part of the preparation.
template <class Settings>
class Slot {
public:
    explicit Slot(Task const& task) : task_(&task), path_(task.path() + "." + Settings::name) {
        std::filesystem::copy_file(task.path(), path_,
                                   std::filesystem::copy_options::overwrite_existing);
    }
    Slot(Slot const&) = delete;
    Slot& operator=(Slot const&) = delete;
    ~Slot() { clear(); }

    void clear() {
        if (settings_) settings_->abandon();
        settings_.reset();
    }
    Settings& load() {
        settings_ = std::make_unique<Settings>(path_);
        settings_->load();
        return *settings_;
    }
    Settings& settings() { return *settings_; }
    Task const& task() const { return *task_; }
    std::string const& path() const { return path_; }

private:
    Task const* task_;
    std::string path_;
    std::unique_ptr<Settings> settings_;
};

enum class Step { load, lookUp, save, cycle };

template <class Settings>
Work _work(Task const& task, Step step) {
    auto const slot = std::make_shared<Slot<Settings>>(task);
    switch (step) {
    case Step::load:
        return Work::prepared([slot] { slot->clear(); }, [slot] { return &slot->load(); });
    case Step::lookUp:
        // The first look-up, untimed, does whatever was put off until then.
        return Work::repeated([slot] { return slot->task().lookUp(slot->settings()); })
            .within([slot] { slot->task().lookUpOne(slot->load()); }, [slot] { slot->clear(); });
    case Step::save:
        return Work::prepared(
            [slot] {
                slot->clear();
                slot->task().change(slot->load());
            },
            [slot] {
                slot->settings().save();
                return 0;
            });
    case Step::cycle:
        break;
    }
    // What a program does in its life: everything, the destruction included.
    return Work::repeated([slot] {
        Settings settings(slot->path());
        settings.load();
        std::size_t const size = slot->task().lookUp(settings);
        slot->task().change(settings);
        settings.save();
        settings.abandon();
        return size;
    });
}

/// The work of one that finds what we find.
template <class Settings>
Work _rivalWork(Task const& task, Step step) {
    Slot<Ours> ours(task);
    Slot<Settings> theirs(task);
    bench::require(task.lookUp(ours.load()) == task.lookUp(theirs.load()), Settings::name);
    return _work<Settings>(task, step);
}

std::vector<Rival> _rivals(Task const& task, Step step) {
    return {
        bench::peer(WideMap::name, _rivalWork<WideMap>(task, step)),
#ifdef KORU_BENCH_HAS_PROPERTY_TREE
        bench::peer(PropertyTree::name, _rivalWork<PropertyTree>(task, step)),
#else
        bench::missing("Boost.PropertyTree"),
#endif
        bench::limit(NarrowMap::name, _rivalWork<NarrowMap>(task, step)),
    };
}

struct Job {
    Step step;
    char const* name;
    double goal;
};

void _size(bench::Report& report, bench::MemoryDirectory const& directory, std::size_t entries,
           std::string const& name, std::vector<Job> const& jobs) {
    if (std::none_of(jobs.begin(), jobs.end(),
                     [&](Job const& job) { return report.wants(name + ", " + job.name); })) {
        return;
    }
    Task const task(directory, entries);
    for (Job const& job : jobs) {
        std::string const row = name + ", " + job.name;
        if (!report.wants(row)) continue;
        report.compare(row, _work<Ours>(task, job.step), _rivals(task, job.step), job.goal,
                       job.step == Step::lookUp ? Task::lookUps : 1);
    }
}

} // namespace

int main(int argc, char** argv) {
    bench::Report report("Koru propertyfile", bench::Options(argc, argv));
    bench::MemoryDirectory const directory;
    _size(report, directory, 1000, "1,000 entries",
          {{Step::load, "load", 0.15},
           {Step::lookUp, "look up", 1.8},
           {Step::save, "save", 0.5},
           {Step::cycle, "whole cycle", 0.6}});
    _size(report, directory, 20000, "20,000 entries",
          {{Step::load, "load", 0.3},
           {Step::lookUp, "look up", 3},
           {Step::save, "save", 0.45},
           {Step::cycle, "whole cycle", 0.42}});
}
