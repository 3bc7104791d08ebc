#include "settings/settingstable.h"

#include <algorithm>
#include <exception>
#include <new>
#include <numeric>
#include <utility>

#include <koru/string.h>

#include "text/convert.h"

namespace Koru {

void SettingsTable::clear() {
    std::vector<Entry>().swap(entries_);
    std::vector<StoredText>().swap(sections_);
    bytes_ = FileBytes();
    strings_.clear();
    std::vector<std::wstring*>().swap(spare_);
    std::vector<Fingerprint>().swap(fingerprints_);
    std::vector<std::uint32_t>().swap(sectionFingerprints_);
}

FileBytes const& SettingsTable::hold(FileBytes bytes) {
    constexpr std::size_t usualLine = 32; // bytes
    bytes_ = std::move(bytes);
    try {
        entries_.reserve(bytes_.size / usualLine);
    } catch (std::exception const&) {
        // Memory is short, or the guess is absurd: adding the entries will show.
    }
    return bytes_;
}

StoredText SettingsTable::view(std::string_view bytes) {
    if (isPlain(bytes)) return StoredText(bytes);
    std::string_view const text = bytes.substr(0, bytes.find('\0'));
    if (isCanonical(text)) return StoredText(text);
    return viewDecoded(text);
}

/// Replaces malformed text, in its place, by the encoding of what it decodes to, which is never
/// longer. Keeping a wide string for each such text took 25 times the size of the file.
StoredText SettingsTable::viewDecoded(std::string_view text) {
    std::string const bytes = make_string(make_wstring(text.data(), text.size()));
    char* const place = bytes_.data.get() + (text.data() - bytes_.data.get());
    std::copy(bytes.begin(), bytes.end(), place);
    return StoredText(std::string_view(place, bytes.size()));
}

std::uint32_t SettingsTable::addSection(StoredText const& name) {
    sections_.push_back(name);
    return static_cast<std::uint32_t>(sections_.size() - 1);
}

void SettingsTable::sort() {
    auto const byName = [this](Entry const& a, Entry const& b) {
        if (a.section == b.section) return compare(a.key, b.key) < 0;
        int const order = compare(sectionOf(a), sectionOf(b));
        return order < 0 || (order == 0 && compare(a.key, b.key) < 0);
    };
    // A file that the library wrote is in order.
    if (std::is_sorted(entries_.begin(), entries_.end(), byName)) return;
    fingerprints_.clear();
    std::vector<std::uint32_t> const ranks = sectionRanks();
    auto const byRank = [&ranks](Entry const& a, Entry const& b) {
        std::uint32_t const rankA = ranks[a.section];
        std::uint32_t const rankB = ranks[b.section];
        return rankA < rankB || (rankA == rankB && compare(a.key, b.key) < 0);
    };
    // Characters beyond 0x7FFFFFFF have no consistent order; this stays in bounds even then.
    std::stable_sort(entries_.begin(), entries_.end(), byRank);
}

/// The rank of each section's name among all names; equal names have the same rank.
std::vector<std::uint32_t> SettingsTable::sectionRanks() const {
    std::vector<std::uint32_t> order(sections_.size());
    std::iota(order.begin(), order.end(), 0U);
    auto const byName = [this](std::uint32_t a, std::uint32_t b) {
        return compare(sections_[a], sections_[b]) < 0;
    };
    // By a heap, which stays in bounds too. Another merge sort would be 3,000 bytes.
    std::make_heap(order.begin(), order.end(), byName);
    std::sort_heap(order.begin(), order.end(), byName);
    std::vector<std::uint32_t> ranks(sections_.size());
    std::uint32_t rank = 0;
    for (std::size_t i = 1; i < order.size(); ++i) {
        if (compare(sections_[order[i - 1]], sections_[order[i]]) != 0) ++rank;
        ranks[order[i]] = rank;
    }
    return ranks;
}

std::size_t SettingsTable::find(std::wstring const& section, std::wstring const& key) {
    SectionMatcher matches(*this, section);
    auto const isAt = [this, &matches, &key](std::size_t i) {
        return matches(entries_[i]) && areEqual(entries_[i].key, key);
    };
    constexpr std::size_t few = 4; // Comparing these is faster than making the column.
    if (entries_.size() > few && entries_.size() != fingerprints_.size()) completeFingerprints();
    if (!fingerprints_.empty()) {
        // An empty name, as a flat file's section has it, mixes to 0.
        std::uint32_t const before = section.empty() ? 0 : mixFingerprint(0, section);
        Fingerprint const wanted = toFingerprint(mixFingerprint(before, key));
        std::size_t i = findFingerprint(fingerprints_, wanted, 0);
        while (i != NOT_FOUND && !isAt(i)) i = findFingerprint(fingerprints_, wanted, i + 1);
        if (i != NOT_FOUND) return i;
    }
    // Entries beyond the column are compared one by one.
    for (std::size_t i = fingerprints_.size(); i != entries_.size(); ++i) {
        if (isAt(i)) return i;
    }
    return NOT_FOUND;
}

void SettingsTable::completeFingerprints() noexcept {
    std::size_t const known = fingerprints_.size();
    try {
        for (std::size_t i = sectionFingerprints_.size(); i != sections_.size(); ++i) {
            sectionFingerprints_.push_back(mixFingerprint(0, sections_[i]));
        }
        fingerprints_.resize(entries_.size());
    } catch (std::bad_alloc const&) { // Look-ups do without the column.
        return;
    }
    for (std::size_t i = known; i != entries_.size(); ++i) {
        Entry const& entry = entries_[i];
        fingerprints_[i] =
            toFingerprint(mixFingerprint(sectionFingerprints_[entry.section], entry.key));
    }
}

bool SettingsTable::sameSection(Entry const& a, Entry const& b) const {
    return a.section == b.section || compare(sectionOf(a), sectionOf(b)) == 0;
}

void SettingsTable::add(std::wstring const& section, std::wstring const& key,
                        std::wstring const& value) {
    // Memory comes first, so that a failure leaves the entries as they are.
    if (entries_.size() == entries_.capacity())
        entries_.reserve(std::min(2 * entries_.size() + 8, entries_.max_size()));
    std::uint32_t const number = addSection(section);
    StoredText const heldKey = hold(key);
    add(number, heldKey, hold(value));
}

void SettingsTable::create(std::wstring const& section, std::wstring const& key) {
    if (find(section, key) == NOT_FOUND) add(section, key, std::wstring());
}

std::wstring SettingsTable::getValue(std::wstring const& section, std::wstring const& key) {
    std::size_t const index = find(section, key);
    return index == NOT_FOUND ? std::wstring() : entries_[index].value.str();
}

void SettingsTable::setValue(std::wstring const& section, std::wstring const& key,
                             std::wstring const& value) {
    std::size_t const index = find(section, key);
    if (index == NOT_FOUND) {
        add(section, key, value);
        return;
    }
    StoredText& stored = entries_[index].value;
    if (std::wstring* const wide = stored.wide()) {
        wide->resize(value.size());
        std::copy(value.begin(), value.end(), wide->begin()); // without wmemcpy, see wideString
    } else {
        stored = hold(value);
    }
}

void SettingsTable::remove(std::wstring const& section, std::wstring const& key) {
    std::size_t const index = find(section, key);
    if (index == NOT_FOUND) return;
    auto const offset = static_cast<std::ptrdiff_t>(index);
    release(entries_[index]);
    entries_.erase(entries_.begin() + offset);
    if (index < fingerprints_.size()) fingerprints_.erase(fingerprints_.begin() + offset);
}

void SettingsTable::removeEveryOther(std::wstring const& section) {
    SectionMatcher matches(*this, section);
    // The first `kept` entries are those before `i` that stay; from `i` on, none has moved yet.
    std::size_t kept = 0;
    for (std::size_t i = 0; i < entries_.size(); ++i) {
        if (matches(entries_[i])) {
            release(entries_[i]);
            if (++i == entries_.size()) break;
        }
        entries_[kept++] = entries_[i];
    }
    if (kept != entries_.size()) fingerprints_.clear();
    entries_.erase(entries_.begin() + static_cast<std::ptrdiff_t>(kept), entries_.end());
}

StoredText SettingsTable::hold(std::wstring const& text) {
    std::wstring copy = wideString(text.data(), text.size());
    if (spare_.empty()) return StoredText(&strings_.emplace_back(std::move(copy)));
    *spare_.back() = std::move(copy);
    StoredText const held(spare_.back());
    spare_.pop_back();
    return held;
}

void SettingsTable::release(StoredText const& text) noexcept {
    std::wstring* const wide = text.wide();
    if (wide == nullptr) return;
    std::wstring().swap(*wide);
    try {
        spare_.push_back(wide);
    } catch (std::bad_alloc const&) { // Its place stays unused until the table is cleared.
    }
}

void SettingsTable::release(Entry const& entry) noexcept {
    release(entry.key);
    release(entry.value);
}

/// Returns the number of the last entry's section if it has the same name, else adds a section.
std::uint32_t SettingsTable::addSection(std::wstring const& name) {
    if (!entries_.empty()) {
        std::uint32_t const last = entries_.back().section;
        if (sections_[last].str() == name) return last;
    }
    if (sections_.size() > 2 * entries_.size() + 64) dropUnusedSections();
    return addSection(hold(name));
}

/// Keeps the names of sections that come and go from piling up. Takes all its memory before it
/// changes anything.
void SettingsTable::dropUnusedSections() {
    std::vector<std::uint32_t> numbers(sections_.size(), NO_SECTION); // by the old number
    std::vector<StoredText> used;
    used.reserve(entries_.size());
    // Entries before this one have new numbers, the others old ones. For each section seen so far,
    // `numbers` has the new number, and `used` has the name at that number.
    for (Entry& entry : entries_) {
        std::uint32_t& number = numbers[entry.section];
        if (number == NO_SECTION) {
            number = static_cast<std::uint32_t>(used.size());
            used.push_back(sections_[entry.section]);
        }
        entry.section = number;
    }
    for (std::size_t i = 0; i < sections_.size(); ++i) {
        if (numbers[i] == NO_SECTION) release(sections_[i]);
    }
    sections_ = std::move(used);
    sectionFingerprints_.clear();
}

} // namespace Koru
