// The rows of docs/migration/gkeyfile.md.
#include <doctest/doctest.h>

#include <glib.h>

#include <cstdlib>
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

/// A GKeyFile that frees itself, and what its last call failed with.
struct Peer {
    explicit Peer(std::string const& bytes, GKeyFileFlags flags = G_KEY_FILE_NONE)
        : loaded(g_key_file_load_from_data(file, bytes.data(), bytes.size(), flags, &error)) {}
    Peer(Peer const&) = delete;
    Peer& operator=(Peer const&) = delete;
    ~Peer() {
        g_clear_error(&error);
        g_key_file_free(file);
    }
    // NOLINTNEXTLINE(google-explicit-constructor)
    operator GKeyFile*() const { return file; }

    bool failedWith(int code) const {
        return error != nullptr && error->domain == G_KEY_FILE_ERROR && error->code == code;
    }

    GKeyFile* file = g_key_file_new();
    GError* error = nullptr;
    bool loaded;
};

std::string taken(char* owned) {
    std::string const copy = owned == nullptr ? "<null>" : owned;
    g_free(owned);
    return copy;
}

std::vector<std::string> taken(char** owned) {
    std::vector<std::string> list;
    for (char** each = owned; each != nullptr && *each != nullptr; ++each) list.emplace_back(*each);
    g_strfreev(owned);
    return list;
}

std::string saved(GKeyFile* file) { return taken(g_key_file_to_data(file, nullptr, nullptr)); }

/// Sets all that a GKeyFile has in a settings file: the values decoded, the names as they are.
void convert(GKeyFile* from, InitializationFile& to) {
    for (std::string const& group : taken(g_key_file_get_groups(from, nullptr))) {
        char** const keys = g_key_file_get_keys(from, group.c_str(), nullptr, nullptr);
        for (std::string const& key : taken(keys)) {
            char* const value = g_key_file_get_string(from, group.c_str(), key.c_str(), nullptr);
            to.setValue(Koru::make_wstring(group), Koru::make_wstring(key),
                        Koru::make_wstring(value));
            g_free(value);
        }
    }
}

} // namespace

TEST_CASE("a value is read") {
    char const* const content = "[Window]\ntitle=Grüße\n";
    Peer file(content);
    SettingsFile settings(content);
    CHECK(taken(g_key_file_get_string(file, "Window", "title", &file.error)) == "Grüße");
    CHECK(text(settings.getValue(L"Window", L"title")) == "Grüße");
}

TEST_CASE("a missing value is empty") {
    Peer file("[Window]\n");
    SettingsFile settings("[Window]\n");
    CHECK(taken(g_key_file_get_string(file, "Window", "title", &file.error)) == "<null>");
    CHECK(file.failedWith(G_KEY_FILE_ERROR_KEY_NOT_FOUND));
    CHECK(settings.getValue(L"Window", L"title").empty());
}

TEST_CASE("case does not count in names") {
    char const* const content = "[Window]\nWidth=800\n";
    Peer file(content);
    SettingsFile settings(content);
    CHECK_FALSE(g_key_file_has_key(file, "Window", "width", nullptr));
    CHECK(text(settings.getValue(L"window", L"width")) == "800");
}

TEST_CASE("blanks around the equals sign belong to key and value") {
    char const* const content = "[Window]\nwidth = 800\n";
    Peer file(content);
    SettingsFile settings(content);
    CHECK(taken(g_key_file_get_string(file, "Window", "width", nullptr)) == "800");
    CHECK(settings.getValue(L"Window", L"width").empty());
    CHECK(text(settings.getValue(L"Window", L"width ")) == " 800");
}

TEST_CASE("escapes stay as they are") {
    char const* const content = R"([Window]
title=one\ntwo\s
)";
    Peer file(content);
    SettingsFile settings(content);
    CHECK(taken(g_key_file_get_string(file, "Window", "title", nullptr)) == "one\ntwo ");
    CHECK(text(settings.getValue(L"Window", L"title")) == R"(one\ntwo\s)");
    CHECK(taken(g_key_file_get_value(file, "Window", "title", nullptr)) == R"(one\ntwo\s)");
}

