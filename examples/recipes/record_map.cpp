#include <koru/datafile.h>
#include <koru/string.h>

#include <iostream>
#include <string>
#include <vector>

using Koru::DataFile;
using Koru::File;
using Bytes = std::vector<unsigned char>;

// Records as a map. A record trims its key, so compare with the key of a record made of it.
DataFile::Record* find(DataFile& file, std::wstring const& key) {
    std::wstring const wanted = DataFile::Record(key, {}).getKey();
    for (unsigned long i = 0; i < file.size(); ++i) {
        if (Koru::compare(file[i].getKey(), wanted) == 0) return &file[i];
    }
    return nullptr;
}

// To replace a record, remove and insert it: both find their place at once, which a loop over all
// records does not.
void put(DataFile& file, std::wstring const& key, Bytes const& data) {
    DataFile::Record const record(key, data);
    file.remove(record);
    file.insert(record);
}

int main() {
    DataFile file(File::Path("map.dat"));
    file.open(File::READ | File::WRITE);
    put(file, L"one", {1});
    put(file, L"two", {1, 2});
    put(file, L" One ", {1, 1, 1});
    DataFile::Record const* const one = find(file, L"ONE");
    std::cout << file.size() << ' ' << (one == nullptr ? 0 : one->getData().size()) << ' '
              << std::boolalpha << (find(file, L"three") == nullptr) << '\n';
}
