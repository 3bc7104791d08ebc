// The rows of docs/migration/qsettings.md.
#include <doctest/doctest.h>

#include <QtCore/QByteArray>
#include <QtCore/QSettings>
#include <QtCore/QSize>
#include <QtCore/QStringList>

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

QString wide(std::string const& bytes) { return QString::fromStdString(bytes); }
std::string text(QString const& string) { return string.toStdString(); }
std::string text(QStringList const& list) { return text(list.join("|")); }

/// The path of a file with these bytes.
std::string const& with(Place const& place, std::string const& bytes) {
    place.write(bytes);
    return place.path();
}

/// A QSettings on a file of its own.
struct Peer : test::HasPlace, QSettings {
    explicit Peer(std::string const& bytes = "")
        : QSettings(wide(with(place, bytes)), QSettings::IniFormat) {}

    /// What it writes.
    std::string saved() {
        sync();
        return place.bytes();
    }
};

/// Sets all that a QSettings has in a settings file. Turn values that are not text into text first.
void convert(QSettings const& from, InitializationFile& to) {
    for (QString const& name : from.allKeys()) {
        int const slash = name.indexOf('/');
        QString const section = slash < 0 ? "General" : name.left(slash);
        to.setValue(section.toStdWString(), name.mid(slash + 1).toStdWString(),
                    from.value(name).toString().toStdWString());
    }
}

} // namespace

TEST_CASE("a value is read") {
    char const* const content = "[Window]\ntitle=Hello\n";
    Peer peer(content);
    SettingsFile settings(content);
    CHECK(text(peer.value("Window/title").toString()) == "Hello");
    CHECK(text(settings.getValue(L"Window", L"title")) == "Hello");
}

TEST_CASE("a missing value is empty") {
    Peer peer("[Window]\n");
    SettingsFile settings("[Window]\n");
    CHECK(peer.value("Window/width", 640).toInt() == 640);
    std::wstring const width = settings.getValue(L"Window", L"width");
    CHECK((width.empty() ? 640 : std::stoi(width)) == 640);
}

TEST_CASE("a key is listed if it is there") {
    char const* const content = "[Window]\ntitle=\n";
    Peer peer(content);
    SettingsFile settings(content);
    CHECK(peer.contains("Window/title"));
    CHECK(text(settings.enumerateKeys(L"Window")) == "title");
}

TEST_CASE("case does not count in names") {
    char const* const content = "[Window]\nWidth=800\n";
    Peer peer(content);
    SettingsFile settings(content);
    CHECK_FALSE(peer.contains("Window/width"));
    CHECK(text(settings.getValue(L"window", L"width")) == "800");
}

TEST_CASE("an entry without a section is ignored") {
    char const* const content = "width=800\n[General]\nheight=600\n";
    Peer peer(content);
    SettingsFile settings(content);
    CHECK(peer.value("width").toInt() == 800);
    CHECK(peer.value("height").toInt() == 600);
    CHECK(settings.getValue(L"", L"width").empty());
    CHECK(text(settings.getValue(L"General", L"height")) == "600");
}

TEST_CASE("blanks around the equals sign belong to key and value") {
    char const* const content = "[Window]\nwidth = 800\n";
    Peer peer(content);
    SettingsFile settings(content);
    CHECK(peer.value("Window/width").toInt() == 800);
    CHECK(settings.getValue(L"Window", L"width").empty());
    CHECK(text(settings.getValue(L"Window", L"width ")) == " 800");
}

TEST_CASE("quotes belong to the value") {
    char const* const content = R"([Window]
title="one; two"
)";
    Peer peer(content);
    SettingsFile settings(content);
    CHECK(text(peer.value("Window/title").toString()) == "one; two");
    CHECK(text(settings.getValue(L"Window", L"title")) == R"("one; two")");
}

