// The bytes of a record file.
//
//     K       4 bytes, little-endian: length of the key in bytes
//     key     K bytes, two for each character: 0x00 and the character's low 8 bits
//     D       4 bytes, little-endian: length of the data in bytes
//     data    D bytes
//
// for one record after the other; docs/formats.md draws it. Nothing stands before, between or
// behind them.
#ifndef KORU_RECORDS_RECORDFILE_H
#define KORU_RECORDS_RECORDFILE_H

#include <koru/datafile.h>

#include <array>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <string_view>

#include "file/rewrite.h"
#include "records/recordset.h"

namespace Koru {

/// Adds every record of the file to the set.
/// @throws std::runtime_error "failed to read from file"
/// @throws std::invalid_argument "zero length key"
void readRecords(File& file, RecordSet& records);

/// The records as bytes, in blocks of one size however large they are.
class RecordContent : public Content {
public:
    /// @throws std::runtime_error "failed to write to file" when a length does not fit its field
    explicit RecordContent(RecordSet const& records);

    std::string_view next() override;

private:
    enum class Stage { KEY_LENGTH, KEY, DATA_LENGTH, DATA };

    bool put(DataFile::Record const& record);
    bool putLength(std::size_t length, Stage next);
    bool putKey(std::wstring const& key);
    bool putData(std::vector<unsigned char> const& data);
    void goTo(Stage stage);

    static constexpr std::size_t BLOCK = 64 * 1024;

    RecordSet const& records_;
    std::size_t position_ = 0;
    Stage stage_ = Stage::KEY_LENGTH;
    std::size_t done_ = 0; // of the key or the data
    std::size_t filled_ = 0;
    std::unique_ptr<char[]> block_;
};

} // namespace Koru

#endif
