#include <koru/datafile.h>
#include <koru/string.h>

#include <iostream>
#include <vector>

using Koru::DataFile;
using Koru::File;

int main() {
    DataFile file(File::Path("levels.dat"));
    file.open(File::READ | File::WRITE);
    // A record is a key and any bytes. A second one with the same key is not taken.
    file.insert(DataFile::Record(L"intro", {1, 2, 3}));
    file.insert(DataFile::Record(L"final", std::vector<unsigned char>(1000, 0xFF)));
    file.insert(DataFile::Record(L"INTRO", {9}));
    file.close(); // writes the file

    file.open(File::READ | File::WRITE);
    std::cout << file.size() << " records\n";
    for (unsigned long i = 0; i < file.size(); ++i) {
        // Records have places, but no order: look for the key.
        DataFile::Record& record = file[i];
        if (Koru::compare(record.getKey(), std::wstring(L"intro")) != 0) continue;
        std::cout << "intro has " << record.getData().size() << " bytes\n";
        record.setData({4, 5});
    }
    file.remove(DataFile::Record(L"final", {}));
    std::cout << file.size() << " record, " << file[0].getData().size() << " bytes\n";
}
