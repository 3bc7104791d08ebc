// What the three kinds of files have in common: each is a table of entries.
#ifndef KORU_TOOLS_TABLE_H
#define KORU_TOOLS_TABLE_H

#include <koru/file.h>

#include <memory>
#include <string>
#include <tuple>
#include <vector>

namespace tool {

/// Text in UTF-8. Where a file has no sections, `section` is empty; the value of a record is its
/// data in hexadecimal digits.
struct Entry {
    std::string section;
    std::string key;
    std::string value;
};

inline bool operator<(Entry const& a, Entry const& b) {
    return std::tie(a.section, a.key, a.value) < std::tie(b.section, b.key, b.value);
}
inline bool operator==(Entry const& a, Entry const& b) {
    return std::tie(a.section, a.key, a.value) == std::tie(b.section, b.key, b.value);
}

/// Whether the library takes the names of the two for the same.
bool haveSameName(Entry const& a, Entry const& b);

/// A file of the library, as a table.
class Table {
public:
    Table() = default;
    Table(Table const&) = delete;
    Table& operator=(Table const&) = delete;
    virtual ~Table() = default;

    /// The file, to open and close.
    virtual Koru::File& file() = 0;
    /// Its entries: of several settings with one name, only the one that counts; of records, all.
    virtual std::vector<Entry> entries() = 0;
    /// Sets the value, also of a name that is already there.
    virtual void set(Entry const& entry) = 0;
    /// Removes all that has the entry's name, duplicates too; without a key, the whole section.
    virtual void remove(Entry const& name) = 0;
};

/// A kind of file.
struct Family {
    char const* name;      ///< its subcommand
    char const* item;      ///< what one of it is called
    char const* valueName; ///< what a value is called in JSON
    bool hasSections;
    std::unique_ptr<Table> (*make)(Koru::File::Path const&); ///< a closed file
    /// Throws a `Failure` with the reason if the file would not give this entry back.
    void (*check)(Entry const&);
    Family const* text; ///< the kind whose files are the text form: itself, if it is text
};

extern Family const SETTINGS;
extern Family const PROPERTIES;
extern Family const RECORDS;

/// The first of the entries with each name.
std::vector<Entry> firstOfEach(std::vector<Entry> const& entries);

} // namespace tool

#endif
