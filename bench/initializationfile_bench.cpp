// Settings files with sections: load, look up, change, save and the whole cycle, from 50 to 200,000
// entries.
//
// What is compared: our names are wide, match without regard to case and come back as copies in
// wide strings. SimpleIni works on narrow UTF-8 (CSimpleIniCaseA with SetUnicode) and
// Boost.PropertyTree and GLib on bytes; all three match case exactly and none converts, which is
// less work than ours. Our save deletes the file and writes it anew, as the contract has it, where
// the others empty it (GLib writes a temporary file and renames it).
#include <koru/initializationfile.h>

#include <fcntl.h>
#include <stdlib.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cstdint>
#include <cstdio>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <memory>
#include <random>
#include <stdexcept>
#include <string>
#include <utility>
#include <vector>

#include "harness.h"

#ifdef KORU_BENCH_HAS_SIMPLEINI
#define SI_NO_CONVERSION  // no wide variant, which would need a library
#define SI_IMPLEMENTATION // as Debian packages it: the bodies, for the word size of this program
#include <SimpleIni.h>
#endif
#ifdef KORU_BENCH_HAS_PROPERTY_TREE
#include <boost/property_tree/ini_parser.hpp>
#include <boost/property_tree/ptree.hpp>
#endif
#ifdef KORU_BENCH_HAS_GLIB
#include <glib.h>
#endif

namespace {

using bench::Rival;
using bench::Work;

/// A directory in memory where there is one, or the disk would be measured.
class MemoryDirectory {
public:
    MemoryDirectory() {
        if (::access("/dev/shm", W_OK) == 0)
            path_ = "/dev/shm";
        else
            path_ = std::filesystem::temp_directory_path().string();
        path_ += "/koru-bench-XXXXXX";
        bench::require(::mkdtemp(&path_[0]) != nullptr, "cannot make a temporary directory");
    }
    MemoryDirectory(MemoryDirectory const&) = delete;
    MemoryDirectory& operator=(MemoryDirectory const&) = delete;
    ~MemoryDirectory() {
        std::error_code ignored;
        std::filesystem::remove_all(path_, ignored);
    }

    std::string operator/(std::string const& name) const { return path_ + "/" + name; }

private:
    std::string path_;
};

std::wstring _widen(std::string const& ascii) { return std::wstring(ascii.begin(), ascii.end()); }

/// A name or value in the form that each library takes.
struct Text {
    std::string narrow;
    std::wstring wide;

    explicit Text(std::string const& ascii) : narrow(ascii), wide(_widen(ascii)) {}
};

struct Entry {
    Text section;
    Text key;
    Text value;
};

/// Entries in sections of twenty, in the order of their names.
std::vector<Entry> _entries(std::size_t count) {
    static char const* const words[] = {"address", "backup", "cache",  "delay", "enabled",
                                        "filter",  "group",  "height", "index", "limit"};
    std::vector<Entry> entries;
    entries.reserve(count);
    char text[64];
    for (std::size_t i = 0; i < count; ++i) {
        std::snprintf(text, sizeof text, "section%06u", static_cast<unsigned>(i / 20));
        Text const section(text);
        std::snprintf(text, sizeof text, "%s.%u", words[i % 20 / 2],
                      static_cast<unsigned>(i % 2 + 1));
        Text const key(text);
        std::snprintf(text, sizeof text, "value %u", static_cast<unsigned>(i * 7919 % 1000003));
        entries.push_back({section, key, Text(text)});
    }
    return entries;
}

/// Sections in any order, and the keys of a section in any order.
std::vector<Entry> _shuffled(std::vector<Entry> entries) {
    std::mt19937 random(1);
    std::vector<std::vector<Entry>> sections;
    for (std::size_t i = 0; i < entries.size(); ++i) {
        if (i % 20 == 0) sections.emplace_back();
        sections.back().push_back(entries[i]);
    }
    std::shuffle(sections.begin(), sections.end(), random);
    entries.clear();
    for (std::vector<Entry>& section : sections) {
        std::shuffle(section.begin(), section.end(), random);
        entries.insert(entries.end(), section.begin(), section.end());
    }
    return entries;
}

void _write(std::string const& path, std::vector<Entry> const& entries) {
    std::ofstream out(path);
    std::string const* section = nullptr;
    for (Entry const& entry : entries) {
        if (section == nullptr || *section != entry.section.narrow) {
            out << '[' << entry.section.narrow << "]\n";
        }
        section = &entry.section.narrow;
        out << entry.key.narrow << '=' << entry.value.narrow << '\n';
    }
    out.close();
    bench::require(!out.fail(), "cannot write a settings file");
}

// The contenders. Each is made for a path and has load(), size of get(entry), set(entry, value) and
// save(); an object is used once.

class Ours {
public:
    static constexpr char const* name = "ours";

