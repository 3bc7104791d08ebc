// Settings files with sections.
#include <koru/initializationfile.h>
#include <koru/string.h>

#include "storable.h"
#include "table.h"
#include "text.h"

namespace tool {

namespace {

class SettingsTable : public Table {
public:
    explicit SettingsTable(Koru::File::Path const& path) : file_(path) {}

    Koru::File& file() override { return file_; }

    // Sections that were added to are listed again, with all their keys.
    std::vector<Entry> entries() override {
        std::vector<Entry> result;
        for (std::wstring const& section : file_.enumerateSections()) {
            for (std::wstring const& key : file_.enumerateKeys(section))
                result.push_back(
                    {narrow(section), narrow(key), narrow(file_.getValue(section, key))});
        }
        return firstOfEach(result);
    }

    void set(Entry const& entry) override {
        file_.setValue(wide(entry.section), wide(entry.key), wide(entry.value));
    }

    void remove(Entry const& name) override {
        std::wstring const section = wide(name.section);
        if (name.key.empty()) return removeSection(section);
        std::wstring const key = wide(name.key);
        for (std::wstring const& other : file_.enumerateKeys(section)) {
            if (Koru::compare(other, key) == 0) file_.removeKey(section, key);
        }
    }

private:
    // The library passes over every other entry.
    void removeSection(std::wstring const& section) {
        while (!file_.enumerateKeys(section).empty()) file_.removeSection(section);
    }

    Koru::InitializationFile file_;
};

std::unique_ptr<Table> _make(Koru::File::Path const& path) {
    return std::make_unique<SettingsTable>(path);
}

void _check(Entry const& entry) {
    checkSection(entry.section);
    checkKey(entry.key, "#;[");
    checkValue(entry.value);
}

} // namespace

Family const SETTINGS = {"settings", "setting", "value", true, _make, _check, &SETTINGS};

} // namespace tool
