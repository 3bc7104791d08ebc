// The rows of docs/migration/simpleini.md.
#include <doctest/doctest.h>

// All of it, from the header. Its wide strings would need a file that Debian does not have.
#define SI_IMPLEMENTATION
#define SI_NO_CONVERSION
#include <SimpleIni.h>

#include <string>
#include <vector>

#include "migration/both.h"

using test::FullDisk;
using test::InitializationFile;
using test::Place;
using test::READ_WRITE;
using test::SettingsFile;
using test::text;

namespace {

/// A CSimpleIniA with content.
struct Peer : CSimpleIniA {
    explicit Peer(std::string const& bytes, bool multiKey = false, bool multiLine = false)
        : CSimpleIniA(true, multiKey, multiLine), loaded(LoadData(bytes)) {}

    std::string saved() const {
        std::string bytes;
        Save(bytes);
        return bytes;
    }

    SI_Error loaded;
};

std::string text(CSimpleIniA::TNamesDepend names) {
    names.sort(CSimpleIniA::Entry::LoadOrder());
    std::vector<std::string> list;
    for (CSimpleIniA::Entry const& each : names) list.emplace_back(each.pItem);
    return test::text(list);
}

/// Saves a file as Koru wants it: without blanks around the equals sign.
void convert(CSimpleIniA& ini, std::string const& path) {
    ini.SetUnicode(true);
    ini.SetSpaces(false);
    ini.SaveFile(path.c_str(), false);
}

} // namespace

TEST_CASE("a value is read") {
    char const* const content = "[Window]\ntitle=Grüße\n";
    Peer ini(content);
    SettingsFile settings(content);
    CHECK(ini.GetValue("Window", "title") == std::string("Grüße"));
    CHECK(text(settings.getValue(L"Window", L"title")) == "Grüße");
}

TEST_CASE("a missing value is empty") {
    Peer ini("[Window]\n");
    SettingsFile settings("[Window]\n");
    CHECK(ini.GetValue("Window", "title") == nullptr);
    CHECK(ini.GetValue("Window", "title", "none") == std::string("none"));
    CHECK(settings.getValue(L"Window", L"title").empty());
}

TEST_CASE("case does not count in ASCII names") {
    char const* const content = "[Window]\nWidth=800\n";
    Peer ini(content);
    SettingsFile settings(content);
    CHECK(ini.GetValue("window", "width") == std::string("800"));
    CHECK(text(settings.getValue(L"window", L"width")) == "800");
}

TEST_CASE("blanks around the equals sign belong to key and value") {
    char const* const content = "[Window]\nwidth = 800\n";
    Peer ini(content);
    SettingsFile settings(content);
    CHECK(ini.GetValue("Window", "width") == std::string("800"));
    CHECK(settings.getValue(L"Window", L"width").empty());
    CHECK(text(settings.getValue(L"Window", L"width ")) == " 800");
}

TEST_CASE("saving puts no blanks around the equals sign") {
    Peer ini("");
    SettingsFile settings("", READ_WRITE);
    ini.SetValue("s", "k", "1");
    CHECK(ini.saved() == "[s]\nk = 1\n");
    ini.SetSpaces(false);
    CHECK(ini.saved() == "[s]\nk=1\n");
    settings.setValue(L"s", L"k", L"1");
    settings.close();
    CHECK(settings.place.bytes() == "[s]\nk=1\n");
}

TEST_CASE("blanks within a header belong to the name") {
    char const* const content = "[ Window ]\nwidth=800\n";
    Peer ini(content);
    SettingsFile settings(content);
    CHECK(ini.GetValue("Window", "width") == std::string("800"));
    CHECK(text(settings.getValue(L" Window ", L"width")) == "800");
}

