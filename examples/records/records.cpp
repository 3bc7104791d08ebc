// Lists, shows, puts and removes the records of a record file.
//
//     records FILE list               the keys and the sizes of their data
//     records FILE get KEY            the data in hexadecimal and as text, like hexdump -C
//     records FILE put KEY TEXT       replaces the key's data by text
//     records FILE put KEY @DATAFILE  replaces it by the content of another file
//     records FILE remove KEY
//
// Text on the command line and on the terminal is UTF-8. Keys match without regard to case; they
// have no characters above U+00FF, as the file keeps only 8 bits of each. The order of records has
// no meaning.
#include <koru/datafile.h>
#include <koru/string.h>

#include <algorithm>
#include <cstdio>
#include <exception>
#include <filesystem>
#include <fstream>
#include <iostream>
#include <iterator>
#include <stdexcept>
#include <string>
#include <vector>

namespace {

using Koru::DataFile;
using Koru::File;
using Bytes = std::vector<unsigned char>;

/// The library resolves relative paths against the executable; a user of the command line means
/// the working directory.
File::Path pathOf(char const* argument) {
    return File::Path(std::filesystem::absolute(argument).string());
}

/// The key as it comes back from the file: 8 bits of each character, with their sign.
std::wstring keyOf(char const* argument) {
    std::wstring key = Koru::make_wstring(argument);
    for (wchar_t& c : key) {
        if (c > 0xFF) throw std::invalid_argument("a key has no characters beyond U+00FF");
        c = static_cast<signed char>(c);
    }
    return key;
}

std::string shown(std::wstring key) {
    for (wchar_t& c : key) c = static_cast<unsigned char>(c);
    return Koru::make_string(key);
}

Bytes contentOf(char const* name) {
    std::ifstream in(name, std::ios::binary);
    Bytes content{std::istreambuf_iterator<char>(in), std::istreambuf_iterator<char>()};
    if (!in.is_open() || in.bad()) throw std::runtime_error(std::string("cannot read ") + name);
    return content;
}

Bytes dataOf(std::string const& argument) {
    if (argument.substr(0, 1) == "@") return contentOf(argument.c_str() + 1);
    return Bytes(argument.begin(), argument.end());
}

void printLine(std::size_t offset, unsigned char const* bytes, std::size_t count) {
    std::printf("%08zx  ", offset);
    for (std::size_t i = 0; i < 16; ++i) {
        if (i == 8) std::printf(" ");
        if (i < count) std::printf("%02x ", bytes[i]);
        if (i >= count) std::printf("   ");
    }
    std::string text(bytes, bytes + count);
    std::replace_if(
        text.begin(), text.end(), [](char c) { return c < ' ' || c > '~'; }, '.');
    std::printf(" |%s|\n", text.c_str());
}

/// Prints sixteen bytes a line, and a star for lines that are the same as the one before.
void dump(Bytes const& data) {
    bool starred = false;
    for (std::size_t at = 0; at < data.size(); at += 16) {
        unsigned char const* const line = data.data() + at;
        std::size_t const count = std::min<std::size_t>(16, data.size() - at);
        bool const repeated = at > 0 && count == 16 && std::equal(line, line + 16, line - 16);
        if (repeated && !starred) std::printf("*\n");
        if (!repeated) printLine(at, line, count);
        starred = repeated;
    }
    if (!data.empty()) std::printf("%08zx\n", data.size());
}

int list(DataFile& file) {
    file.open(File::READ);
    for (unsigned long i = 0; i < file.size(); ++i) {
        DataFile::Record const& record = file[i];
        std::printf("%10zu  %s\n", record.getData().size(), shown(record.getKey()).c_str());
    }
    file.close();
    return 0;
}

int get(DataFile& file, char** words) {
    std::wstring const key = keyOf(words[0]);
    file.open(File::READ);
    for (unsigned long i = 0; i < file.size(); ++i) {
        DataFile::Record const& record = file[i];
        if (Koru::compare(record.getKey(), key) != 0) continue;
        dump(record.getData());
        return 0;
    }
    throw std::runtime_error(std::string("no record ") + words[0]);
}

/// Opens a file to change it. One that cannot be read whole stays as it is, while the destructor
/// would replace it by what could be read.
void openForChange(DataFile& file) {
    try {
        file.open(File::READ | File::WRITE);
    } catch (std::exception const&) {
        file.setMode(File::READ);
        throw;
    }
}

int put(DataFile& file, char** words) {
    DataFile::Record const record(keyOf(words[0]), dataOf(words[1]));
    openForChange(file);
    file.remove(record); // insert() would leave a record with this key as it is
    file.insert(record);
    file.close(); // Writes the file. The destructor would too, but could not report a failure.
    return 0;
}

int remove(DataFile& file, char** words) {
    DataFile::Record const record(keyOf(words[0]), {});
    openForChange(file);
    file.remove(record);
    file.close();
    return 0;
}

int usage() {
    std::cerr << "usage: records FILE list\n"
                 "       records FILE get KEY\n"
                 "       records FILE put KEY TEXT\n"
                 "       records FILE put KEY @DATAFILE\n"
                 "       records FILE remove KEY\n";
    return 2;
}

int run(int argc, char** argv) {
    std::string const command = argc > 2 ? argv[2] : "";
    bool const known = (command == "list" && argc == 3) || (command == "get" && argc == 4) ||
                       (command == "put" && argc == 5) || (command == "remove" && argc == 4);
    if (!known) return usage();
    DataFile file(pathOf(argv[1]));
    if (command == "list") return list(file);
    if (command == "get") return get(file, argv + 3);
    if (command == "put") return put(file, argv + 3);
    return remove(file, argv + 3);
}

} // namespace

int main(int argc, char** argv) {
    try {
        return run(argc, argv);
    } catch (std::exception const& e) {
        std::cerr << "records: " << e.what() << '\n';
        return 1;
    }
}
