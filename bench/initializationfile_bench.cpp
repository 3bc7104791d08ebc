// Settings files with sections: load, look up, change, save and the whole cycle, from 50 to 200,000
// entries.
//
// What is compared: our names and values are wide at the interface, and names match without regard
// to case. SimpleIni (CSimpleIniCaseA with SetUnicode, its variant for narrow UTF-8), GKeyFile and
// Boost.PropertyTree are narrow and match case exactly, which is less work. To do the same job they
// are given wide names and asked for wide values, by the library's own conversions; look-ups with
// narrow names and values stand beside that. Our save deletes the file and writes it anew, as its
// header says, where the others empty it (GKeyFile writes a temporary file and renames it).
#include <koru/initializationfile.h>
#include <koru/string.h>

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

/// Names in both forms, and a value.
struct Entry {
    std::string section;
    std::string key;
    std::string value;
    std::wstring wideSection;
    std::wstring wideKey;
};

Entry _entry(std::string const& section, std::string const& key, std::string const& value) {
    return {section, key, value, Koru::make_wstring(section), Koru::make_wstring(key)};
}

/// Entries in sections of twenty, in the order of their names, some fifty bytes a line.
std::vector<Entry> _entries(std::size_t count) {
    static char const* const words[] = {"address", "backup", "cache",  "delay", "enabled",
                                        "filter",  "group",  "height", "index", "limit"};
    std::vector<Entry> entries;
    entries.reserve(count);
    char section[64];
    char value[64];
    for (std::size_t i = 0; i < count; ++i) {
        std::snprintf(section, sizeof section, "Section %06u", static_cast<unsigned>(i / 20));
        std::string const key =
            std::string(words[i % 20 / 2]) + (i % 2 == 0 ? ".default.value" : ".maximum.value");
        std::snprintf(value, sizeof value, "/usr/share/application/%06u",
                      static_cast<unsigned>(i * 7919 % 1000003));
        entries.push_back(_entry(section, key, value));
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
        if (section == nullptr || *section != entry.section) {
            out << '[' << entry.section << "]\n";
        }
        section = &entry.section;
        out << entry.key << '=' << entry.value << '\n';
    }
    out.close();
    bench::require(!out.fail(), "cannot write a settings file");
}

// The contenders. Each is made for a path and used once. get gives the size of a value; find, of
// those with narrow names, hands the value to a function.

class Ours {
public:
    static constexpr char const* name = "ours";

    explicit Ours(std::string const& path) : file_(Koru::File::Path(path)) {}