TEST_CASE("a comment needs its own line") {
    char const* const content = "[Window]\nwidth=800 ; pixels\n";
    Peer peer(content);
    SettingsFile settings(content);
    CHECK(text(peer.value("Window/width").toString()) == "800");
    CHECK(text(settings.getValue(L"Window", L"width")) == "800 ; pixels");
}

TEST_CASE("escapes stay as they are") {
    char const* const content = R"([Window]
title=one\ntwo\x41
)";
    Peer peer(content);
    SettingsFile settings(content);
    CHECK(text(peer.value("Window/title").toString()) == "one\ntwoA");
    CHECK(text(settings.getValue(L"Window", L"title")) == R"(one\ntwo\x41)");
}

TEST_CASE("text is UTF-8") {
    char const* const content = "[Window]\ntitle=Grüße\n";
    Peer peer(content);
    SettingsFile settings(content);
    CHECK(text(settings.getValue(L"Window", L"title")) == "Grüße");
    CHECK(text(peer.value("Window/title").toString()) == "GrÃ¼Ã\u009Fe");
    Peer utf8(content);
    utf8.setIniCodec("UTF-8");
    CHECK(text(utf8.value("Window/title").toString()) == "Grüße");
}

TEST_CASE("names are not encoded") {
    char const* const content = "[My%20Window]\nthe%20title=Hello\n";
    Peer peer(content);
    SettingsFile settings(content);
    CHECK(text(peer.value("My Window/the title").toString()) == "Hello");
    CHECK(text(settings.getValue(L"My%20Window", L"the%20title")) == "Hello");
}

TEST_CASE("a list is one text") {
    char const* const content = "[Files]\nrecent=a, b, \"c, d\"\n";
    Peer peer(content);
    SettingsFile settings(content);
    CHECK(text(peer.value("Files/recent").toStringList()) == "a|b|c, d");
    CHECK(text(settings.getValue(L"Files", L"recent")) == R"(a, b, "c, d")");
}

TEST_CASE("a group within a group is a part of the key") {
    char const* const content = R"([Window]
left\width=200
)";
    Peer peer(content);
    SettingsFile settings(content);
    CHECK(peer.value("Window/left/width").toInt() == 200);
    CHECK(text(settings.getValue(L"Window", L"left\\width")) == "200");
}

TEST_CASE("an array is keys with numbers") {
    Peer peer;
    peer.beginWriteArray("users");
    peer.setArrayIndex(0);
    peer.setValue("name", "ann");
    peer.endArray();
    SettingsFile settings(peer.saved());
    CHECK(text(settings.getValue(L"users", L"1\\name")) == "ann");
    CHECK(text(settings.getValue(L"users", L"size")) == "1");
}

TEST_CASE("a value of another type is its text") {
    Peer peer;
    peer.setValue("Window/size", QSize(800, 600));
    peer.setValue("Window/state", QByteArray("\x01\x02", 2));
    SettingsFile settings(peer.saved());
    CHECK(text(settings.getValue(L"Window", L"size")) == "@Size(800 600)");
    CHECK(text(settings.getValue(L"Window", L"state")) == R"(@ByteArray(\x1\x2))");
}

TEST_CASE("a flag is text") {
    char const* const content = "[Window]\nopen=true\n";
    Peer peer(content);
    SettingsFile settings(content);
    CHECK(peer.value("Window/open").toBool());
    CHECK(settings.getValue(L"Window", L"open") == L"true");
}

TEST_CASE("sorting ignores case") {
    char const* const content = "[s]\nb=1\na=2\nC=3\n";
    Peer peer(content);
    SettingsFile settings(content, READ_WRITE);
    peer.setValue("s/b", 4);
    CHECK(peer.saved() == "[s]\nC=3\na=2\nb=4\n");
    settings.setValue(L"s", L"b", L"4");
    settings.close();
    CHECK(settings.place.bytes() == "[s]\na=2\nb=4\nC=3\n");
}

