// The table behind a settings file: one ordered sequence of entries of section, key and value. A
// flat file's entries all stand in the section with the empty name.
//
// Look-ups are scans from the start of the table, and the first match counts. What makes them quick
// is a column of 16-bit fingerprints beside the entries: only entries whose fingerprint is the one
// looked for are compared.
#ifndef KORU_SETTINGS_SETTINGSTABLE_H
#define KORU_SETTINGS_SETTINGSTABLE_H

#include <cstddef>
#include <cstdint>
#include <deque>
#include <memory>
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

    /// Takes the bytes that the texts of the entries to come are views of, and makes room for about
    /// as many entries as there may be. The table is empty.
    FileBytes const& hold(FileBytes bytes);

    /// The held bytes. All text that is kept as bytes and is not empty lies in them.
    std::string_view held() const { return bytes_.view(); }

    /// A text of the held bytes as make_wstring converts it: it ends at its first NUL, and what is
    /// not well-formed is kept as the characters that it decodes to.
    StoredText keep(std::string_view bytes);

    /// The same for a part of a line that is known to be plain, or not.
    StoredText keep(std::string_view bytes, bool plain) {
        return plain ? StoredText(bytes) : keep(bytes);
    }

    /// Makes a section name known and returns its number for `Entry`.
    std::uint32_t addSection(StoredText const& name);

    void append(std::uint32_t section, StoredText const& key, StoredText const& value) {
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

    /// Whether two entries stand in sections of equal names.
    bool sameSection(Entry const& a, Entry const& b) const;

    /// Calls `visit(entry)` for each entry of the section in order, as long as it returns true.
    template <class Visit>
    void eachOf(std::wstring const& section, Visit visit) const;

    /// Adds an entry at the end.
    void add(std::wstring const& section, std::wstring const& key, std::wstring const& value);

    /// Intended: looks at each entry in turn and removes it if it stands in the section, but never
    /// looks at the one behind a removed entry, which has moved into its place.
    void removeEveryOther(std::wstring const& section);

private:
    /// Tells whether an entry stands in a section, comparing once for each run of entries.
    class SectionMatcher;

    std::size_t find(std::wstring const& section, std::wstring const& key);
    StoredText own(std::wstring const& text);
    void release(StoredText const& text) noexcept;
    void release(Entry const& entry) noexcept;
    std::uint32_t sectionFor(std::wstring const& name);
    void dropUnusedSections();
    std::vector<std::uint32_t> sectionRanks() const;
    void completeFingerprints() noexcept;

    std::vector<Entry> entries_;
    std::vector<StoredText> sections_;

    FileBytes bytes_;
    std::deque<std::wstring> strings_; // what wide texts refer to
    std::vector<std::wstring*> spare_; // those of them that no text refers to any more

    // Each covers the first ones of the entries and section names, as many as a look-up saw and had
    // memory for.
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
            matches_ = section.empty() ? name_.empty() || name_[0] == 0 : areEqual(section, name_);
        }
        return matches_;
    }

private:
    SettingsTable const& table_;
    std::wstring const& name_;
    std::uint32_t last_ = static_cast<std::uint32_t>(-1);
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
