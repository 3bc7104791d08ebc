// Settings files with sections: load, get, set, save and the whole cycle, from one entry to
// 200,000.
//
// What is compared: our names and values are wide at the interface, and names match without regard
// to case. SimpleIni (CSimpleIniCaseA with SetUnicode, its variant for narrow UTF-8), GKeyFile and
// Boost.PropertyTree are narrow and match case exactly, which is less work. To do the same job they
// are given wide names and asked for wide values, by the library's own conversions; look-ups with
// narrow names and values are limits. Our save deletes the file and writes a new one, as its header
// says, where the others empty it (GKeyFile writes a temporary file and renames it).
#include <koru/initializationfile.h>
#include <koru/string.h>

#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <cstddef>
#include <cstdio>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <random>
#include <string>
#include <string_view>
#include <vector>

#include "convert.h"
#include "harness.h"
#include "memorydirectory.h"
#include "settingswork.h"

#ifdef KORU_BENCH_HAS_SIMPLEINI
#define SI_IMPLEMENTATION // as Debian packages it: the bodies, for the word size of this program
#include <SimpleIni.h>
#endif
#ifdef KORU_BENCH_HAS_BOOST
#include <boost/property_tree/ini_parser.hpp>
#include <boost/property_tree/ptree.hpp>
#endif
#ifdef KORU_BENCH_HAS_GLIB
#include <glib.h>
#endif

namespace {

using bench::MemoryDirectory;
using bench::Peer;
using bench::Work;
using Goals = bench::SettingsGoals;
using Step = bench::SettingsStep;
using Value = bench::SettingsValue;

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

using Task = bench::SettingsTask<Entry>;

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

// The libraries. Those with narrow names have a function find that hands the value to a function.

class Ours {
public:
    static constexpr char const* name = "ours";

    explicit Ours(std::string const& path) : file_(Koru::File::Path(path)) {}

