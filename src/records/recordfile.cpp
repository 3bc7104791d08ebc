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

#include "file/rewind.h"

namespace Koru {

namespace {

constexpr std::size_t BLOCK = 64 * 1024; // bytes
constexpr std::size_t LENGTH_SIZE = 4;
constexpr std::uint64_t LONGEST = std::numeric_limits<std::uint32_t>::max();

/// Reads one record after the other. Memory is reused from one to the next.
class Reader {
public:
    explicit Reader(File& file) : file_(file), block_(new char[BLOCK]) {}

    bool atEnd() { return at_ == filled_ && !fill(); }

    void readInto(RecordSet& records) {
        readBytes(keyBytes_);
        decodeKey();
        readBytes(data_);
        records.add(key_, data_);
    }

private:
    [[noreturn]] void fail() {
        file_.setstate(std::ios::failbit);
        throw std::runtime_error("failed to read from file");
    }

    /// Fetches a block of the file, what one peek brings; false at the end.
    bool fill() {
        bool const nothingMore = file_.peek() == std::char_traits<char>::eof();
        // An error looks like the end, too.
        if (file_.bad()) fail();
        if (nothingMore) return false;
        auto const arrived = std::min<std::streamsize>(file_.rdbuf()->in_avail(), BLOCK);
        at_ = 0;
        filled_ = static_cast<std::size_t>(file_.rdbuf()->sgetn(block_.get(), arrived));
        return true;
    }

    void read(char* to, std::size_t size) {
        while (size != 0) {
            if (atEnd()) fail();
            std::size_t const step = std::min(size, filled_ - at_);
            std::memcpy(to, block_.get() + at_, step);
            at_ += step;
            to += step;
            size -= step;
        }
    }

    std::size_t readLength() {
        std::array<char, LENGTH_SIZE> bytes;
        read(bytes.data(), bytes.size());
        std::uint32_t length = 0;
        for (std::size_t i = 0; i < bytes.size(); ++i) {
            length |= std::uint32_t{static_cast<unsigned char>(bytes[i])} << (8 * i);
        }
        return length;
    }

    /// Reads a length and as many bytes. A length is only believed as far as bytes arrive: memory
    /// grows with them, to twice as much at the most.
    template <class Byte>
    void readBytes(std::vector<Byte>& bytes) {
        constexpr std::size_t firstStep = 64 * 1024;
        std::size_t const length = readLength();
        if (length > bytes.max_size()) throw std::bad_alloc();
        bytes.clear();
        while (bytes.size() < length) {
            std::size_t const arrived = bytes.size();
            bytes.resize(arrived + std::min(length - arrived, std::max(arrived, firstStep)));
            read(reinterpret_cast<char*>(&bytes[arrived]), bytes.size() - arrived);
        }
    }

    /// The second byte of each pair, sign-extended. Intended: also where that is a character beyond
    /// 0x7FFFFFFF; and after an odd length a zero is read.
    void decodeKey() {
        std::size_t const pairs = keyBytes_.size() / 2;
        std::size_t const characters = pairs + keyBytes_.size() % 2;
        if (characters > key_.max_size()) throw std::bad_alloc();
        key_.assign(characters, L'\0');
        for (std::size_t i = 0; i < pairs; ++i) {
            key_[i] = static_cast<signed char>(keyBytes_[2 * i + 1]);
        }
    }

    File& file_;
    std::unique_ptr<char[]> block_;
    std::size_t at_ = 0;
    std::size_t filled_ = 0;
    std::vector<char> keyBytes_;
    std::wstring key_;
    std::vector<unsigned char> data_;
};

/// Writes one record after the other into a block, which a sink gets whenever it is full.
class Writer {
public:
    Writer(char* block, Sink& sink) : block_(block), sink_(sink) {}

    void write(DataFile::Record const& record) {
        std::wstring const& key = record.getKey();
        std::vector<unsigned char> const& data = record.getData();
        writeLength(2 * key.size());
        writeKey(key.data(), key.size());
        writeLength(data.size());
        writeData(data.data(), data.size());
    }

    /// Gives what is in the block to the sink.
    void flush() {
        sink_.write(std::string_view(block_, filled_));
        filled_ = 0;
    }

private:
    /// The bytes that the block still takes; so many at least.
    std::size_t room(std::size_t least) {
        if (BLOCK - filled_ < least) flush();
        return BLOCK - filled_;
    }

    void writeLength(std::size_t length) {
        room(LENGTH_SIZE);
        for (std::size_t i = 0; i < LENGTH_SIZE; ++i) {
            block_[filled_++] = static_cast<char>((length >> (8 * i)) & 0xFF);
        }
    }

    void writeKey(wchar_t const* key, std::size_t size) {
        while (size != 0) {
            std::size_t const step = std::min(size, room(2) / 2);
            for (wchar_t const* const end = key + step; key != end; ++key) {
                block_[filled_++] = '\0';
                block_[filled_++] = static_cast<char>(*key);
            }
            size -= step;
        }
    }

    void writeData(unsigned char const* data, std::size_t size) {
        while (size != 0) {
            std::size_t const step = std::min(size, room(1));
            std::memcpy(block_ + filled_, data, step);
            filled_ += step;
            data += step;
            size -= step;
        }
    }

    char* block_;
    Sink& sink_;
    std::size_t filled_ = 0;
};

} // namespace

void readRecords(File& file, RecordSet& records) {
    rewind(file);
    Reader reader(file);
    while (!reader.atEnd()) reader.readInto(records);
}

RecordContent::RecordContent(RecordSet const& records)
    : records_(records), block_(new char[BLOCK]) {
    RecordSet::Cursor cursor(records);
    while (DataFile::Record const* const record = cursor.next()) {
        bool const fits = std::uint64_t{record->getKey().size()} <= LONGEST / 2 &&
                          std::uint64_t{record->getData().size()} <= LONGEST;
        if (!fits) throw std::runtime_error("failed to write to file");
    }
}

void RecordContent::writeTo(Sink& sink) const {
    Writer writer(block_.get(), sink);
    RecordSet::Cursor cursor(records_);
    while (DataFile::Record const* const record = cursor.next()) writer.write(*record);
    writer.flush();
}

} // namespace Koru
