#include "records/recordset.h"

#include <algorithm>
#include <functional>
#include <new>
#include <type_traits>

#include <koru/string.h>

#include "text/fingerprint.h"

namespace Koru {

namespace {

constexpr std::size_t FIRST_CAPACITY = 64; // records

// The fingerprint of a record that was handed out: its key may change, so it is always compared.
// Records whose keys happen to have this fingerprint are compared as well, which does no harm.
constexpr Fingerprint HANDED_OUT = 0xFFFF;

Fingerprint _fingerprint(std::wstring const& key) {
    return toFingerprint(mixFingerprint(0, key.data(), key.size()));
}

} // namespace

/// Memory for a fixed number of records. Its lists have that capacity from the start, so memory is
/// allocated only for a new block and for the content of a record.
///
/// At any time `records_` is in the order of addresses, and `numbers_` has the fingerprint of each
/// at the same index. Each slot before `used_` has a record or is in `spare_`; those from `used_`
/// on never had one.
class RecordSet::Block {
public:
    explicit Block(std::size_t capacity) : capacity_(capacity) {
        slots_.reset(new Slot[capacity]); // GCOVR_EXCL_BR_LINE: not too many for an array
        records_.reserve(capacity);
        numbers_.reserve(capacity);
        spare_.reserve(capacity);
    }
    Block(Block const&) = delete;
    Block& operator=(Block const&) = delete;
    ~Block() {
        for (Record* const record : records_) record->~Record();
    }

    std::size_t size() const { return records_.size(); }
    std::size_t capacity() const { return capacity_; }
    bool hasRoom() const { return records_.size() < capacity_; }
    bool isBefore(Block const& other) const {
        return std::less<>()(slots_.get(), other.slots_.get());
    }

    Record& operator[](std::size_t index) const { return *records_[index]; }

    void markHandedOut(std::size_t index) {
        numbers_[index] = HANDED_OUT;
        handedOut_ = true;
    }

    std::size_t find(std::wstring const& key, Fingerprint number) const {
        auto const next = [this, number](std::size_t from) {
            return handedOut_ ? findFingerprint(numbers_, number, HANDED_OUT, from)
                              : findFingerprint(numbers_, number, from);
        };
        std::size_t i = next(0);
        while (i != NOT_FOUND && compare(records_[i]->getKey(), key) != 0) i = next(i + 1);
        return i;
    }

    /// Adds a record to a block that has room. Only making the record can throw, and that comes
    /// first: the slot is still free then, and the lists are as they were.
    template <class... Parts>
    void add(Parts const&... parts) {
        void* const slot = spare_.empty() ? &slots_[used_] : spare_.back();
        auto* const copy = new (slot) Record(parts...);
        if (spare_.empty())
            ++used_;
        else
            spare_.pop_back();
        Fingerprint const number = _fingerprint(copy->getKey());
        if (records_.empty() || std::less<>()(records_.back(), copy)) {
            numbers_.push_back(number);
            records_.push_back(copy);
            return;
        }
        auto const place = std::lower_bound(records_.begin(), records_.end(), copy, std::less<>());
        numbers_.insert(numbers_.begin() + (place - records_.begin()), number);
        records_.insert(place, copy);
    }

    void remove(std::size_t index) {
        auto const offset = static_cast<std::ptrdiff_t>(index);
        Record* const record = records_[index];
        records_.erase(records_.begin() + offset);
        numbers_.erase(numbers_.begin() + offset);
        record->~Record();
        spare_.push_back(record);
    }

private:
    using Slot = std::aligned_storage_t<sizeof(Record), alignof(Record)>;

    std::size_t capacity_;
    std::unique_ptr<Slot[]> slots_;
    std::size_t used_ = 0;
    std::vector<void*> spare_;
    std::vector<Record*> records_;
    std::vector<Fingerprint> numbers_;
    bool handedOut_ = false; // whether any number is HANDED_OUT
};

RecordSet::RecordSet() = default;

RecordSet::~RecordSet() = default;

RecordSet::Place RecordSet::at(std::size_t position) const {
    std::size_t left = position;
    auto block = blocks_.begin();
    while (left >= (*block)->size()) left -= (*block++)->size();
    return Place{block->get(), left};
}

RecordSet::Record& RecordSet::handOut(std::size_t position) {
    Place const place = at(position);
    place.block->markHandedOut(place.index);
    return (*place.block)[place.index];
}

RecordSet::Place RecordSet::find(std::wstring const& key) const {
    Fingerprint const number = _fingerprint(key);
    for (std::unique_ptr<Block> const& block : blocks_) {
        std::size_t const index = block->find(key, number);
        if (index != NOT_FOUND) return Place{block.get(), index};
    }
    return Place{nullptr, 0};
}

RecordSet::Record const* RecordSet::Cursor::next() {
    while (block_ < set_.blocks_.size()) {
        Block const& block = *set_.blocks_[block_];
        if (index_ < block.size()) return &block[index_++];
        ++block_;
        index_ = 0;
    }
    return nullptr;
}

RecordSet::Block& RecordSet::blockWithRoom() {
    // There is usually room where the last record went.
    if (last_ == nullptr || !last_->hasRoom()) last_ = &firstWithRoom();
    return *last_;
}

RecordSet::Block& RecordSet::firstWithRoom() {
    std::size_t capacity = 0;
    for (std::unique_ptr<Block> const& block : blocks_) {
        if (block->hasRoom()) return *block;
        capacity += block->capacity();
    }
    auto added = std::make_unique<Block>(std::max(capacity, FIRST_CAPACITY));
    Block& result = *added;
    auto const place =
        std::upper_bound(blocks_.begin(), blocks_.end(), added,
                         [](std::unique_ptr<Block> const& a, std::unique_ptr<Block> const& b) {
                             return a->isBefore(*b);
                         });
    blocks_.insert(place, std::move(added));
    return result;
}

void RecordSet::add(Record const& record) {
    blockWithRoom().add(record);
    ++size_;
}

void RecordSet::add(std::wstring const& key, std::vector<unsigned char> const& data) {
    blockWithRoom().add(key, data);
    ++size_;
}

void RecordSet::remove(std::wstring const& key) {
    Place const place = find(key);
    if (place.block == nullptr) return;
    place.block->remove(place.index);
    --size_;
}

void RecordSet::clear() {
    blocks_.clear();
    last_ = nullptr;
    size_ = 0;
}

} // namespace Koru
