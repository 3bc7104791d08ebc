#include <koru/propertyfile.h>

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
unsigned long const PropertyFile::MAX_LINE_LENGTH;

namespace {

using Entry = SettingsTable::Entry;

// All entries of the table are in the section with the empty name.
std::wstring const& _section() { return _null_wstring; }

/// Adds to a list what a line says. A trimmed line is
///
///     line    = comment | entry | anything else, which is left out
///     comment = ( "#" | ";" ) text
///     entry   = key "=" value
///     key     = text without "="
///     value   = text
///
/// where the first alternative that fits counts. An entry whose key is empty is left out.
/// (parseLines has dealt with the comments.)
void _parse(std::string_view line, bool plain, SettingsTable& list) {
    std::size_t const equals = line.find('=');
    if (equals == std::string_view::npos) return;
    StoredText const key = list.view(line.substr(0, equals), plain);
    if (key.empty()) return;
    // Neither is trimmed: blanks around "=" belong to key and value.
    list.add(0, key, list.view(line.substr(equals + 1), plain));
}

void _read(FileReader& reader, SettingsTable& list) {
    list.addSection(StoredText()); // number 0
    parseLines(list.hold(reader.readAll()),
               [&list](std::string_view line, bool plain) { _parse(line, plain, list); });
}

} // namespace

PropertyFile::PropertyFile() : list_(new SettingsTable) {}

PropertyFile::PropertyFile(File::Path const& path)
    : File(static_cast<std::wstring>(path)), list_(new SettingsTable) {}

PropertyFile::~PropertyFile() {
    quietly([this] { PropertyFile::close(); });
}

void PropertyFile::open(unsigned long mode) {
    openAndLoad(
        *this, mode, [this] { list_->clear(); },
        [this](FileReader& reader) { _read(reader, *list_); });
}

void PropertyFile::close() {
    writeBackAndClose(
        *this, [this] { return render(*list_, Headers::NONE); }, [this] { list_->clear(); });
}

std::vector<std::wstring> PropertyFile::enumerateKeys() {
    FileGuard const guard(*this);
    std::vector<std::wstring> keys;
    keys.reserve(list_->entries().size());
    for (Entry const& entry : list_->entries()) keys.push_back(entry.key.str());
    return keys;
}

void PropertyFile::createKey(std::wstring const& key) {
    FileGuard const guard(*this);
    list_->create(_section(), key);
}

void PropertyFile::removeKey(std::wstring const& key) {
    FileGuard const guard(*this);
    list_->remove(_section(), key);
}

std::wstring PropertyFile::getValue(std::wstring const& key) {
    FileGuard const guard(*this);
    return list_->getValue(_section(), key);
}

void PropertyFile::setValue(std::wstring const& key, std::wstring const& value) {
    FileGuard const guard(*this);
    list_->setValue(_section(), key, value);
}

} // namespace Koru