TEST_CASE("a number is text") {
    char const* const content = "[Window]\nwidth=800px\ncolor=0xFF\n";
    Peer ini(content);
    SettingsFile settings(content);
    CHECK(ini.GetLongValue("Window", "width", 640) == 640);
    CHECK(std::stol(settings.getValue(L"Window", L"width")) == 800);
    CHECK(ini.GetLongValue("Window", "color") == 255);
    CHECK(std::stol(settings.getValue(L"Window", L"color"), nullptr, 0) == 255);
}

TEST_CASE("a flag is text") {
    char const* const content = "[Window]\nopen=yes\n";
    Peer ini(content);
    SettingsFile settings(content);
    CHECK(ini.GetBoolValue("Window", "open"));
    CHECK(settings.getValue(L"Window", L"open") == L"yes");
}

TEST_CASE("comments are lost") {
    char const* const content = "; ours\n[s]\n; pixels\nk = 1\n";
    Peer ini(content);
    SettingsFile settings(content, READ_WRITE);
    CHECK(ini.saved() == "; ours\n\n\n[s]\n\n; pixels\nk = 1\n");
    settings.close();
    CHECK(settings.place.bytes() == "[s]\nk = 1\n");
}

TEST_CASE("both signs begin a comment") {
    char const* const content = "[s]\n;a=1\n#b=2\nc=3\n";
    Peer ini(content);
    SettingsFile settings(content);
    CSimpleIniA::TNamesDepend keys;
    CHECK(ini.GetAllKeys("s", keys));
    CHECK(text(keys) == "c");
    CHECK(text(settings.enumerateKeys(L"s")) == "c");
}

TEST_CASE("entries are sorted") {
    char const* const content = "[b]\nz = 1\na = 2\n\n\n[a]\nk = 3\n";
    Peer ini(content);
    SettingsFile settings(content, READ_WRITE);
    CHECK(ini.saved() == content);
    settings.close();
    CHECK(settings.place.bytes() == "[a]\nk = 3\n[b]\na = 2\nz = 1\n");
}

TEST_CASE("of equal keys the first counts") {
    char const* const content = "[s]\nk=1\nk=2\n";
    Peer ini(content);
    SettingsFile settings(content);
    CHECK(ini.GetValue("s", "k") == std::string("2"));
    CHECK(text(settings.getValue(L"s", L"k")) == "1");
}

TEST_CASE("equal keys are read one after another") {
    char const* const content = "[s]\nk=1\nk=2\n";
    Peer ini(content, true);
    SettingsFile settings(content);
    CSimpleIniA::TNamesDepend values;
    CHECK(ini.GetAllValues("s", "k", values));
    CHECK(text(values) == "1|2");
    CHECK(text(settings.getValue(L"s", L"k")) == "1");
    settings.removeKey(L"s", L"k");
    CHECK(text(settings.getValue(L"s", L"k")) == "2");
}

TEST_CASE("a value has one line") {
    char const* const content = "[s]\nk = <<<END\none\ntwo\nEND\n";
    Peer ini(content, false, true);
    SettingsFile settings(content);
    CHECK(ini.GetValue("s", "k") == std::string("one\ntwo"));
    CHECK(text(settings.getValue(L"s", L"k ")) == " <<<END");
}

TEST_CASE("an entry before the first header is ignored") {
    char const* const content = "width=800\n";
    Peer ini(content);
    SettingsFile settings(content);
    CHECK(ini.GetValue("", "width") == std::string("800"));
    CHECK(settings.getValue(L"", L"width").empty());
}

TEST_CASE("a line that is not an entry is ignored") {
    char const* const content = "[Window]\nwidth\nheight=600\n";
    Peer ini(content);
    SettingsFile settings(content);
    CSimpleIniA::TNamesDepend keys;
    CHECK(ini.GetAllKeys("Window", keys));
    CHECK(text(keys) == "height");
    CHECK(text(settings.enumerateKeys(L"Window")) == "height");
}

TEST_CASE("a section without keys is gone") {
    Peer ini("[Empty]\n");
    SettingsFile settings("[Empty]\n");
    CHECK(ini.SectionExists("Empty"));
    CHECK(settings.enumerateSections().empty());
}

