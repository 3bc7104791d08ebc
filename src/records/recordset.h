// The records that a record file holds, in the order of their addresses.
//
// They are kept in a few blocks of memory, each twice as large as all before it, and each with a
// list of its records in the order of their addresses. So a position is found within a few steps,
// and a new record mostly goes to the end of a list. A column of fingerprints beside each list
// makes looking for a key quick.
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

    /// The record at a position below the size, for a caller who may change its key at any time
    /// from now on.
    Record& handOut(std::size_t position);

    /// Whether a record with an equal key is held.
    bool holds(std::wstring const& key) const { return find(key).block != nullptr; }

    /// Holds a copy of the record, or a record made of key and data (which see for what is thrown).
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
    Block* last_ = nullptr;                      // the one that got the last record
    std::size_t size_ = 0;
};

/// Gives one record after the other, of a set that does not change meanwhile, and then null.
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
