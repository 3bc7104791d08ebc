#include "records/recordfile.h"

#include <algorithm>
#include <cstring>
#include <limits>
#include <new>
#include <stdexcept>
#include <string>
#include <vector>

#include "file/rewind.h"

namespace Koru {

namespace {

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
    static constexpr std::size_t BLOCK = 64 * 1024;

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

} // namespace

void readRecords(File& file, RecordSet& records) {
    rewind(file);
    Reader reader(file);
    while (!reader.atEnd()) reader.readInto(records);
}

RecordContent::RecordContent(RecordSet const& records)
    : records_(records), block_(new char[BLOCK]) {
    for (std::size_t i = 0; i < records.size(); ++i) {
        bool const fits = std::uint64_t{records[i].getKey().size()} <= LONGEST / 2 &&
                          std::uint64_t{records[i].getData().size()} <= LONGEST;
        if (!fits) throw std::runtime_error("failed to write to file");
    }
}

std::string_view RecordContent::next() {
    filled_ = 0;
    while (position_ < records_.size() && put(records_[position_])) ++position_;
    return std::string_view(block_.get(), filled_);
}

/// Puts what is still to come of a record into the block and tells whether that was all.
bool RecordContent::put(DataFile::Record const& record) {
    std::wstring const& key = record.getKey();
    std::vector<unsigned char> const& data = record.getData();
    if (stage_ == Stage::KEY_LENGTH && !putLength(2 * key.size(), Stage::KEY)) return false;
    if (stage_ == Stage::KEY && !putKey(key)) return false;
    if (stage_ == Stage::DATA_LENGTH && !putLength(data.size(), Stage::DATA)) return false;
    return putData(data);
}

bool RecordContent::putLength(std::size_t length, Stage next) {
    if (BLOCK - filled_ < LENGTH_SIZE) return false;
    for (std::size_t i = 0; i < LENGTH_SIZE; ++i) {
        block_[filled_++] = static_cast<char>((length >> (8 * i)) & 0xFF);
    }
    goTo(next);
    return true;
}

bool RecordContent::putKey(std::wstring const& key) {
    std::size_t const count = std::min(key.size() - done_, (BLOCK - filled_) / 2);
    char* to = block_.get() + filled_;
    for (wchar_t const* c = key.data() + done_; c != key.data() + done_ + count; ++c) {
        *to++ = '\0';
        *to++ = static_cast<char>(*c);
    }
    filled_ += 2 * count;
    done_ += count;
    if (done_ < key.size()) return false;
    goTo(Stage::DATA_LENGTH);
    return true;
}

bool RecordContent::putData(std::vector<unsigned char> const& data) {
    std::size_t const size = std::min(data.size() - done_, BLOCK - filled_);
    if (size != 0) std::memcpy(block_.get() + filled_, data.data() + done_, size);
    filled_ += size;
    done_ += size;
    if (done_ < data.size()) return false;
    goTo(Stage::KEY_LENGTH);
    return true;
}

void RecordContent::goTo(Stage stage) {
    stage_ = stage;
    done_ = 0;
}

} // namespace Koru
