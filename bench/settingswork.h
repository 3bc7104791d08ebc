// What is done with a settings file, and timed, whether it has sections or not.
//
// A library takes part as a class that is made for a path and used once, with the functions load,
// get (which gives the size of a value), set, save and abandon (called before an object is
// destroyed that was not saved), and a name.
#ifndef KORU_BENCH_SETTINGSWORK_H
#define KORU_BENCH_SETTINGSWORK_H

#include <cstddef>
#include <filesystem>
#include <memory>
#include <random>
#include <string>
#include <utility>
#include <vector>

#include "harness.h"

namespace bench {

struct SettingsValue {
    std::string narrow;
    std::wstring wide;
};

/// A file and what is done with it: look-ups and changes, spread over all entries.
/// @tparam Name  what a value is found by
template <class Name>
class SettingsTask {
public:
    /// @param path   a file with these names
    /// @param names  one for each entry
    SettingsTask(std::string path, std::vector<Name> const& names)
        : path_(std::move(path)), gets_(names.size() < 100000 ? 1000 : 200) {
        std::mt19937 random(2);
        for (int i = 0; i < 1000; ++i) lookedUp_.push_back(names[random() % names.size()]);
        for (int i = 0; i < 100; ++i) changed_.push_back(names[random() % names.size()]);
    }

    std::string const& path() const { return path_; }
    /// The look-ups that a row about them makes.
    std::size_t gets() const { return gets_; }
    std::size_t sets() const { return changed_.size(); }

    template <class Settings>
    std::size_t get(Settings& settings, std::size_t count) const {
        std::size_t total = 0;
        for (std::size_t i = 0; i < count; ++i) total += settings.get(lookedUp_[i]);
        return total;
    }

    /// Changes values to text of the same length, so that the file keeps its size, and to another
    /// text than the last time.
    template <class Settings>
    void set(Settings& settings) const {
        static SettingsValue const values[] = {
            {"/var/cache/application/changed", L"/var/cache/application/changed"},
            {"/var/cache/application/another", L"/var/cache/application/another"}};
        turn_ = 1 - turn_;
        for (Name const& name : changed_) settings.set(name, values[turn_]);
    }

    /// What a program does in its life: everything, the destruction included.
    template <class Settings>
    std::size_t cycle(std::string const& path) const {
        Settings settings(path);
        settings.load();
        std::size_t const size = get(settings, lookedUp_.size());
        set(settings);
        settings.save();
        settings.abandon();
        return size;
    }

private:
    std::string path_;
    std::size_t gets_;
    std::vector<Name> lookedUp_;
    std::vector<Name> changed_;
    mutable std::size_t turn_ = 0;
};

/// A fresh object for each run, on a copy of the file that is this library's own, since each writes
/// it a little differently. Destroying the last object is part of the preparation.
template <class Settings, class Name>
class SettingsSlot {
public:
    explicit SettingsSlot(SettingsTask<Name> const& task)
        : task_(&task), path_(task.path() + "." + Settings::name) {
        std::filesystem::copy_file(task.path(), path_,
                                   std::filesystem::copy_options::overwrite_existing);
    }
    SettingsSlot(SettingsSlot const&) = delete;
    SettingsSlot& operator=(SettingsSlot const&) = delete;
    ~SettingsSlot() { clear(); }

    void clear() {
        if (settings_) settings_->abandon();
        settings_.reset();
    }
    void make() {
        clear();
        settings_ = std::make_unique<Settings>(path_);
    }
    int load() {
        settings_->load();
        return 0;
    }
    void makeAndLoad() {
        make();
        load();
    }
    /// Loads, and does whatever was put off until the first look-up.
    void makeReady() {
        makeAndLoad();
        get(1);
    }
    std::size_t get(std::size_t count) { return task_->get(*settings_, count); }
    int set() {
        task_->set(*settings_);
        return 0;
    }
    int save() {
        settings_->save();
        return 0;
    }
    std::size_t cycle() { return task_->template cycle<Settings>(path_); }