TEST_CASE("a byte order mark hides the first header") {
    char const* const content = "\xEF\xBB\xBF[s]\nk=1\n";
    Peer ini(content);
    SettingsFile settings(content);
    CHECK(ini.GetValue("s", "k") == std::string("1"));
    CHECK(settings.enumerateSections().empty());
}

TEST_CASE("a carriage return stays") {
    char const* const content = "[s]\r\nk=1\r\n";
    Peer ini(content);
    SettingsFile settings(content);
    CHECK(ini.GetValue("s", "k") == std::string("1"));
    CHECK(text(settings.getValue(L"s]\r", L"k")) == "1\r");
}

TEST_CASE("sections and keys are listed") {
    char const* const content = "[a]\nx=1\ny=2\n[b]\nz=3\n";
    Peer ini(content);
    SettingsFile settings(content);
    CSimpleIniA::TNamesDepend names;
    ini.GetAllSections(names);
    CHECK(text(names) == "a|b");
    CHECK(text(settings.enumerateSections()) == "a|b");
    ini.GetAllKeys("a", names);
    CHECK(text(names) == "x|y");
    CHECK(text(settings.enumerateKeys(L"a")) == "x|y");
}

TEST_CASE("a key is removed") {
    char const* const content = "[s]\na=1\nb=2\n";
    Peer ini(content);
    SettingsFile settings(content);
    CHECK(ini.Delete("s", "a"));
    CHECK(ini.GetValue("s", "a") == nullptr);
    settings.removeKey(L"s", L"a");
    CHECK(text(settings.enumerateKeys(L"s")) == "b");
}

TEST_CASE("a section is removed by a loop") {
    char const* const content = "[s]\na=1\nb=2\nc=3\n";
    Peer ini(content);
    SettingsFile settings(content);
    CHECK(ini.Delete("s", nullptr));
    CHECK(ini.GetSection("s") == nullptr);
    while (!settings.enumerateKeys(L"s").empty()) settings.removeSection(L"s");
    CHECK(settings.enumerateSections().empty());
}

TEST_CASE("a missing file is an error") {
    Place const place;
    CSimpleIniA ini;
    CHECK(ini.LoadFile(place.path().c_str()) == SI_FILE);
    InitializationFile settings(place.path());
    CHECK(test::messageOf<std::runtime_error>([&] { settings.open(test::READ); }) ==
          "failed to open file.");
}

TEST_CASE("saving needs no call") {
    Place const place;
    place.write("[s]\nk=1\n");
    {
        CSimpleIniA ini;
        CHECK(ini.LoadFile(place.path().c_str()) == SI_OK);
        ini.SetValue("s", "k", "2");
    }
    CHECK(place.bytes() == "[s]\nk=1\n");
    {
        InitializationFile settings(place.path());
        settings.open(READ_WRITE);
        settings.setValue(L"s", L"k", L"2");
    }
    CHECK(place.bytes() == "[s]\nk=2\n");
}

TEST_CASE("a full disk costs the old content") {
    Place const place;
    place.write("[s]\nk=1\n");
    Peer ini("[s]\nk=2\n");
    {
        FullDisk const disk;
        ini.SaveFile(place.path().c_str(), false);
    }
    CHECK(place.bytes() == "[s]\n");
    CHECK(test::afterFullDisk("[s]\nk=1\n") == "[s]\n");
}

TEST_CASE("the whole file is converted") {
    Peer ini("\xEF\xBB\xBF; ours\r\n[ Menu ]\r\nname = File\r\n");
    Place const place;
    convert(ini, place.path());
    InitializationFile settings(place.path());
    settings.open(test::READ);
    CHECK(text(settings.getValue(L"Menu", L"name")) == "File");
    CHECK(place.bytes() == "; ours\n\n\n[Menu]\nname=File\n");
}