    explicit Ours(std::string const& path) : file_(Koru::File::Path(path)) {}

    void load() { file_.open(Koru::File::READ | Koru::File::WRITE); }
    std::size_t get(Entry const& entry) {
        return file_.getValue(entry.section.wide, entry.key.wide).size();
    }
    void set(Entry const& entry, Text const& value) {
        file_.setValue(entry.section.wide, entry.key.wide, value.wide);
    }
    void save() { file_.close(); }
    /// Before the object is destroyed without being saved: the destructor would write.
    void abandon() { file_.setMode(Koru::File::READ); }

private:
    Koru::InitializationFile file_;
};

#ifdef KORU_BENCH_HAS_SIMPLEINI
class SimpleIni {
public:
    static constexpr char const* name = "SimpleIni";

    explicit SimpleIni(std::string const& path) : path_(path) {
        file_.SetUnicode();
        file_.SetSpaces(false);
    }

    void load() { bench::require(file_.LoadFile(path_.c_str()) == SI_OK, "SimpleIni: load"); }
    std::size_t get(Entry const& entry) {
        return std::strlen(
            file_.GetValue(entry.section.narrow.c_str(), entry.key.narrow.c_str(), ""));
    }
    void set(Entry const& entry, Text const& value) {
        file_.SetValue(entry.section.narrow.c_str(), entry.key.narrow.c_str(),
                       value.narrow.c_str());
    }
    void save() {
        bench::require(file_.SaveFile(path_.c_str(), false) == SI_OK, "SimpleIni: save");
    }
    void abandon() {}

private:
    std::string path_;
    CSimpleIniCaseA file_;
};
#endif

#ifdef KORU_BENCH_HAS_PROPERTY_TREE
class PropertyTree {
public:
    static constexpr char const* name = "Boost.PropertyTree";

    explicit PropertyTree(std::string const& path) : path_(path) {}

    void load() { boost::property_tree::read_ini(path_, tree_); }
    // By find, since the keys contain the dot that paths through a tree are split at.
    std::size_t get(Entry const& entry) { return node(entry).data().size(); }
    void set(Entry const& entry, Text const& value) { node(entry).data() = value.narrow; }
    void save() { boost::property_tree::write_ini(path_, tree_); }
    void abandon() {}

private:
    boost::property_tree::ptree& node(Entry const& entry) {
        auto const section = tree_.find(entry.section.narrow);
        bench::require(section != tree_.not_found(), "Boost.PropertyTree: section");
        auto const key = section->second.find(entry.key.narrow);
        bench::require(key != section->second.not_found(), "Boost.PropertyTree: key");
        return key->second;
    }

    std::string path_;
    boost::property_tree::ptree tree_;
};
#endif

#ifdef KORU_BENCH_HAS_GLIB
class KeyFile {
public:
    static constexpr char const* name = "GLib GKeyFile";

    explicit KeyFile(std::string const& path) : path_(path), file_(g_key_file_new()) {}
    KeyFile(KeyFile const&) = delete;
    KeyFile& operator=(KeyFile const&) = delete;
    ~KeyFile() { g_key_file_free(file_); }

    void load() {
        bench::require(g_key_file_load_from_file(file_, path_.c_str(), G_KEY_FILE_NONE, nullptr) !=
                           0,
                       "GKeyFile: load");
    }
    std::size_t get(Entry const& entry) {
        char* const value = g_key_file_get_value(file_, entry.section.narrow.c_str(),
                                                 entry.key.narrow.c_str(), nullptr);
        bench::require(value != nullptr, "GKeyFile: get");
        std::size_t const size = std::strlen(value);
        g_free(value);
        return size;
    }
    void set(Entry const& entry, Text const& value) {
        g_key_file_set_value(file_, entry.section.narrow.c_str(), entry.key.narrow.c_str(),
                             value.narrow.c_str());
    }
    void save() {
        bench::require(g_key_file_save_to_file(file_, path_.c_str(), nullptr) != 0,
                       "GKeyFile: save");
    }
    void abandon() {}

private:
    std::string path_;
    GKeyFile* file_;
};
#endif

/// A file and what is done with it: 1,000 look-ups and 100 changes, spread over all entries.
class Task {
public:
    Task(MemoryDirectory const& directory, std::string const& name,
         std::vector<Entry> const& entries)
        : path_(directory / name), bytes_(0) {
        _write(path_, entries);
        bytes_ = static_cast<std::size_t>(std::filesystem::file_size(path_));
        std::mt19937 random(2);
        for (int i = 0; i < 1000; ++i) lookedUp_.push_back(entries[random() % entries.size()]);
        for (int i = 0; i < 100; ++i) changed_.push_back(entries[random() % entries.size()]);
    }