TEST_CASE("what is set is not escaped") {
    Peer file("");
    SettingsFile settings("", READ_WRITE);
    g_key_file_set_string(file, "s", "k", " one\ntwo");
    settings.setValue(L"s", L"k", L" one\ntwo");
    CHECK(saved(file) == "[s]\nk=\\sone\\ntwo\n");
    settings.close();
    CHECK(settings.place.bytes() == "[s]\nk= one\ntwo\n");
}

TEST_CASE("a list is one text") {
    char const* const content = "[Files]\nrecent=a;b;c;\n";
    Peer file(content);
    SettingsFile settings(content);
    auto const list = taken(g_key_file_get_string_list(file, "Files", "recent", nullptr, nullptr));
    CHECK(text(list) == "a|b|c");
    CHECK(text(settings.getValue(L"Files", L"recent")) == "a;b;c;");
}

TEST_CASE("a number is text") {
    char const* const content = "[Window]\nwidth=800px\n";
    Peer file(content);
    SettingsFile settings(content);
    CHECK(g_key_file_get_integer(file, "Window", "width", &file.error) == 0);
    CHECK(file.failedWith(G_KEY_FILE_ERROR_INVALID_VALUE));
    CHECK(std::stoi(settings.getValue(L"Window", L"width")) == 800);
}

TEST_CASE("a flag is text") {
    char const* const content = "[Window]\nopen=true\n";
    Peer file(content);
    SettingsFile settings(content);
    CHECK(g_key_file_get_boolean(file, "Window", "open", nullptr));
    CHECK(settings.getValue(L"Window", L"open") == L"true");
}

TEST_CASE("a translation is a key with its language") {
    char const* const content = "[Menu]\nname=File\nname[de]=Datei\n";
    Peer file(content, G_KEY_FILE_KEEP_TRANSLATIONS);
    SettingsFile settings(content);
    CHECK(taken(g_key_file_get_locale_string(file, "Menu", "name", "fr", nullptr)) == "File");
    CHECK(taken(g_key_file_get_locale_string(file, "Menu", "name", "de", nullptr)) == "Datei");
    CHECK(text(settings.getValue(L"Menu", L"name[de]")) == "Datei");
    CHECK(text(settings.getValue(L"Menu", L"name")) == "File");
}

TEST_CASE("comments are lost") {
    char const* const content = "# ours\n\n[Window]\n# pixels\nwidth=800\n";
    Peer file(content, G_KEY_FILE_KEEP_COMMENTS);
    SettingsFile settings(content, READ_WRITE);
    CHECK(saved(file) == content);
    settings.close();
    CHECK(settings.place.bytes() == "[Window]\nwidth=800\n");
}

TEST_CASE("a semicolon begins a comment too") {
    char const* const content = "[Window]\n;width=800\n";
    Peer file(content);
    SettingsFile settings(content);
    CHECK(g_key_file_has_key(file, "Window", ";width", nullptr));
    CHECK(settings.enumerateKeys(L"Window").empty());
}

TEST_CASE("entries are sorted") {
    char const* const content = "[b]\nz=1\na=2\n\n[a]\nk=3\n";
    Peer file(content);
    SettingsFile settings(content, READ_WRITE);
    CHECK(saved(file) == content);
    settings.close();
    CHECK(settings.place.bytes() == "[a]\nk=3\n[b]\na=2\nz=1\n");
}

TEST_CASE("of equal keys the first counts") {
    char const* const content = "[s]\nk=1\nk=2\n";
    Peer file(content);
    SettingsFile settings(content);
    CHECK(taken(g_key_file_get_string(file, "s", "k", nullptr)) == "2");
    CHECK(text(settings.getValue(L"s", L"k")) == "1");
    CHECK(saved(file) == content);
    CHECK(test::rewritten(content) == content);
}

TEST_CASE("headers with one name are one section") {
    char const* const content = "[s]\na=1\n[t]\nb=2\n[s]\nc=3\n";
    Peer file(content);
    SettingsFile settings(content);
    CHECK(text(taken(g_key_file_get_keys(file, "s", nullptr, nullptr))) == "a|c");
    CHECK(text(settings.enumerateKeys(L"s")) == "a|c");
}

