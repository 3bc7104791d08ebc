#include <koru/initializationfile.h>

#include <string_view>

#include <koru/string.h>

#include "concurrency/cancellation.h"
#include "file/fileguard.h"
#include "file/filereader.h"
#include "file/rewrite.h"
#include "settings/lines.h"
#include "settings/render.h"
#include "settings/settingstable.h"

namespace Koru {

// For callers who take its address; the value is in the header.
unsigned long const InitializationFile::MAX_LINE_LENGTH;

namespace {

using Entry = SettingsTable::Entry;

/// The name in a header: the line without the "]" at its end, then without the "[" at its start
/// unless there is nothing else.
std::string_view _sectionName(std::string_view line) {
    std::string_view const opened = line.substr(0, line.find_last_not_of(']') + 1);
    std::size_t const name = opened.find_first_not_of('[');
    return name == std::string_view::npos ? opened : opened.substr(name);
}

/// Adds to a table what the lines of a file say. A trimmed line is
///
///     line    = comment | header | entry | anything else, which is left out
///     comment = ( "#" | ";" ) text
///     header  = "[" { "[" } name { "]" }
///     entry   = key "=" value
///     key     = text without "="
///     value   = text
///     name    = text that neither begins with "[" nor ends with "]"
///
/// where the first alternative that fits counts. A header of brackets alone has its "[" for a name.
/// An entry belongs to the section of the last header; before the first header, and where its key
/// is empty, it is left out. (parseLines has dealt with the comments.)
class Parser {
public:
    explicit Parser(SettingsTable& table) : table_(table) {}

    void parse(std::string_view line, bool plain) {
        if (line.front() == '[') {
            section_ = table_.view(_sectionName(line), plain);
            sectionIsAdded_ = false;
            return;
        }
        std::size_t const equals = line.find('=');
        if (equals == std::string_view::npos) return;
        StoredText const key = table_.view(line.substr(0, equals), plain);
        if (key.empty() || section_.empty()) return;
        // Neither is trimmed: blanks around "=" belong to key and value.
        StoredText const value = table_.view(line.substr(equals + 1), plain);
        table_.add(sectionNumber(), key, value);
    }

private:
    /// Adds the name of a section with its first entry, since without entries there is no section.
    std::uint32_t sectionNumber() {
        if (!sectionIsAdded_) number_ = table_.addSection(section_);
        sectionIsAdded_ = true;
        return number_;
    }

    SettingsTable& table_;
    StoredText section_;
    bool sectionIsAdded_ = false;
    std::uint32_t number_ = 0;
};

void _read(FileReader& reader, SettingsTable& table) {
    Parser parser(table);
    parseLines(table.hold(reader.readAll()),
               [&parser](std::string_view line, bool plain) { parser.parse(line, plain); });
}

} // namespace

InitializationFile::InitializationFile() : table_(new SettingsTable) {}

InitializationFile::InitializationFile(File::Path const& path)
    : File(static_cast<std::wstring>(path)), table_(new SettingsTable) {}

InitializationFile::~InitializationFile() {
    quietly([this] { InitializationFile::close(); });
}

void InitializationFile::open(unsigned long mode) {
    openAndLoad(
        *this, mode, [this] { table_->clear(); },
        [this](FileReader& reader) {
            _read(reader, *table_);
            table_->sort();
        });
}

void InitializationFile::close() {
    writeBackAndClose(
        *this,
        [this] {
            table_->sort();
            return render(*table_, Headers::OF_SECTIONS);
        },
        [this] { table_->clear(); });
}

std::vector<std::wstring> InitializationFile::enumerateSections() {
    FileGuard const guard(*this);
    std::vector<std::wstring> names;
    Entry const* previous = nullptr;
    for (Entry const& entry : table_->entries()) {
        if (previous == nullptr || !table_->sameSection(*previous, entry)) {
            names.push_back(table_->sectionOf(entry).str());
        }
        previous = &entry;
    }
    return names;
}

void InitializationFile::createSection(std::wstring const& section) {
    FileGuard const guard(*this);
    bool exists = false;
    table_->eachOf(section, [&exists](Entry const&) {
        exists = true;
        return false;
    });
    if (!exists) table_->add(section, _null_wstring, _null_wstring);
}

void InitializationFile::removeSection(std::wstring const& section) {
    FileGuard const guard(*this);
    table_->removeEveryOther(section);
}

std::vector<std::wstring> InitializationFile::enumerateKeys(std::wstring const& section) {
    FileGuard const guard(*this);
    std::vector<std::wstring> keys;
    table_->eachOf(section, [&keys](Entry const& entry) {
        keys.push_back(entry.key.str());
        return true;
    });
    return keys;
}

void InitializationFile::createKey(std::wstring const& section, std::wstring const& key) {
    FileGuard const guard(*this);
    table_->create(section, key);
}

void InitializationFile::removeKey(std::wstring const& section, std::wstring const& key) {
    FileGuard const guard(*this);
    table_->remove(section, key);
}

std::wstring InitializationFile::getValue(std::wstring const& section, std::wstring const& key) {
    FileGuard const guard(*this);
    return table_->getValue(section, key);
}

void InitializationFile::setValue(std::wstring const& section, std::wstring const& key,
                                  std::wstring const& value) {
    FileGuard const guard(*this);
    table_->setValue(section, key, value);
}

} // namespace Koru