TEST_CASE("comments are lost") {
    char const* const content = "; ours\n[s]\nk=1\n";
    Peer peer(content);
    SettingsFile settings(content, READ_WRITE);
    peer.setValue("s/k", 2);
    CHECK(peer.saved() == "[s]\nk=2\n");
    settings.close();
    CHECK(settings.place.bytes() == "[s]\nk=1\n");
}

TEST_CASE("a file is written though nothing has changed") {
    char const* const content = "; ours\n[s]\nk=1\n";
    Peer peer(content);
    SettingsFile settings(content, READ_WRITE);
    CHECK(peer.saved() == content);
    settings.synchronize();
    CHECK(settings.place.bytes() == "[s]\nk=1\n");
}

TEST_CASE("of equal keys the first counts") {
    char const* const content = "[s]\nk=1\nk=2\n";
    Peer peer(content);
    SettingsFile settings(content);
    CHECK(peer.value("s/k").toInt() == 2);
    CHECK(text(settings.getValue(L"s", L"k")) == "1");
}

TEST_CASE("a carriage return stays") {
    char const* const content = "[s]\r\nk=1\r\n";
    Peer peer(content);
    SettingsFile settings(content);
    CHECK(text(peer.value("s/k").toString()) == "1");
    CHECK(text(settings.getValue(L"s]\r", L"k")) == "1\r");
}

TEST_CASE("sections and keys are listed") {
    char const* const content = "[a]\nx=1\ny=2\n[b]\nz=3\n";
    Peer peer(content);
    SettingsFile settings(content);
    CHECK(text(peer.childGroups()) == "a|b");
    CHECK(text(settings.enumerateSections()) == "a|b");
    peer.beginGroup("a");
    CHECK(text(peer.childKeys()) == "x|y");
    CHECK(text(settings.enumerateKeys(L"a")) == "x|y");
}

TEST_CASE("a section is removed by a loop") {
    char const* const content = "[s]\na=1\nb=2\nc=3\n";
    Peer peer(content);
    SettingsFile settings(content);
    peer.remove("s");
    CHECK(peer.allKeys().isEmpty());
    while (!settings.enumerateKeys(L"s").empty()) settings.removeSection(L"s");
    CHECK(settings.enumerateSections().empty());
}

TEST_CASE("two objects on one file do not see each other") {
    char const* const content = "[s]\nk=1\n";
    Peer peer(content);
    SettingsFile settings(content);
    QSettings second(peer.fileName(), QSettings::IniFormat);
    peer.setValue("s/k", 2);
    CHECK(second.value("s/k").toInt() == 2);
    InitializationFile other(settings.place.path());
    other.open(test::READ);
    settings.setValue(L"s", L"k", L"2");
    CHECK(text(other.getValue(L"s", L"k")) == "1");
}

TEST_CASE("a missing file is an error") {
    Place const place;
    QSettings peer(wide(place.path()), QSettings::IniFormat);
    CHECK(peer.status() == QSettings::NoError);
    InitializationFile settings(place.path());
    CHECK(test::messageOf<std::runtime_error>([&] { settings.open(test::READ); }) ==
          "failed to open file.");
}

TEST_CASE("a full disk costs the old content") {
    Peer peer("[s]\nk=1\n");
    {
        FullDisk const disk;
        peer.setValue("s/k", 2);
        CHECK(peer.saved() == "[s]\nk=1\n");
        CHECK(peer.status() == QSettings::AccessError);
    }
    CHECK(test::afterFullDisk("[s]\nk=1\n") == "[s]\n");
}

TEST_CASE("the whole file is converted") {
    Peer peer("width=800\n[Window]\ntitle=\"one; two\"\nleft\\width=200\n");
    SettingsFile settings("", READ_WRITE);
    convert(peer, settings);
    settings.close();
    CHECK(settings.place.bytes() ==
          "[General]\nwidth=800\n[Window]\nleft/width=200\ntitle=one; two\n");
}
