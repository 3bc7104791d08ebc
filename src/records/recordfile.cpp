#include "records/recordfile.h"

#include <algorithm>
#include <array>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <limits>
#include <new>
#include <stdexcept>
#include <string>
#include <string_view>
#include <vector>

#include "text/simd.h"

namespace Koru {

namespace {

constexpr std::size_t BUFFER_SIZE = 64 * 1024; // bytes
constexpr std::size_t LENGTH_SIZE = 4;
constexpr std::uint64_t LONGEST_FIELD = std::numeric_limits<std::uint32_t>::max();

std::size_t _decodeLength(char const* bytes) {
    auto const byte = [bytes](std::size_t i) {
        return std::size_t{static_cast<unsigned char>(bytes[i])} << (8 * i);
    };
    return byte(0) | byte(1) | byte(2) | byte(3);
}

void _encodeLength(std::size_t length, char* to) {
    auto const byte = [length](std::size_t i) { return static_cast<char>(length >> (8 * i)); };
    to[0] = byte(0);
    to[1] = byte(1);
    to[2] = byte(2);
    to[3] = byte(3);
}

/// Decodes each pair as its second byte, sign-extended. Intended: bytes from 0x80 on become
/// characters beyond 0x7FFFFFFF.
void _decodeKey(char const* pairs, std::size_t size, wchar_t* to) {
    wchar_t* const end = to + size;
    for (; end - to >= 8; pairs += 16, to += 8) {
        // Unpacking puts each pair twice into 32 bits; the shift leaves its second byte.
        __m128i const eight = load16(pairs);
        store16(to, _mm_srai_epi32(_mm_unpacklo_epi16(eight, eight), 24));
        store16(to + 4, _mm_srai_epi32(_mm_unpackhi_epi16(eight, eight), 24));
    }
    for (; to != end; pairs += 2) *to++ = static_cast<signed char>(pairs[1]);
}

/// Encodes each character as a zero and its low 8 bits.
void _encodeKey(wchar_t const* key, std::size_t size, char* to) {
    wchar_t const* const end = key + size;
    // Moves the low 8 bits of each character to the high byte of 16 bits, which packing keeps.
    auto const four = [](wchar_t const* characters) {
        return _mm_srai_epi32(_mm_slli_epi32(load16(characters), 24), 16);
    };
    for (; end - key >= 8; key += 8, to += 16) {
        store16(to, _mm_packs_epi32(four(key), four(key + 4)));
    }
    for (; key != end; ++key) {
        *to++ = '\0';
        *to++ = static_cast<char>(*key);
    }
}

/// Reads one record after the other, and reuses its memory for the next.
class RecordReader {
public:
    explicit RecordReader(FileReader& file) : file_(file), buffer_(new char[BUFFER_SIZE]) {}

    bool atEnd() { return at_ == filled_ && !fill(); }

    void readInto(RecordSet& records) {
        readKey();
        readData();
        records.add(key_, data_);
    }

private:
    /// Fetches the bytes that arrive next; false at the end of the file.
    bool fill() {
        std::size_t const arrived = file_.arrived();
        if (file_.hasFailed()) file_.fail();
        if (arrived == 0) return false;
        at_ = 0;
        filled_ = file_.take(buffer_.get(), std::min(arrived, BUFFER_SIZE));
        return true;
    }

    /// The next bytes, where they are in the buffer; null if it does not hold that many.
    char const* take(std::size_t size) {
        if (size > filled_ - at_) return nullptr;
        at_ += size;
        return buffer_.get() + at_ - size;
    }

    void read(char* to, std::size_t size) {
        while (size != 0) {
            if (atEnd()) file_.fail();
            std::size_t const step = std::min(size, filled_ - at_);
            std::memcpy(to, take(step), step);
            to += step;
            size -= step;
        }
    }

    std::size_t readLength() {
        if (char const* const bytes = take(LENGTH_SIZE)) return _decodeLength(bytes);
        std::array<char, LENGTH_SIZE> bytes;
        read(bytes.data(), bytes.size());
        return _decodeLength(bytes.data());
    }

