// Property files: settings without sections.
#include <koru/propertyfile.h>
#include <koru/string.h>

#include "storable.h"
#include "table.h"
#include "text.h"

namespace tool {

namespace {

class PropertyTable : public Table {
public:
    explicit PropertyTable(Koru::File::Path const& path) : file_(path) {}

    Koru::File& file() override { return file_; }

    std::vector<Entry> entries() override {
        std::vector<Entry> result;
        for (std::wstring const& key : file_.enumerateKeys())
            result.push_back({"", narrow(key), narrow(file_.getValue(key))});
        return firstOfEach(result);
    }

    void set(Entry const& entry) override { file_.setValue(wide(entry.key), wide(entry.value)); }

    void remove(Entry const& name) override {
        std::wstring const key = wide(name.key);
        for (std::wstring const& other : file_.enumerateKeys()) {
            if (Koru::compare(other, key) == 0) file_.removeKey(key);
        }
    }

private:
    Koru::PropertyFile file_;
};

std::unique_ptr<Table> _make(Koru::File::Path const& path) {
    return std::make_unique<PropertyTable>(path);
}

void _check(Entry const& entry) {
    checkKey(entry.key, "#;");
    checkValue(entry.value);
}

} // namespace

Family const PROPERTIES = {"properties", "property", "value", false, _make, _check, &PROPERTIES};

} // namespace tool
