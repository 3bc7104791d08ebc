// The records that a record file holds, in the order of their addresses.
//
// They are kept in a few blocks of memory. Each block is as large as all before it together and has
// a list of its records in the order of their addresses, so a position is found in a few steps, and
// a new record usually goes to the end of a list. Beside each list is a column of fingerprints,
// which makes looking for a key quick.
#ifndef KORU_RECORDS_RECORDSET_H
#define KORU_RECORDS_RECORDSET_H

#include <cstddef>
#include <memory>
#include <string>
#include <vector>

#include <koru/datafile.h>

namespace Koru {

class RecordSet {
public:
    using Record = DataFile::Record;

    RecordSet();
    RecordSet(RecordSet const&) = delete;
    RecordSet& operator=(RecordSet const&) = delete;
    ~RecordSet();

    std::size_t size() const { return size_; }

    /// The record at a position below the size. The caller may change its key at any later time.
    Record& handOut(std::size_t position);

    /// Whether there is a record with an equal key.
    bool holds(std::wstring const& key) const { return find(key).block != nullptr; }

    /// Adds a copy of the record, or a record made of key and data. Throws what making it throws.
    void add(Record const& record);
    void add(std::wstring const& key, std::vector<unsigned char> const& data);

    /// Destroys the first record with an equal key, if there is one.
    void remove(std::wstring const& key);

    /// Destroys all records.
    void clear();

    class Cursor;

private:
    class Block;
    struct Place {
        Block* block;
        std::size_t index;
    };

    Place at(std::size_t position) const;
    Place find(std::wstring const& key) const;
    Block& blockWithRoom();
    Block& firstWithRoom();

    std::vector<std::unique_ptr<Block>> blocks_; // in the order of their addresses
    Block* last_ = nullptr;                      // where the last record was added
    std::size_t size_ = 0;
};

/// Returns one record after the other, then null. The set must not change in between.
class RecordSet::Cursor {
public:
    explicit Cursor(RecordSet const& set) : set_(set) {}
    Record const* next();

private:
    RecordSet const& set_;
    std::size_t block_ = 0;
    std::size_t index_ = 0;
};

} // namespace Koru

#endif