TEST_CASE("an entry before the first header is ignored") {
    char const* const content = "width=800\n[Window]\n";
    Peer file(content);
    SettingsFile settings(content);
    CHECK_FALSE(file.loaded);
    CHECK(file.failedWith(G_KEY_FILE_ERROR_GROUP_NOT_FOUND));
    CHECK(settings.enumerateSections().empty());
}

TEST_CASE("a line that is not an entry is ignored") {
    char const* const content = "[Window]\nwidth\nheight=600\n";
    Peer file(content);
    SettingsFile settings(content);
    CHECK_FALSE(file.loaded);
    CHECK(file.failedWith(G_KEY_FILE_ERROR_PARSE));
    CHECK(text(settings.enumerateKeys(L"Window")) == "height");
}

TEST_CASE("a carriage return stays") {
    char const* const content = "[s]\r\nk=1\r\n";
    Peer file(content);
    SettingsFile settings(content);
    CHECK(taken(g_key_file_get_string(file, "s", "k", nullptr)) == "1");
    CHECK(text(settings.getValue(L"s]\r", L"k")) == "1\r");
}

TEST_CASE("text that is not UTF-8 is not refused") {
    char const* const content = "[s]\nk=\xE9\n";
    Peer file(content);
    SettingsFile settings(content);
    CHECK(taken(g_key_file_get_string(file, "s", "k", &file.error)) == "<null>");
    CHECK(file.failedWith(G_KEY_FILE_ERROR_UNKNOWN_ENCODING));
    CHECK(text(settings.getValue(L"s", L"k")) == "?");
}

TEST_CASE("sections and keys are listed") {
    char const* const content = "[a]\nx=1\ny=2\n[b]\nz=3\n";
    Peer file(content);
    SettingsFile settings(content);
    CHECK(text(taken(g_key_file_get_groups(file, nullptr))) == "a|b");
    CHECK(text(settings.enumerateSections()) == "a|b");
    CHECK(text(taken(g_key_file_get_keys(file, "a", nullptr, nullptr))) == "x|y");
    CHECK(text(settings.enumerateKeys(L"a")) == "x|y");
}

TEST_CASE("a section without keys is gone") {
    char const* const content = "[Empty]\n";
    Peer file(content);
    SettingsFile settings(content);
    CHECK(g_key_file_has_group(file, "Empty"));
    CHECK(settings.enumerateSections().empty());
}

TEST_CASE("a section is removed by a loop") {
    char const* const content = "[s]\na=1\nb=2\nc=3\n";
    Peer file(content);
    SettingsFile settings(content);
    CHECK(g_key_file_remove_group(file, "s", nullptr));
    CHECK(saved(file).empty());
    while (!settings.enumerateKeys(L"s").empty()) settings.removeSection(L"s");
    CHECK(settings.enumerateSections().empty());
}

TEST_CASE("saving needs no call") {
    Place const place;
    place.write("[s]\nk=1\n");
    GKeyFile* const file = g_key_file_new();
    REQUIRE(g_key_file_load_from_file(file, place.path().c_str(), G_KEY_FILE_NONE, nullptr));
    g_key_file_set_integer(file, "s", "k", 2);
    g_key_file_free(file);
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
    Peer file("[s]\nk=2\n");
    {
        FullDisk const disk;
        CHECK_FALSE(g_key_file_save_to_file(file, place.path().c_str(), nullptr));
    }
    CHECK(place.bytes() == "[s]\nk=1\n");
    CHECK(test::afterFullDisk("[s]\nk=1\n") == "[s]\n");
}

TEST_CASE("the whole file is converted") {
    Peer file("# ours\n[Menu]\nname = Fi\\sle\nname[de]=Datei\n", G_KEY_FILE_KEEP_TRANSLATIONS);
    SettingsFile settings("", READ_WRITE);
    convert(file, settings);
    settings.close();
    CHECK(settings.place.bytes() == "[Menu]\nname=Fi le\nname[de]=Datei\n");
}
