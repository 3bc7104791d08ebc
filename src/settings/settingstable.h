// The table of a settings file: one ordered sequence of entries, each a section, a key and a value.
// All entries of a flat file are in the section with the empty name.
//
// Where the text is:
//   hold     the table takes memory: the bytes of a file, or a copy of a string
//   view     an entry refers to text in that memory, see StoredText
//   release  no entry refers to a held string any more; the next text may have its place
//   add      an entry or the name of a section goes to the end
//   clear    the table gives up entries, names and memory
//
// A look-up scans the table from its start, and the first match counts. What makes that quick is a
// column of 16-bit fingerprints beside the entries: the keys are compared only where the
// fingerprint is the one looked for.
#ifndef KORU_SETTINGS_SETTINGSTABLE_H
#define KORU_SETTINGS_SETTINGSTABLE_H

#include <cstddef>
#include <cstdint>
#include <deque>
#include <string>
#include <string_view>
#include <vector>

#include "file/filereader.h"
#include "settings/storedtext.h"
#include "text/fingerprint.h"

namespace Koru {

class SettingsTable {
public:
    struct Entry {
        Entry(std::uint32_t s, StoredText const& k, StoredText const& v)
            : section(s), key(k), value(v) {}

        std::uint32_t section; ///< which of the section names
        StoredText key;
        StoredText value;
    };

    std::vector<Entry> const& entries() const { return entries_; }
    StoredText const& sectionOf(Entry const& entry) const { return sections_[entry.section]; }

    /// Removes all entries and gives their memory back.
    void clear();

    /// @name Loading
    /// @{

    /// Holds the bytes of a file, and makes room for about as many entries as they may have. The
    /// table is empty.
    FileBytes const& hold(FileBytes bytes);

    /// The held bytes. Every view that is neither wide nor empty is of a part of them.
    std::string_view heldBytes() const { return bytes_.view(); }

    /// A view of a part of the held bytes, as make_wstring converts it: the text ends at its first
    /// NUL. Where it is not well-formed, what it decodes to takes its place.
    StoredText view(std::string_view bytes);

    /// The same where it is known whether the line of that part is plain.
    StoredText view(std::string_view bytes, bool plain) {
        return plain ? StoredText(bytes) : view(bytes);
    }

    /// Adds the name of a section and returns its number for `Entry`.
    std::uint32_t addSection(StoredText const& name);

    /// Adds an entry of views.
    void add(std::uint32_t section, StoredText const& key, StoredText const& value) {
        entries_.emplace_back(section, key, value);
    }

    /// @}

    /// Sorts by section, then by key; equal entries keep their order.
    void sort();

    /// @name Operations on the first entry with this section and key
    /// @{

    /// Adds an entry with an empty value at the end, unless there is one.
    void create(std::wstring const& section, std::wstring const& key);

    /// Its value; empty when there is none.
    std::wstring getValue(std::wstring const& section, std::wstring const& key);

    /// Replaces its value, or adds an entry at the end.
    void setValue(std::wstring const& section, std::wstring const& key, std::wstring const& value);

    void remove(std::wstring const& section, std::wstring const& key);

    /// @}

    /// Whether two entries are in sections of equal names.
    bool sameSection(Entry const& a, Entry const& b) const;

    /// Calls `visit(entry)` for each entry of the section in order, as long as it returns true.
    template <class Visit>
    void eachOf(std::wstring const& section, Visit visit) const;

    /// Adds an entry, and holds its text.
    void add(std::wstring const& section, std::wstring const& key, std::wstring const& value);

    /// Intended: looks at each entry in turn and removes it if it is in the section, but never
    /// looks at the one after a removed entry, which has moved into its place.
    void removeEveryOther(std::wstring const& section);

private:
    /// The number of no section.
    static constexpr std::uint32_t NO_SECTION = 0xFFFFFFFF;

    /// Tells whether an entry is in a section, comparing once for each run of entries.
    class SectionMatcher;

    std::size_t find(std::wstring const& section, std::wstring const& key);
    StoredText viewDecoded(std::string_view text);
    StoredText hold(std::wstring const& text);
    void release(StoredText const& text) noexcept;
    void release(Entry const& entry) noexcept;
    std::uint32_t addSection(std::wstring const& name);
    void dropUnusedSections();
    std::vector<std::uint32_t> sectionRanks() const;
    void completeFingerprints() noexcept;

    std::vector<Entry> entries_;
    std::vector<StoredText> sections_;

    FileBytes bytes_;
    std::deque<std::wstring> strings_; // the held strings
    std::vector<std::wstring*> spare_; // those of them that were released

    // The fingerprints of the first entries and section names, of as many as there were when a
    // look-up last needed them and had memory for them.
    std::vector<Fingerprint> fingerprints_;
    std::vector<std::uint32_t> sectionFingerprints_;
};

class SettingsTable::SectionMatcher {
public:
    SectionMatcher(SettingsTable const& table, std::wstring const& name)
        : table_(table), name_(name) {}

    bool operator()(Entry const& entry) {
        if (entry.section != last_) {
            last_ = entry.section;
            StoredText const& section = table_.sectionOf(entry);
            matches_ = section.empty() ? name_[0] == 0 : areEqual(section, name_);
        }
        return matches_;
    }

private:
    SettingsTable const& table_;
    std::wstring const& name_;
    std::uint32_t last_ = NO_SECTION;
    bool matches_ = false;
};

template <class Visit>
void SettingsTable::eachOf(std::wstring const& section, Visit visit) const {
    SectionMatcher matches(*this, section);
    for (Entry const& entry : entries_) {
        if (matches(entry) && !visit(entry)) return;
    }
}

} // namespace Koru

#endif
