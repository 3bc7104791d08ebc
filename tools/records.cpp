// Record files. A key is stored as bytes, one for each character, and this program shows each as the
// character of Latin-1. The library gives those from 0x80 on back with their sign.
#include <koru/datafile.h>

#include "failure.h"
#include "table.h"
#include "text.h"

namespace tool {

namespace {

std::string _shown(std::wstring key) {
    for (wchar_t& c : key) c &= 0xFF;
    return narrow(key);
}

std::wstring _stored(std::string const& text) {
    std::wstring key = wide(text);
    for (wchar_t& c : key) {
        if (c > 0xFF) throw Failure(REFUSED, "a character of a key is at most U+00FF");
        c = static_cast<signed char>(c);
    }
    return key;
}

class RecordTable : public Table {
public:
    explicit RecordTable(Koru::File::Path const& path) : file_(path) {}

    Koru::File& file() override { return file_; }

    std::vector<Entry> entries() override {
        std::vector<Entry> result;
        for (unsigned long i = 0; i < file_.size(); ++i) {
            Koru::DataFile::Record const& record = file_[i];
            result.push_back({"", _shown(record.getKey()), hex(record.getData())});
        }
        return result;
    }

    void set(Entry const& entry) override {
        remove(entry); // A record that is there is not replaced.
        file_.insert({_stored(entry.key), unhex(entry.value)});
    }

    void remove(Entry const& name) override {
        Koru::DataFile::Record const record(_stored(name.key), {});
        unsigned long size = 0;
        do { // duplicates too
            size = file_.size();
            file_.remove(record);
        } while (file_.size() < size);
    }

private:
    Koru::DataFile file_;
};

std::unique_ptr<Table> _make(Koru::File::Path const& path) {
    return std::make_unique<RecordTable>(path);
}

void _check(Entry const& entry) {
    if (entry.key.empty()) throw Failure(REFUSED, "an empty key cannot be stored");
    if (Koru::DataFile::Record(_stored(entry.key), {}).getKey() != _stored(entry.key))
        throw Failure(REFUSED, "a key with blanks or line breaks at its ends would lose them");
    (void)unhex(entry.value);
}

} // namespace

Family const RECORDS = {"records", "record", "data", false, _make, _check, &PROPERTIES};

} // namespace tool
