#include <koru/datafile.h>

#include <algorithm>
#include <stdexcept>

#include "concurrency/cancellation.h"
#include "file/fileguard.h"
#include "file/filereader.h"
#include "file/rewrite.h"
#include "records/recordfile.h"
#include "records/recordset.h"
#include "text/convert.h"

namespace Koru {

DataFile::Record::Record() = default;

DataFile::Record::Record(std::wstring const& key, std::vector<unsigned char> const& data) {
    // Overrides cannot be called yet.
    Record::setKey(key);
    Record::setData(data);
}

DataFile::Record::Record(Record const& other) = default;

DataFile::Record& DataFile::Record::operator=(Record const& other) = default;

DataFile::Record::~Record() = default;

std::wstring const& DataFile::Record::getKey() const { return key_; }

void DataFile::Record::setKey(std::wstring const& key) {
    auto const isBlank = [](wchar_t c) { return c == L' ' || c == L'\t' || c == L'\n'; };
    auto const first = std::find_if_not(key.begin(), key.end(), isBlank);
    auto const end = std::find_if_not(key.rbegin(), key.rend(), isBlank).base();
    // Intended: a key of nothing but blanks stays as it is.
    bool const onlyBlanks = first == key.end();
    auto const from = onlyBlanks ? key.begin() : first;
    auto const to = onlyBlanks ? key.end() : end;
    if (from == to || *from == 0) throw std::invalid_argument("zero length key");
    key_ = wideString(&*from, static_cast<std::size_t>(to - from));
}

std::vector<unsigned char> const& DataFile::Record::getData() const { return data_; }

void DataFile::Record::setData(std::vector<unsigned char> const& data) { data_ = data; }

DataFile::DataFile() : records_(new RecordSet) {}

DataFile::DataFile(File::Path const& path)
    : File(static_cast<std::wstring>(path)), records_(new RecordSet) {}

DataFile::~DataFile() {
    quietly([this] {
        if (is_open()) DataFile::close();
    });
}

void DataFile::open(unsigned long mode) {
    openAndLoad(
        *this, mode | BINARY, [this] { records_->clear(); },
        [this](FileReader& reader) { readRecords(reader, *records_); });
}

void DataFile::close() {
    writeBackAndClose(
        *this, [this] { return RecordContent(*records_); }, [this] { records_->clear(); });
}

unsigned long DataFile::size() const {
    // Taking the lock is the only change.
    FileGuard const guard(const_cast<DataFile&>(*this));
    return records_->size();
}

DataFile::Record& DataFile::operator[](unsigned long index) {
    FileGuard const guard(*this);
    if (index >= records_->size()) throw std::out_of_range("object does not exist");
    return records_->handOut(index);
}

// Intended: if there is a record with an equal key, nothing happens and nothing is reported.
void DataFile::insert(Record const& record) {
    FileGuard const guard(*this);
    if (!records_->holds(record.getKey())) records_->add(record);
}

void DataFile::remove(Record const& record) {
    FileGuard const guard(*this);
    records_->remove(record.getKey());
}

} // namespace Koru