    void load() { file_.open(Koru::File::READ | Koru::File::WRITE); }
    std::size_t get(Entry const& entry) {
        return file_.getValue(entry.wideSection, entry.wideKey).size();
    }
    void set(Entry const& entry, std::wstring const& value) {
        file_.setValue(entry.wideSection, entry.wideKey, value);
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
    template <class Use>
    std::size_t find(std::string const& section, std::string const& key, Use use) {
        char const* const value = file_.GetValue(section.c_str(), key.c_str());
        bench::require(value != nullptr, "SimpleIni: get");
        return use(value);
    }
    void set(std::string const& section, std::string const& key, std::string const& value) {
        file_.SetValue(section.c_str(), key.c_str(), value.c_str());
    }
    void save() {
        bench::require(file_.SaveFile(path_.c_str(), false) == SI_OK, "SimpleIni: save");
    }

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
    template <class Use>
    std::size_t find(std::string const& section, std::string const& key, Use use) {
        return use(node(section, key).data());
    }
    void set(std::string const& section, std::string const& key, std::string const& value) {
        node(section, key).data() = value;
    }
    void save() { boost::property_tree::write_ini(path_, tree_); }

private:
    // By find, since the keys contain the dot that paths through a tree are split at.
    boost::property_tree::ptree& node(std::string const& sectionName, std::string const& keyName) {
        auto const section = tree_.find(sectionName);
        bench::require(section != tree_.not_found(), "Boost.PropertyTree: section");
        auto const key = section->second.find(keyName);
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
    template <class Use>
    std::size_t find(std::string const& section, std::string const& key, Use use) {
        char* const value = g_key_file_get_value(file_, section.c_str(), key.c_str(), nullptr);
        bench::require(value != nullptr, "GKeyFile: get");
        std::size_t const result = use(static_cast<char const*>(value));
        g_free(value);
        return result;
    }
    void set(std::string const& section, std::string const& key, std::string const& value) {
        g_key_file_set_value(file_, section.c_str(), key.c_str(), value.c_str());
    }
    void save() {
        bench::require(g_key_file_save_to_file(file_, path_.c_str(), nullptr) != 0,
                       "GKeyFile: save");
    }

private:
    std::string path_;
    GKeyFile* file_;
};
#endif

std::size_t _size(char const* text) { return std::strlen(text); }
std::size_t _size(std::string const& text) { return text.size(); }

/// A narrow library on its own terms.
template <class Settings>
class Narrow : public Settings {
public:
    using Settings::Settings;

    std::size_t get(Entry const& entry) {
        return this->find(entry.section, entry.key, [](auto const& value) { return _size(value); });
    }
    void set(Entry const& entry, std::wstring const& value) {
        Settings::set(entry.section, entry.key, Koru::make_string(value));
    }
    void abandon() {}
};

/// A narrow library that does our job.
template <class Settings>
class Wide : public Settings {
public:
    using Settings::Settings;

    std::size_t get(Entry const& entry) {
        return this->find(Koru::make_string(entry.wideSection), Koru::make_string(entry.wideKey),
                          [](auto const& value) { return Koru::make_wstring(value).size(); });
    }
    void set(Entry const& entry, std::wstring const& value) {
        Settings::set(Koru::make_string(entry.wideSection), Koru::make_string(entry.wideKey),
                      Koru::make_string(value));
    }
    void abandon() {}
};

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
    std::size_t lookUpOne(Settings& settings) const {
        return settings.get(lookedUp_.front());
    }

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
        static std::wstring const values[] = {L"/var/cache/application/changed",
                                              L"/var/cache/application/another"};
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
    /// Loads, and does whatever was put off until the first look-up.
    Settings& loadReady() {
        task_->lookUpOne(load());
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

enum class Step { load, firstLookUp, lookUp, change, save, cycle };

/// From nothing to a filled table.
template <class Settings>
Work _load(std::shared_ptr<Slot<Settings>> slot) {
    return Work::prepared([slot] { slot->clear(); }, [slot] { return &slot->load(); });
}

/// One look-up, and whatever loading put off until then.
template <class Settings>
Work _firstLookUp(std::shared_ptr<Slot<Settings>> slot) {
    return Work::prepared(
        [slot] {
            slot->clear();
            slot->load();
        },
        [slot] { return slot->task().lookUpOne(slot->settings()); });
}

template <class Settings>
Work _lookUp(std::shared_ptr<Slot<Settings>> slot) {
    return Work::repeated([slot] { return slot->task().lookUp(slot->settings()); })
        .within([slot] { slot->loadReady(); }, [slot] { slot->clear(); });
}

template <class Settings>
Work _change(std::shared_ptr<Slot<Settings>> slot) {
    return Work::prepared(
        [slot] {
            slot->clear();
            slot->loadReady();
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
    case Step::firstLookUp:
        return _firstLookUp(slot);
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

/// Ends the program unless a contender finds what we find.
template <class Settings>
void _check(Task const& task) {
    Slot<Ours> ours(task);
    Slot<Settings> theirs(task);
    bench::require(task.lookUp(ours.load()) == task.lookUp(theirs.load()), Settings::name);
}

/// Adds a library to the rivals, at look-ups also on its own terms.
template <class Settings>
void _add(std::vector<Rival>& rivals, Task const& task, Step step) {
    _check<Wide<Settings>>(task);
    rivals.push_back(bench::peer(Settings::name, _work<Wide<Settings>>(task, step)));
    if (step != Step::lookUp) return;
    rivals.push_back(bench::limit(std::string(Settings::name) + ", narrow",
                                  _work<Narrow<Settings>>(task, step)));
}

std::vector<Rival> _rivals([[maybe_unused]] Task const& task, [[maybe_unused]] Step step) {
    std::vector<Rival> rivals;
#ifdef KORU_BENCH_HAS_SIMPLEINI
    _add<SimpleIni>(rivals, task, step);
#else
    rivals.push_back(bench::missing("SimpleIni"));
#endif
#ifdef KORU_BENCH_HAS_PROPERTY_TREE
    _add<PropertyTree>(rivals, task, step);
#else
    rivals.push_back(bench::missing("Boost.PropertyTree"));
#endif
#ifdef KORU_BENCH_HAS_GLIB
    _add<KeyFile>(rivals, task, step);
#else
    rivals.push_back(bench::missing("GLib GKeyFile"));
#endif
    return rivals;
}

void _readWhole(Task const& task, std::vector<char>& bytes) {
    int const file = ::open(task.path().c_str(), O_RDONLY | O_CLOEXEC);
    ssize_t const n = ::read(file, bytes.data(), bytes.size());
    ::close(file);
    bench::require(n == static_cast<ssize_t>(bytes.size()), "cannot read a settings file");
}

std::size_t _countLines(std::vector<char> const& bytes) {
    std::size_t lines = 0;
    char const* at = bytes.data();
    char const* const end = at + bytes.size();
    for (; at != end; ++lines) {
        void const* const found = std::memchr(at, '\n', static_cast<std::size_t>(end - at));
        if (found == nullptr) break;
        at = static_cast<char const*>(found) + 1;
    }
    return lines;
}

/// Reading the file, into memory that is there already, and finding its lines.
Rival _readLimit(Task const& task, double goal) {
    std::vector<char> bytes(task.bytes());
    return bench::limit("read + memchr", Work::repeated([&task, bytes]() mutable {
                            _readWhole(task, bytes);
                            return _countLines(bytes);
                        }),
                        goal);
}

/// Replacing the file by bytes that are ready.
Rival _writeLimit(Task const& task, double goal) {
    std::vector<char> bytes(task.bytes());
    _readWhole(task, bytes);
    return bench::limit("unlink + one write", Work::repeated([&task, bytes] {
                            ::unlink(task.path().c_str());
                            int const file = ::open(task.path().c_str(),
                                                    O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0644);
                            ssize_t const n = ::write(file, bytes.data(), bytes.size());
                            ::close(file);
                            bench::require(n == static_cast<ssize_t>(bytes.size()), "write");
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
    std::vector<std::pair<Step, std::string>> const steps = {
        {Step::load, prefix + "load"},      {Step::firstLookUp, prefix + "first look-up"},
        {Step::lookUp, prefix + "look up"}, {Step::change, prefix + "change"},
        {Step::save, prefix + "save"},      {Step::cycle, prefix + "whole cycle"}};
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