    void load() { file_.open(Koru::File::READ | Koru::File::WRITE); }
    std::size_t get(Entry const& entry) {
        return file_.getValue(entry.wideSection, entry.wideKey).size();
    }
    void set(Entry const& entry, Value const& value) {
        file_.setValue(entry.wideSection, entry.wideKey, value.wide);
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
#else
struct SimpleIni : bench::Missing {
    static constexpr char const* name = "SimpleIni";
};
#endif

#ifdef KORU_BENCH_HAS_BOOST
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
#else
struct PropertyTree : bench::Missing {
    static constexpr char const* name = "Boost.PropertyTree";
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
#else
struct KeyFile : bench::Missing {
    static constexpr char const* name = "GLib GKeyFile";
};
#endif

/// A narrow library on its own terms.
template <class Settings>
class Narrow : public Settings {
public:
    using Settings::Settings;

    std::size_t get(Entry const& entry) {
        return this->find(entry.section, entry.key,
                          [](std::string_view value) { return value.size(); });
    }
    void set(Entry const& entry, Value const& value) {
        Settings::set(entry.section, entry.key, value.narrow);
    }
    void abandon() {}
};

/// A narrow library that does our job.
template <class Settings>
class Wide : public Settings {
public:
    using Settings::Settings;

    std::size_t get(Entry const& entry) {
        return this->find(bench::narrow(entry.wideSection), bench::narrow(entry.wideKey),
                          [](std::string_view value) { return bench::widen(value).size(); });
    }
    void set(Entry const& entry, Value const& value) {
        Settings::set(bench::narrow(entry.wideSection), bench::narrow(entry.wideKey),
                      bench::narrow(value.wide));
    }
    void abandon() {}
};

/// Adds a library to the peers, at look-ups also on its own terms.
template <class Settings>
void _add(std::vector<Peer>& peers, Task const& task, Step step) {
    peers.push_back(bench::settingsPeer<Wide<Settings>, Ours>(task, step));
    if constexpr (!bench::isMissing<Settings>) {
        if (step != Step::warmGet) return;
        peers.push_back(bench::limit(std::string(Settings::name) + ", narrow",
                                     bench::settingsWork<Narrow<Settings>>(task, step)));
    }
}

std::vector<Peer> _peers(Task const& task, Step step) {
    std::vector<Peer> peers;
    _add<SimpleIni>(peers, task, step);
    _add<PropertyTree>(peers, task, step);
    _add<KeyFile>(peers, task, step);
    return peers;
}

void _readWhole(std::string const& path, std::vector<char>& bytes) {
    int const file = ::open(path.c_str(), O_RDONLY | O_CLOEXEC);
    ssize_t const n = ::read(file, bytes.data(), bytes.size());
    ::close(file);
    bench::require(n == static_cast<ssize_t>(bytes.size()), "cannot read a settings file");
}

/// Memory for the whole file.
std::vector<char> _bytesOf(std::string const& path) {
    return std::vector<char>(static_cast<std::size_t>(std::filesystem::file_size(path)));
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
Peer _readLimit(Task const& task, double goal) {
    auto const read = [path = task.path(), bytes = _bytesOf(task.path())]() mutable {
        _readWhole(path, bytes);
        return _countLines(bytes);
    };
    return bench::limit("read + memchr", Work::repeated(read), goal);
}

/// Replacing the file by bytes that are ready.
Peer _writeLimit(Task const& task, double goal) {
    std::vector<char> bytes = _bytesOf(task.path());
    _readWhole(task.path(), bytes);
    auto const write = [path = task.path(), bytes] {
        ::unlink(path.c_str());
        int const file = ::open(path.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0644);
        ssize_t const n = ::write(file, bytes.data(), bytes.size());
        ::close(file);
        bench::require(n == static_cast<ssize_t>(bytes.size()), "write");
        return n;
    };
    return bench::limit("unlink + one write", Work::repeated(write), goal);
}

struct Size {
    std::size_t entries;
    char const* name;
    Goals goals;
};

void _step(bench::Report& report, Task const& task, Size const& size, Step step) {
    std::string const row = std::string(size.name) + ", " + bench::nameOf(step);
    if (!report.wants(row)) return;
    std::vector<Peer> peers = _peers(task, step);
    if (step == Step::load) peers.push_back(_readLimit(task, size.goals.loadLimit));
    if (step == Step::save) peers.push_back(_writeLimit(task, size.goals.saveLimit));
    report.compare(row, bench::settingsWork<Ours>(task, step), peers,
                   bench::goalOf(step, size.goals), bench::unitsOf(step, task));
}

void _size(bench::Report& report, MemoryDirectory const& directory, Size const& size) {
    std::vector<Entry> const entries = _entries(size.entries);
    std::string const path = directory / "settings.ini";
    _write(path, entries);
    Task const task(path, entries);
    for (Step const step : bench::settingsSteps) _step(report, task, size, step);
}

void _unsorted(bench::Report& report, MemoryDirectory const& directory) {
    std::vector<Entry> const entries = _shuffled(_entries(20000));
    std::string const path = directory / "unsorted.ini";
    _write(path, entries);
    Task const task(path, entries);
    report.compare("20,000 entries, unsorted, load", bench::settingsWork<Ours>(task, Step::load),
                   _peers(task, Step::load), 0.6);
}

} // namespace

int main(int argc, char** argv) {
    bench::Report report("settings", bench::Options(argc, argv));
    MemoryDirectory const directory;
    static Size const sizes[] = {
        // load, get, set, save, cycle; load and save against their limits
        {1, "1 entry", {0, 1.0, 0.85, 0, 1.0, 2.3, 1.9}},
        {50, "50 entries", {0.55, 1.0, 0.8, 1.0, 0.8, 2.7, 2.5}},
        {1000, "1,000 entries", {0.15, 0.85, 0.65, 0.30, 0.34, 4.0, 4.2}},
        {20000, "20,000 entries", {0.25, 1.6, 1.5, 0.27, 0.28, 5, 6}},
        {200000, "200,000 entries", {0.25, 8, 3.5, 0.27, 0.26, 0, 0}},
    };
    for (Size const& size : sizes) {
        if (report.options().quick() && size.entries > 20000) continue;
        _size(report, directory, size);
    }
    _unsorted(report, directory);
}
