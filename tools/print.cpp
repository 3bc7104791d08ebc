#include "print.h"

#include <sys/mman.h>
#include <unistd.h>

#include <nlohmann/json.hpp>

#include <sstream>
#include <stdexcept>

#include "access.h"
#include "failure.h"
#include "text.h"

namespace tool {

namespace {

using Json = nlohmann::ordered_json;

std::string _line(Json const& object) {
    try {
        return object.dump() + "\n";
    } catch (Json::type_error const&) {
        throw Failure(FAILED, "it has text that is no UTF-8 and so no JSON");
    }
}

Json _name(Entry const& entry) {
    Json object = Json::object();
    if (!entry.section.empty()) object["section"] = entry.section;
    if (!entry.key.empty()) object["key"] = entry.key;
    return object;
}

std::string _exportedAsJson(Family const& family, std::vector<Entry> const& entries) {
    std::string result;
    for (Entry const& entry : entries) {
        Json object = _name(entry);
        object[family.valueName] = entry.value;
        result += _line(object);
    }
    return result;
}

std::string _exportedAsText(Family const& family, std::vector<Entry> const& entries) {
    std::string result;
    std::string section;
    for (Entry const& entry : entries) {
        family.text->check(entry);
        if (entry.section != section) result += "[" + entry.section + "]\n";
        section = entry.section;
        result += entry.key + "=" + entry.value + "\n";
    }
    return result;
}

/// A file in memory, for the library to read.
class MemoryFile {
public:
    explicit MemoryFile(std::string const& bytes)
        : descriptor_(::memfd_create("text", MFD_CLOEXEC)) {
        if (descriptor_ < 0) failBySystem("cannot make a file in memory");
        for (std::size_t written = 0; written < bytes.size();) {
            ssize_t const n = ::write(descriptor_, &bytes[written], bytes.size() - written);
            if (n < 0) failBySystem("cannot write a file in memory");
            written += static_cast<std::size_t>(n);
        }
    }
    MemoryFile(MemoryFile const&) = delete;
    MemoryFile& operator=(MemoryFile const&) = delete;
    ~MemoryFile() { ::close(descriptor_); }
    std::string path() const { return "/proc/self/fd/" + std::to_string(descriptor_); }

private:
    int descriptor_;
};

Entry _parseLine(Family const& family, std::string const& line) {
    Json const object = Json::parse(line);
    if (object.size() != (family.hasSections ? 3U : 2U)) throw std::invalid_argument("size");
    Entry entry;
    if (family.hasSections) object.at("section").get_to(entry.section);
    object.at("key").get_to(entry.key);
    object.at(family.valueName).get_to(entry.value);
    return entry;
}

std::vector<Entry> _parseJson(Family const& family, std::string const& bytes) {
    std::istringstream in(bytes);
    std::vector<Entry> result;
    std::size_t number = 0;
    for (std::string line; std::getline(in, line);) {
        ++number;
        try {
            if (!line.empty()) result.push_back(_parseLine(family, line));
        } catch (std::exception const&) {
            throw Failure(FAILED,
                          "line " + std::to_string(number) + " is no " + family.item + " in JSON");
        }
    }
    return result;
}

std::vector<Entry> _parseText(Family const& family, std::string const& bytes) {
    return read(*family.text, MemoryFile(bytes).path());
}

} // namespace

std::string exported(Family const& family, std::vector<Entry> const& entries, Format format) {
    return format == Format::JSON ? _exportedAsJson(family, entries)
                                  : _exportedAsText(family, entries);
}

std::string listed(std::vector<Entry> const& entries, Format format) {
    std::string result;
    for (Entry const& entry : entries) {
        if (format == Format::JSON)
            result += _line(_name(entry));
        else
            result += (entry.key.empty() ? entry.section : entry.key) + "\n";
    }
    return result;
}

std::vector<Entry> parse(Family const& family, std::string const& bytes, Format format) {
    return format == Format::JSON ? _parseJson(family, bytes) : _parseText(family, bytes);
}

} // namespace tool
