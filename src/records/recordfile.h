// The bytes of a record file.
//
//     K       4 bytes, little-endian: length of the key in bytes
//     key     K bytes, two for each character: 0x00 and the character's low 8 bits
//     D       4 bytes, little-endian: length of the data in bytes
//     data    D bytes
//
// for each record, and nothing else; docs/formats.md draws it.
#ifndef KORU_RECORDS_RECORDFILE_H
#define KORU_RECORDS_RECORDFILE_H

#include <memory>

#include <koru/datafile.h>

#include "file/filereader.h"
#include "file/rewrite.h"
#include "records/recordset.h"

namespace Koru {

/// Adds every record of a file to the set.
/// @throws std::runtime_error "failed to read from file"
/// @throws std::invalid_argument "zero length key"
void readRecords(FileReader& reader, RecordSet& records);

/// The records as bytes, written through one buffer however large they are.
class RecordContent : public Content {
public:
    /// @throws std::runtime_error "failed to write to file" if a length does not fit its field
    explicit RecordContent(RecordSet const& records);

    void writeTo(Sink& sink) const override;

private:
    RecordSet const& records_;
    std::unique_ptr<char[]> buffer_;
};

} // namespace Koru

#endif