    SettingsTask<Name> const& task() const { return *task_; }

private:
    SettingsTask<Name> const* task_;
    std::string path_;
    std::unique_ptr<Settings> settings_;
};

enum class SettingsStep { load, get, firstGet, warmGet, set, save, cycle };

constexpr SettingsStep settingsSteps[] = {
    SettingsStep::load, SettingsStep::get,  SettingsStep::firstGet, SettingsStep::warmGet,
    SettingsStep::set,  SettingsStep::save, SettingsStep::cycle};

/// What a row about the step is called.
inline char const* nameOf(SettingsStep step) {
    switch (step) {
    case SettingsStep::load:
        return "load";
    case SettingsStep::get:
        return "gets after a load";
    case SettingsStep::firstGet:
        return "first get after a load";
    case SettingsStep::warmGet:
        return "warm gets";
    case SettingsStep::set:
        return "sets";
    case SettingsStep::save:
        return "save";
    case SettingsStep::cycle:
        break;
    }
    return "cycle";
}

/// How many pieces one run of the step's work makes.
template <class Name>
double unitsOf(SettingsStep step, SettingsTask<Name> const& task) {
    switch (step) {
    case SettingsStep::get:
    case SettingsStep::warmGet:
        return static_cast<double>(task.gets());
    case SettingsStep::set:
        return static_cast<double>(task.sets());
    default:
        return 1;
    }
}

template <class Slot>
Work getWork(std::shared_ptr<Slot> const& slot, SettingsStep step) {
    auto const load = [slot] { slot->makeAndLoad(); };
    auto const get = [slot] { return slot->get(slot->task().gets()); };
    if (step == SettingsStep::get) return Work::prepared(load, get);
    if (step == SettingsStep::firstGet) {
        return Work::prepared(load, [slot] { return slot->get(1); });
    }
    return Work::repeated(get).within([slot] { slot->makeReady(); }, [slot] { slot->clear(); });
}

/// From a changed table to a closed file.
template <class Slot>
Work saveWork(std::shared_ptr<Slot> const& slot) {
    auto const loadAndSet = [slot] {
        slot->makeAndLoad();
        slot->set();
    };
    return Work::prepared(loadAndSet, [slot] { return slot->save(); });
}

template <class Settings, class Name>
Work settingsWork(SettingsTask<Name> const& task, SettingsStep step) {
    auto const slot = std::make_shared<SettingsSlot<Settings, Name>>(task);
    switch (step) {
    case SettingsStep::load: // from a file to a filled table
        return Work::prepared([slot] { slot->make(); }, [slot] { return slot->load(); });
    case SettingsStep::get:
    case SettingsStep::firstGet:
    case SettingsStep::warmGet:
        return getWork(slot, step);
    case SettingsStep::set:
        return Work::prepared([slot] { slot->makeReady(); }, [slot] { return slot->set(); });
    case SettingsStep::save:
        return saveWork(slot);
    case SettingsStep::cycle:
        break;
    }
    return Work::repeated([slot] { return slot->cycle(); });
}

/// The work of a library that finds what ours does; the program ends if it does not.
template <class Settings, class Ours, class Name>
Peer settingsPeer(SettingsTask<Name> const& task, SettingsStep step) {
    if constexpr (isMissing<Settings>) {
        return missing(Settings::name);
    } else {
        SettingsSlot<Ours, Name> ours(task);
        SettingsSlot<Settings, Name> theirs(task);
        ours.makeAndLoad();
        theirs.makeAndLoad();
        require(ours.get(task.gets()) == theirs.get(task.gets()), Settings::name);
        return peer(Settings::name, settingsWork<Settings>(task, step));
    }
}

/// Ratios to reach against the fastest peer and, at load and save, the limit; 0 for none.
struct SettingsGoals {
    double load, get, set, save, cycle, loadLimit, saveLimit;
};

inline double goalOf(SettingsStep step, SettingsGoals const& goals) {
    switch (step) {
    case SettingsStep::load:
        return goals.load;
    case SettingsStep::get:
        return goals.get;
    case SettingsStep::set:
        return goals.set;
    case SettingsStep::save:
        return goals.save;
    case SettingsStep::cycle:
        return goals.cycle;
    default:
        return 0;
    }
}

} // namespace bench

#endif