    /// Reads as many bytes as a length says. The length may be wrong, so memory grows only as bytes
    /// arrive, to twice their number at most.
    template <class Byte>
    void gather(std::vector<Byte>& bytes, std::size_t length) {
        constexpr std::size_t firstStep = 64 * 1024;
        if (length > bytes.max_size()) throw std::bad_alloc();
        bytes.clear();
        while (bytes.size() < length) {
            std::size_t const arrived = bytes.size();
            bytes.resize(arrived + std::min(length - arrived, std::max(arrived, firstStep)));
            read(reinterpret_cast<char*>(&bytes[arrived]), bytes.size() - arrived);
        }
    }

    void readKey() {
        std::size_t const length = readLength();
        if (char const* const bytes = take(length)) {
            decodeKey(bytes, length);
        } else {
            gather(keyBytes_, length);
            decodeKey(keyBytes_.data(), length);
        }
    }

    void readData() {
        std::size_t const length = readLength();
        if (char const* const bytes = take(length)) {
            // The cast makes the types equal, so that assign copies all at once.
            auto const* const data = reinterpret_cast<unsigned char const*>(bytes);
            data_.assign(data, data + length);
        } else {
            gather(data_, length);
        }
    }

    /// Decodes the key. Intended: a zero follows the bytes of an odd length.
    void decodeKey(char const* bytes, std::size_t length) {
        std::size_t const pairs = length / 2;
        std::size_t const characters = pairs + length % 2;
        if (characters > key_.max_size()) throw std::bad_alloc();
        key_.resize(characters);
        if (characters != pairs) key_[pairs] = 0;
        _decodeKey(bytes, pairs, &key_[0]);
    }

    FileReader& file_;
    std::unique_ptr<char[]> buffer_;
    std::size_t at_ = 0;
    std::size_t filled_ = 0;
    std::vector<char> keyBytes_;
    std::wstring key_;
    std::vector<unsigned char> data_;
};

/// Writes one record after the other into a buffer, which a sink gets whenever it is full.
class Writer {
public:
    Writer(char* buffer, Sink& sink) : buffer_(buffer), sink_(sink) {}

    void write(DataFile::Record const& record) {
        std::wstring const& key = record.getKey();
        std::vector<unsigned char> const& data = record.getData();
        writeLength(2 * key.size());
        writeKey(key.data(), key.size());
        writeLength(data.size());
        writeData(data.data(), data.size());
    }

    /// Gives the sink what is in the buffer.
    void flush() {
        sink_.write(std::string_view(buffer_, filled_));
        filled_ = 0;
    }

private:
    /// How many bytes the buffer still takes, which are not fewer than `least`.
    std::size_t room(std::size_t least) {
        if (BUFFER_SIZE - filled_ < least) flush();
        return BUFFER_SIZE - filled_;
    }

    void writeLength(std::size_t length) {
        room(LENGTH_SIZE);
        _encodeLength(length, buffer_ + filled_);
        filled_ += LENGTH_SIZE;
    }

    void writeKey(wchar_t const* key, std::size_t size) {
        while (size != 0) {
            std::size_t const step = std::min(size, room(2) / 2);
            _encodeKey(key, step, buffer_ + filled_);
            filled_ += 2 * step;
            key += step;
            size -= step;
        }
    }

    void writeData(unsigned char const* data, std::size_t size) {
        while (size != 0) {
            std::size_t const step = std::min(size, room(1));
            std::memcpy(buffer_ + filled_, data, step);
            filled_ += step;
            data += step;
            size -= step;
        }
    }

    char* buffer_;
    Sink& sink_;
    std::size_t filled_ = 0;
};

} // namespace

void readRecords(FileReader& reader, RecordSet& records) {
    RecordReader record(reader);
    while (!record.atEnd()) record.readInto(records);
}

RecordContent::RecordContent(RecordSet const& records)
    : records_(records), buffer_(new char[BUFFER_SIZE]) {
    if (sizeof(std::size_t) <= LENGTH_SIZE) return; // Memory holds nothing longer.
    RecordSet::Cursor cursor(records);
    while (DataFile::Record const* const record = cursor.next()) {
        bool const fits = std::uint64_t{record->getKey().size()} <= LONGEST_FIELD / 2 &&
                          std::uint64_t{record->getData().size()} <= LONGEST_FIELD;
        if (!fits) throw std::runtime_error("failed to write to file");
    }
}

void RecordContent::writeTo(Sink& sink) const {
    Writer writer(buffer_.get(), sink);
    RecordSet::Cursor cursor(records_);
    while (DataFile::Record const* const record = cursor.next()) writer.write(*record);
    writer.flush();
}

} // namespace Koru
