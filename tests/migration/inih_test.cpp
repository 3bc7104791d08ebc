// The rows of docs/migration/inih.md.
#include <doctest/doctest.h>

#include <INIReader.h>
#include <ini.h>

#include <string>
#include <vector>

#include "migration/both.h"

using test::InitializationFile;
using test::Place;
using test::READ_WRITE;
using test::SettingsFile;
using test::text;

namespace {

/// An INIReader of content.
struct Peer : INIReader {
    explicit Peer(std::string const& bytes) : INIReader(bytes.data(), bytes.size()) {}
};

/// What an application that uses ini_parse has: a function for each entry.
int collect(void* list, char const* section, char const* key, char const* value) {
    auto* const entries = static_cast<std::vector<std::string>*>(list);
    entries->push_back(std::string(section) + "/" + key + "=" + value);
    return 1;
}

/// Sets an entry in the InitializationFile that is the first argument; a handler for ini_parse.
int convert(void* to, char const* section, char const* key, char const* value) {
    auto* const settings = static_cast<InitializationFile*>(to);
    settings->setValue(Koru::make_wstring(section), Koru::make_wstring(key),
                       Koru::make_wstring(value));
    return 1;
}

} // namespace

TEST_CASE("a value is read") {
    char const* const content = "[Window]\ntitle=Grüße\n";
    Peer const reader(content);
    SettingsFile settings(content);
    CHECK(reader.Get("Window", "title", "") == "Grüße");
    CHECK(text(settings.getValue(L"Window", L"title")) == "Grüße");
}

TEST_CASE("a missing value is empty") {
    Peer const reader("[Window]\n");
    SettingsFile settings("[Window]\n");
    CHECK(reader.Get("Window", "title", "none") == "none");
    CHECK(settings.getValue(L"Window", L"title").empty());
}

TEST_CASE("a key is listed if it is there") {
    char const* const content = "[Window]\ntitle=\n";
    Peer const reader(content);
    SettingsFile settings(content);
    CHECK(reader.HasValue("Window", "title"));
    CHECK(text(settings.enumerateKeys(L"Window")) == "title");
}

TEST_CASE("all entries are visited") {
    char const* const content = "[b]\nz=1\n[a]\ny=2\n";
    Place const place;
    place.write(content);
    std::vector<std::string> entries;
    CHECK(ini_parse(place.path().c_str(), collect, &entries) == 0);
    CHECK(text(entries) == "b/z=1|a/y=2");
    SettingsFile settings(content);
    entries.clear();
    for (std::wstring const& section : settings.enumerateSections()) {
        for (std::wstring const& key : settings.enumerateKeys(section)) {
            std::wstring const value = settings.getValue(section, key);
            entries.push_back(text(section + L"/" + key + L"=" + value));
        }
    }
    CHECK(text(entries) == "a/y=2|b/z=1");
}

TEST_CASE("a program's text is read from a file") {
    std::vector<std::string> entries;
    CHECK(ini_parse_string("[s]\nk=1\n", collect, &entries) == 0);
    CHECK(text(entries) == "s/k=1");
    Place const place;
    place.write("[s]\nk=1\n");
    InitializationFile settings(place.path());
    settings.open(test::READ);
    CHECK(text(settings.getValue(L"s", L"k")) == "1");
}

TEST_CASE("case does not count in names") {
    char const* const content = "[Window]\nWidth=800\n";
    Peer const reader(content);
    SettingsFile settings(content);
    CHECK(reader.Get("window", "width", "") == "800");
    CHECK(text(settings.getValue(L"window", L"width")) == "800");
    CHECK(text(settings.enumerateKeys(L"window")) == "Width");
}

TEST_CASE("blanks around the equals sign belong to key and value") {
    char const* const content = "[Window]\nwidth = 800\n";
    Peer const reader(content);
    SettingsFile settings(content);
    CHECK(reader.Get("Window", "width", "") == "800");
    CHECK(settings.getValue(L"Window", L"width").empty());
    CHECK(text(settings.getValue(L"Window", L"width ")) == " 800");
}

TEST_CASE("a comment needs its own line") {
    char const* const content = "[Window]\nwidth=800 ; pixels\n";
    Peer const reader(content);
    SettingsFile settings(content);
    CHECK(reader.Get("Window", "width", "") == "800");
    CHECK(text(settings.getValue(L"Window", L"width")) == "800 ; pixels");
}

TEST_CASE("a colon does not end a key") {
    char const* const content = "[Window]\nwidth:800\n";
    Peer const reader(content);
    SettingsFile settings(content);
    CHECK(reader.Get("Window", "width", "") == "800");
    CHECK(settings.enumerateKeys(L"Window").empty());
}

TEST_CASE("a colon before the equals sign belongs to the key") {
    char const* const content = "[Files]\nc:name=1\n";
    Peer const reader(content);
    SettingsFile settings(content);
    CHECK(reader.Get("Files", "c", "") == "name=1");
    CHECK(text(settings.getValue(L"Files", L"c:name")) == "1");
}

