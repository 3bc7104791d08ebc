// Settings files of other programs: those of this machine, and those of the packages that
// script/check-realfiles unpacks. The tests compare what the library lists and writes of each with
// the plain model, on a copy. How many files there are differs, and there may be none.
#include <doctest/doctest.h>

#include <array>
#include <cstddef>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <set>
#include <sstream>
#include <string>
#include <system_error>

#include <koru/initializationfile.h>
#include <koru/propertyfile.h>
#include <koru/string.h>

#include "support/settingsfixture.h"
#include "support/settingsmodel.h"

using Koru::InitializationFile;
using Koru::PropertyFile;
using test::checkSame;
using test::Place;
using test::READ;
using test::READ_WRITE;
using test::Setting;
using test::Settings;

namespace fs = std::filesystem;

namespace {

// What a machine with many files costs at most: seconds.
std::size_t const MOST_ENTRIES = 400000;
std::size_t const MOST_FILES = 3000;
std::size_t const MOST_BYTES = 8 * 1024 * 1024;
std::size_t const LARGEST_FILE = 256 * 1024;

std::array<char const*, 4> const roots{KORU_REAL_FILES, "/etc", "/usr", "/lib"};

std::set<std::string> const extensions{
    ".ini",         ".conf",  ".cfg",        ".cnf",    ".desktop", ".directory",     ".service",
    ".socket",      ".timer", ".target",     ".path",   ".mount",   ".slice",         ".network",
    ".link",        ".theme", ".skin",       ".colors", ".pc",      ".prefs",         ".quirks",
    ".colorscheme", ".list",  ".properties", ".env",    ".repo",    ".ini-production"};

/// Text with a line that could be an entry, and no markup.
bool isLikeSettings(std::string const& bytes) {
    std::size_t const first = bytes.find_first_not_of(" \t\r\n");
    if (first == std::string::npos || bytes[first] == '<' || bytes[first] == '{') return false;
    return bytes.find('=') != std::string::npos;
}

/// The file's bytes; none when it cannot be read or is too large.
std::string bytesOf(fs::path const& path) {
    std::error_code error;
    std::uintmax_t const size = fs::file_size(path, error);
    if (error || size > LARGEST_FILE) return "";
    std::ifstream in(path, std::ios::binary);
    return std::string(std::istreambuf_iterator<char>(in), {});
}

/// What the model knows of a file with sections, and of one without.
struct Sectioned {
    using File = InitializationFile;

    static Settings parse(std::string const& bytes) { return test::sortedSettings(bytes); }
    static std::string text(Settings const& settings) { return test::settingsText(settings); }
    static Settings list(Settings const& settings) { return test::spelledOnce(settings); }

    /// The library's answers when all of a table is asked for.
    static Settings list(File& file) {
        Settings list;
        for (std::wstring const& section : file.enumerateSections()) {
            for (std::wstring const& key : file.enumerateKeys(section)) {
                list.push_back({section, key, file.getValue(section, key)});
            }
        }
        return list;
    }
};

struct Flat {
    using File = PropertyFile;

    static Settings parse(std::string const& bytes) {
        Settings settings;
        std::istringstream in(bytes);
        for (std::string line; std::getline(in, line);) addLine(settings, line);
        return settings;
    }

    static std::string text(Settings const& settings) {
        std::string text;
        for (Setting const& s : settings) {
            text += Koru::make_string(s.key) + "=" + Koru::make_string(s.value) + "\n";
        }
        return text;
    }

    static Settings list(Settings const& settings) { return settings; }

    static Settings list(File& file) {
        Settings list;
        for (std::wstring const& key : file.enumerateKeys()) {
            list.push_back({L"", key, file.getValue(key)});
        }
        return list;
    }

private:
    /// A bracket begins no header here, as it begins none after a letter where there are sections.
    static void addLine(Settings& settings, std::string line) {
        std::size_t const first = line.find_first_not_of("\t ");
        bool const isBracket = first != std::string::npos && line[first] == '[';
        if (isBracket) line.insert(first, 1, 'x');
        std::wstring noSection;
        std::wstring key;
        std::wstring value;
        test::parseSettingsLine(line, noSection, key, value);
        if (key.empty()) return;
        settings.push_back({L"", isBracket ? key.substr(1) : key, value});
    }
};

/// Of equal entries the first tells the value.
Settings withFirstValues(Settings settings) {
    auto const isBefore = [](Setting const& a, Setting const& b) {
        int const order = Koru::compare(a.section, b.section);
        return order < 0 || (order == 0 && Koru::compare(a.key, b.key) < 0);
    };
    std::set<Setting, decltype(isBefore)> first(isBefore);
    for (Setting& s : settings) s.value = first.insert(s).first->value;
    return settings;
}

/// Lists a file of these bytes, writes it back, and lists what was written.
template <class Family>
void checkAs(Place const& place, std::string const& bytes) {
    Settings const expected = Family::parse(bytes);
    std::string const rewritten = Family::text(expected);
    place.write(bytes);
    typename Family::File file(place.path());
    file.open(READ_WRITE);
    checkSame(Family::list(file), withFirstValues(Family::list(expected)));
    file.close();
    checkSame(place.bytes(), rewritten);
    file.open(READ);
    checkSame(Family::list(file), withFirstValues(Family::list(Family::parse(rewritten))));
}

/// A walk through folders that compares each file with the model, as far as the bounds go.
class Walk {
public:
    /// Follows no link, so that nothing is seen twice.
    void visit(fs::path const& root) {
        if (fs::is_symlink(root, error_)) return;
        auto const options = fs::directory_options::skip_permission_denied;
        for (fs::recursive_directory_iterator at(root, options, error_), end; !error_ && at != end;
             at.increment(error_)) {
            if (isFull()) return;
            ++entries_;
            if (extensions.count(at->path().extension().string()) == 0) continue;
            std::error_code unknown;
            if (at->symlink_status(unknown).type() == fs::file_type::regular) checkFile(at->path());
        }
    }

    std::size_t files() const { return files_; }
    std::size_t bytes() const { return bytes_; }

private:
    Place place_;
    std::error_code error_;
    std::size_t entries_ = 0;
    std::size_t files_ = 0;
    std::size_t bytes_ = 0;

    bool isFull() const {
        return entries_ >= MOST_ENTRIES || files_ >= MOST_FILES || bytes_ >= MOST_BYTES;
    }

    void checkFile(fs::path const& path) {
        CAPTURE(path);
        std::string const bytes = bytesOf(path);
        if (!isLikeSettings(bytes)) return;
        ++files_;
        bytes_ += bytes.size();
        checkAs<Sectioned>(place_, bytes);
        checkAs<Flat>(place_, bytes);
    }
};

} // namespace

TEST_CASE("the samples are listed and written as the model has it, with sections and without") {
    Walk walk;
    walk.visit(KORU_SAMPLES);
    CHECK(walk.files() == 11);
}

TEST_CASE("real files are listed and written as the model has it, with sections and without") {
    Walk walk;
    for (char const* const root : roots) walk.visit(root);
    std::printf("real files: %zu, together %zu KB\n", walk.files(), walk.bytes() / 1024);
}