    std::string const& path() const { return path_; }
    std::size_t bytes() const { return bytes_; }

    template <class Settings>
    std::size_t lookUp(Settings& settings) const {
        std::size_t total = 0;
        for (Entry const& entry : lookedUp_) total += settings.get(entry);
        return total;
    }

    /// Changes values to text of the same length, so that the file keeps its size, and to another
    /// text than the last time.
    template <class Settings>
    void change(Settings& settings) const {
        static Text const values[] = {Text("changed value"), Text("another value")};
        turn_ = 1 - turn_;
        for (Entry const& entry : changed_) settings.set(entry, values[turn_]);
    }

    static constexpr double lookUps = 1000;
    static constexpr double changes = 100;

private:
    std::string path_;
    std::size_t bytes_;
    std::vector<Entry> lookedUp_;
    std::vector<Entry> changed_;
    mutable std::size_t turn_ = 0;
};

/// A fresh object for each run, on a copy of the file that is this contender's own, since each
/// writes it a little differently. Destroying the last object is part of the preparation.
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

enum class Step { load, lookUp, change, save, cycle };

/// From nothing to a filled table.
template <class Settings>
Work _load(std::shared_ptr<Slot<Settings>> slot) {
    return Work::prepared([slot] { slot->clear(); }, [slot] { return &slot->load(); });
}

template <class Settings>
Work _lookUp(std::shared_ptr<Slot<Settings>> slot) {
    return Work::repeated([slot] { return slot->task().lookUp(slot->settings()); })
        .within([slot] { slot->load(); }, [slot] { slot->clear(); });
}

template <class Settings>
Work _change(std::shared_ptr<Slot<Settings>> slot) {
    return Work::prepared(
        [slot] {
            slot->clear();
            slot->load();
        },
        [slot] {
            slot->task().change(slot->settings());
            return 0;
        });
}

/// From a changed table to a closed file.
template <class Settings>
Work _save(std::shared_ptr<Slot<Settings>> slot) {
    return Work::prepared(
        [slot] {
            slot->clear();
            slot->task().change(slot->load());
        },
        [slot] {
            slot->settings().save();
            return 0;
        });
}

/// What a program does in its life: everything, the destruction included.
template <class Settings>
Work _cycle(std::shared_ptr<Slot<Settings>> slot) {
    return Work::repeated([slot] {
        Settings settings(slot->path());
        settings.load();
        std::size_t const size = slot->task().lookUp(settings);
        slot->task().change(settings);
        settings.save();
        return size;
    });
}

template <class Settings>
Work _work(Task const& task, Step step) {
    auto const slot = std::make_shared<Slot<Settings>>(task);
    switch (step) {
    case Step::load:
        return _load(slot);
    case Step::lookUp:
        return _lookUp(slot);
    case Step::change:
        return _change(slot);
    case Step::save:
        return _save(slot);
    case Step::cycle:
        break;
    }
    return _cycle(slot);
}

/// A contender that finds what we find.
template <class Settings>
Rival _rival(Task const& task, Step step) {
    Slot<Ours> ours(task);
    Slot<Settings> theirs(task);
    bench::require(task.lookUp(ours.load()) == task.lookUp(theirs.load()), Settings::name);
    return bench::peer(Settings::name, _work<Settings>(task, step));
}

std::vector<Rival> _rivals([[maybe_unused]] Task const& task, [[maybe_unused]] Step step) {
    return {
#ifdef KORU_BENCH_HAS_SIMPLEINI
        _rival<SimpleIni>(task, step),
#else
        bench::missing("SimpleIni"),
#endif
#ifdef KORU_BENCH_HAS_PROPERTY_TREE
        _rival<PropertyTree>(task, step),
#else
        bench::missing("Boost.PropertyTree"),
#endif
#ifdef KORU_BENCH_HAS_GLIB
        _rival<KeyFile>(task, step),
#else
        bench::missing("GLib GKeyFile"),
#endif
    };
}

/// The bytes of a file, in memory that is not cleared first.
struct Bytes {
    std::unique_ptr<char[]> data;
    std::size_t size;
};

Bytes _readWhole(Task const& task) {
    Bytes bytes{std::unique_ptr<char[]>(new char[task.bytes()]), task.bytes()};
    int const file = ::open(task.path().c_str(), O_RDONLY | O_CLOEXEC);
    ssize_t const n = ::read(file, bytes.data.get(), bytes.size);
    ::close(file);
    bench::require(n == static_cast<ssize_t>(bytes.size), "cannot read a settings file");
    return bytes;
}

std::size_t _countLines(Bytes const& bytes) {
    std::size_t lines = 0;
    char const* at = bytes.data.get();
    char const* const end = at + bytes.size;
    for (; at != end; ++lines) {
        void const* const found = std::memchr(at, '\n', static_cast<std::size_t>(end - at));
        if (found == nullptr) break;
        at = static_cast<char const*>(found) + 1;
    }
    return lines;
}

/// Reading the file into memory and finding its lines.
Rival _readLimit(Task const& task, double goal) {
    return bench::limit("read + memchr",
                        Work::repeated([&task] { return _countLines(_readWhole(task)); }), goal);
}

/// Replacing the file by bytes that are ready.
Rival _writeLimit(Task const& task, double goal) {
    auto const bytes = std::make_shared<Bytes>(_readWhole(task));
    return bench::limit("unlink + one write", Work::repeated([&task, bytes] {
                            ::unlink(task.path().c_str());
                            int const file = ::open(task.path().c_str(),
                                                    O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0644);
                            ssize_t const n = ::write(file, bytes->data.get(), bytes->size);
                            ::close(file);
                            bench::require(n == static_cast<ssize_t>(bytes->size), "write");
                            return n;
                        }),
                        goal);
}

/// Ratios to reach; 0 for none.
struct Goals {
    double load, lookUp, save, cycle, loadLimit, saveLimit;
};

struct Size {
    std::size_t entries;
    char const* name;
    Goals goals;
};

void _sizes(bench::Report& report, MemoryDirectory const& directory, Size const& size) {
    std::string const prefix = std::string(size.name) + ", ";
    std::vector<std::pair<Step, std::string>> const steps = {{Step::load, prefix + "load"},
                                                             {Step::lookUp, prefix + "look up"},
                                                             {Step::change, prefix + "change"},
                                                             {Step::save, prefix + "save"},
                                                             {Step::cycle, prefix + "whole cycle"}};
    if (std::none_of(steps.begin(), steps.end(),
                     [&report](auto const& step) { return report.wants(step.second); })) {
        return;
    }
    Task const task(directory, "settings.ini", _entries(size.entries));
    for (auto const& [step, row] : steps) {
        if (!report.wants(row)) continue;
        std::vector<Rival> rivals = _rivals(task, step);
        Goals const& goals = size.goals;
        if (step == Step::load) rivals.push_back(_readLimit(task, goals.loadLimit));
        if (step == Step::save) rivals.push_back(_writeLimit(task, goals.saveLimit));
        double const goal = step == Step::load     ? goals.load
                            : step == Step::lookUp ? goals.lookUp
                            : step == Step::save   ? goals.save
                            : step == Step::cycle  ? goals.cycle
                                                   : 0;
        double const units = step == Step::lookUp   ? Task::lookUps
                             : step == Step::change ? Task::changes
                                                    : 1;
        report.compare(row, _work<Ours>(task, step), rivals, goal, units);
    }
}

void _unsorted(bench::Report& report, MemoryDirectory const& directory) {
    std::string const row = "20,000 entries, unsorted, load";
    if (!report.wants(row)) return;
    Task const task(directory, "unsorted.ini", _shuffled(_entries(20000)));
    report.compare(row, _work<Ours>(task, Step::load), _rivals(task, Step::load), 0.6);
}

} // namespace

int main(int argc, char** argv) {
    bench::Report report("Koru initializationfile", bench::Options(argc, argv));
    MemoryDirectory const directory;
    static Size const sizes[] = {
        {50, "50 entries", {0.55, 0.9, 1.0, 0.8, 0, 0}},
        {1000, "1,000 entries", {0.15, 0.75, 0.30, 0.32, 0, 0}},
        {20000, "20,000 entries", {0.25, 1.1, 0.27, 0.28, 5, 4}},
        {200000, "200,000 entries", {0.25, 3, 0.27, 0.26, 0, 0}},
    };
    for (Size const& size : sizes) {
        if (report.options().quick() && size.entries > 20000) continue;
        _sizes(report, directory, size);
    }
    _unsorted(report, directory);
}