TEST_CASE("a number is text") {
    char const* const content = "[Window]\nwidth=800px\ncolor=0xFF\n";
    Peer const reader(content);
    SettingsFile settings(content);
    CHECK(reader.GetInteger("Window", "width", 640) == 800);
    CHECK(std::stol(settings.getValue(L"Window", L"width")) == 800);
    CHECK(reader.GetInteger("Window", "color", 0) == 255);
    CHECK(std::stol(settings.getValue(L"Window", L"color"), nullptr, 0) == 255);
}

TEST_CASE("a flag is text") {
    char const* const content = "[Window]\nopen=yes\n";
    Peer const reader(content);
    SettingsFile settings(content);
    CHECK(reader.GetBoolean("Window", "open", false));
    CHECK(settings.getValue(L"Window", L"open") == L"yes");
}

TEST_CASE("equal keys are read one after another") {
    char const* const content = "[s]\nk=1\nk=2\n";
    Peer const reader(content);
    SettingsFile settings(content);
    CHECK(reader.Get("s", "k", "") == "1\n2");
    CHECK(text(settings.getValue(L"s", L"k")) == "1");
    settings.removeKey(L"s", L"k");
    CHECK(text(settings.getValue(L"s", L"k")) == "2");
}

TEST_CASE("a value has one line") {
    char const* const content = "[s]\nk=one\n  two\n";
    Peer const reader(content);
    SettingsFile settings(content);
    CHECK(reader.Get("s", "k", "") == "one\ntwo");
    CHECK(text(settings.getValue(L"s", L"k")) == "one");
}

TEST_CASE("an indented entry is an entry") {
    char const* const content = "[s]\na=1\n  b=2\n";
    Peer const reader(content);
    SettingsFile settings(content);
    CHECK(reader.Get("s", "a", "") == "1\nb=2");
    CHECK(text(settings.getValue(L"s", L"b")) == "2");
}

TEST_CASE("a line may be of any length") {
    std::string const content = "[s]\nk=" + std::string(300, 'x') + "\n";
    Peer const reader(content);
    SettingsFile settings(content);
    CHECK(reader.Get("s", "k", "").size() == 197);
    CHECK(settings.getValue(L"s", L"k").size() == 300);
}

TEST_CASE("a line that is not an entry is ignored") {
    char const* const content = "[Window]\nwidth\nheight=600\n";
    Peer const reader(content);
    SettingsFile settings(content);
    CHECK(reader.ParseError() == 2);
    CHECK(reader.Get("Window", "height", "") == "600");
    CHECK(text(settings.enumerateKeys(L"Window")) == "height");
}

TEST_CASE("a header needs no closing bracket") {
    char const* const content = "[Window\nwidth=800\n";
    Peer const reader(content);
    SettingsFile settings(content);
    CHECK(reader.ParseError() == 1);
    CHECK(text(settings.getValue(L"Window", L"width")) == "800");
}

TEST_CASE("an entry before the first header is ignored") {
    char const* const content = "width=800\n";
    Peer const reader(content);
    SettingsFile settings(content);
    CHECK(reader.Get("", "width", "") == "800");
    CHECK(settings.getValue(L"", L"width").empty());
}

TEST_CASE("a section without keys is gone") {
    Peer const reader("[Empty]\n");
    SettingsFile settings("[Empty]\n");
    CHECK_FALSE(reader.HasSection("Empty"));
    CHECK(settings.enumerateSections().empty());
}

TEST_CASE("a byte order mark hides the first header") {
    char const* const content = "\xEF\xBB\xBF[s]\nk=1\n";
    Peer const reader(content);
    SettingsFile settings(content);
    CHECK(reader.Get("s", "k", "") == "1");
    CHECK(settings.enumerateSections().empty());
}

TEST_CASE("a carriage return stays") {
    char const* const content = "[s]\r\nk=1\r\n";
    Peer const reader(content);
    SettingsFile settings(content);
    CHECK(reader.Get("s", "k", "") == "1");
    CHECK(text(settings.getValue(L"s]\r", L"k")) == "1\r");
}

TEST_CASE("a missing file is an error") {
    Place const place;
    INIReader const reader(place.path());
    CHECK(reader.ParseError() == -1);
    InitializationFile settings(place.path());
    CHECK(test::messageOf<std::runtime_error>([&] { settings.open(test::READ); }) ==
          "failed to open file.");
}

TEST_CASE("the whole file is converted") {
    char const* const content = "\xEF\xBB\xBF; ours\r\n[Menu]\r\nname: File ; the first\r\n"
                                "long = one\r\n  two\r\n";
    SettingsFile settings("", READ_WRITE);
    CHECK(ini_parse_string(content, convert, static_cast<InitializationFile*>(&settings)) == 0);
    settings.close();
    CHECK(settings.place.bytes() == "[Menu]\nlong=two\nname=File\n");
}
