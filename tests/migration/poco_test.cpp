// The rows of docs/migration/poco.md.
#include <doctest/doctest.h>

#include <Poco/AutoPtr.h>
#include <Poco/DateTime.h>
#include <Poco/DateTimeFormat.h>
#include <Poco/DateTimeFormatter.h>
#include <Poco/DateTimeParser.h>
#include <Poco/Environment.h>
#include <Poco/Event.h>
#include <Poco/Exception.h>
#include <Poco/File.h>
#include <Poco/FileChannel.h>
#include <Poco/Message.h>
#include <Poco/Mutex.h>
#include <Poco/Path.h>
#include <Poco/Runnable.h>
#include <Poco/SharedLibrary.h>
#include <Poco/Stopwatch.h>
#include <Poco/String.h>
#include <Poco/Thread.h>
#include <Poco/Timespan.h>
#include <Poco/UUID.h>
#include <Poco/UUIDGenerator.h>
#include <Poco/UnicodeConverter.h>
#include <Poco/Util/AbstractConfiguration.h>
#include <Poco/Util/IniFileConfiguration.h>
#include <Poco/Util/PropertyFileConfiguration.h>

#include <filesystem>
#include <fstream>
#include <mutex>
#include <sstream>
#include <string>
#include <thread>
#include <vector>

#include <koru/datetime.h>
#include <koru/dynamiclibrary.h>
#include <koru/event.h>
#include <koru/logfile.h>
#include <koru/mutex.h>
#include <koru/system.h>
#include <koru/thread.h>
#include <koru/timer.h>
#include <koru/uuid.h>

#include "migration/both.h"

using Poco::Util::AbstractConfiguration;
using Poco::Util::IniFileConfiguration;
using Poco::Util::PropertyFileConfiguration;
using test::FullDisk;
using test::InitializationFile;
using test::messageOf;
using test::OwnFile;
using test::Place;
using test::PropertyFile;
using test::READ;
using test::READ_WRITE;
using test::SettingsFile;
using test::text;

namespace {

using Keys = AbstractConfiguration::Keys;

Poco::AutoPtr<IniFileConfiguration> ini(std::string const& bytes) {
    std::istringstream stream(bytes);
    return new IniFileConfiguration(stream);
}

Poco::AutoPtr<PropertyFileConfiguration> propertiesOf(std::string const& bytes) {
    std::istringstream stream(bytes);
    return new PropertyFileConfiguration(stream);
}

std::string saved(PropertyFileConfiguration const& configuration) {
    std::ostringstream bytes;
    configuration.save(bytes);
    return bytes.str();
}

/// Sets all that a configuration of two levels, such as an INI file's, has in a settings file.
void convert(AbstractConfiguration const& from, InitializationFile& to) {
    Keys sections;
    from.keys(sections);
    for (std::string const& section : sections) {
        Keys keys;
        from.keys(section, keys);
        for (std::string const& key : keys) {
            to.setValue(Koru::make_wstring(section), Koru::make_wstring(key),
                        Koru::make_wstring(from.getRawString(section + "." + key)));
        }
    }
}

} // namespace

TEST_CASE("a value is read") {
    char const* const content = "[Window]\ntitle=Grüße\n";
    auto const peer = ini(content);
    SettingsFile settings(content);
    CHECK(peer->getString("Window.title") == "Grüße");
    CHECK(text(settings.getValue(L"Window", L"title")) == "Grüße");
}

TEST_CASE("a missing value is empty") {
    auto const peer = ini("[Window]\n");
    SettingsFile settings("[Window]\n");
    CHECK_THROWS_AS(peer->getString("Window.title"), Poco::NotFoundException);
    CHECK(peer->getString("Window.title", "none") == "none");
    CHECK(settings.getValue(L"Window", L"title").empty());
}

TEST_CASE("case does not count in names") {
    char const* const content = "[Window]\nWidth=800\n";
    auto const peer = ini(content);
    SettingsFile settings(content);
    CHECK(peer->getString("window.width") == "800");
    CHECK(text(settings.getValue(L"window", L"width")) == "800");
}

TEST_CASE("blanks around the equals sign belong to key and value") {
    char const* const content = "[Window]\nwidth = 800\n";
    auto const peer = ini(content);
    SettingsFile settings(content);
    CHECK(peer->getString("Window.width") == "800");
    CHECK(settings.getValue(L"Window", L"width").empty());
    CHECK(text(settings.getValue(L"Window", L"width ")) == " 800");
}

TEST_CASE("of equal keys the first counts") {
    char const* const content = "[s]\nk=1\nk=2\n";
    auto const peer = ini(content);
    SettingsFile settings(content);
    CHECK(peer->getString("s.k") == "2");
    CHECK(text(settings.getValue(L"s", L"k")) == "1");
}

TEST_CASE("a number is text") {
    char const* const content = "[Window]\nwidth=800px\ncolor=0xFF\n";
    auto const peer = ini(content);
    SettingsFile settings(content);
    CHECK_THROWS_AS(peer->getInt("Window.width"), Poco::SyntaxException);
    CHECK(std::stol(settings.getValue(L"Window", L"width")) == 800);
    CHECK(peer->getInt("Window.color") == 255);
    CHECK(std::stol(settings.getValue(L"Window", L"color"), nullptr, 0) == 255);
}

TEST_CASE("references are not followed") {
    char const* const content = "[Files]\nhome=/srv\nlog=${Files.home}/log\n";
    auto const peer = ini(content);
    SettingsFile settings(content);
    CHECK(peer->getString("Files.log") == "/srv/log");
    CHECK(text(settings.getValue(L"Files", L"log")) == "${Files.home}/log");
}

TEST_CASE("an entry before the first header is ignored") {
    char const* const content = "width=800\n";
    auto const peer = ini(content);
    SettingsFile settings(content);
    CHECK(peer->getString("width") == "800");
    CHECK(settings.getValue(L"", L"width").empty());
}

TEST_CASE("sections and keys are listed") {
    char const* const content = "[a]\nx=1\ny=2\n[b]\nz=3\n";
    auto const peer = ini(content);
    SettingsFile settings(content);
    Keys names;
    peer->keys(names);
    CHECK(text(names) == "a|b");
    CHECK(text(settings.enumerateSections()) == "a|b");
    peer->keys("a", names);
    CHECK(text(names) == "x|y");
    CHECK(text(settings.enumerateKeys(L"a")) == "x|y");
}

TEST_CASE("a flat file minds case as little") {
    char const* const content = "Width=800\n";
    auto const peer = propertiesOf(content);
    OwnFile<PropertyFile> properties(content, READ);
    CHECK_FALSE(peer->has("width"));
    CHECK(text(properties.getValue(L"width")) == "800");
}

TEST_CASE("a colon does not end a key") {
    char const* const content = "width: 800\n";
    auto const peer = propertiesOf(content);
    OwnFile<PropertyFile> properties(content, READ);
    CHECK(peer->getString("width") == "800");
    CHECK(properties.enumerateKeys().empty());
}

TEST_CASE("a backslash stays") {
    char const* const content = "title=one\\\ntwo\nname=a\\tb\n";
    auto const peer = propertiesOf(content);
    OwnFile<PropertyFile> properties(content, READ);
    CHECK(peer->getString("title") == "onetwo");
    CHECK(text(properties.getValue(L"title")) == "one\\");
    CHECK(peer->getString("name") == "a\tb");
    CHECK(text(properties.getValue(L"name")) == "a\\tb");
}

TEST_CASE("an exclamation mark begins no comment") {
    char const* const content = "!a=1\n#b=2\n";
    auto const peer = propertiesOf(content);
    OwnFile<PropertyFile> properties(content, READ);
    CHECK_FALSE(peer->has("!a"));
    CHECK(text(properties.enumerateKeys()) == "!a");
}

TEST_CASE("saving writes an equals sign") {
    auto const peer = propertiesOf("b=2\na=1\n");
    OwnFile<PropertyFile> properties("b=2\na=1\n", READ_WRITE);
    CHECK(saved(*peer) == "a: 1\nb: 2\n");
    properties.close();
    CHECK(properties.bytes() == "b=2\na=1\n");
}

TEST_CASE("a relative path starts at the executable") {
    Poco::Path const peer = Poco::Path("app.ini").makeAbsolute();
    Koru::File::Path const path("app.ini");
    CHECK(peer.parent().toString() == Poco::Path::current());
    Koru::File::Path const program(Koru::System::getProcessFileName());
    CHECK(path.getDirectory() == program.getDirectory());
}

TEST_CASE("a path is kept in parts") {
    Poco::Path const peer("/srv/reports/march.txt");
    Koru::File::Path const path("/srv/reports/march.txt");
    CHECK(peer.getFileName() == "march.txt");
    CHECK(text(path.getName()) == "march.txt");
    CHECK(peer.parent().toString() == "/srv/reports/");
    CHECK(text(path.getDirectory()) == "/srv/reports/");
    CHECK(peer.toString() == text(path));
}

TEST_CASE("copying a file copies nothing") {
    Place const from;
    Place const to;
    from.write("content");
    Poco::File(from.path()).copyTo(to.path());
    CHECK(to.bytes() == "content");
    CHECK(Koru::File::copy(Koru::make_wstring(from.path()), Koru::make_wstring(to.path())));
    CHECK(to.bytes() != "content");
    auto const always = std::filesystem::copy_options::overwrite_existing;
    std::filesystem::copy_file(from.path(), to.path(), always);
    CHECK(to.bytes() == "content");
}

TEST_CASE("removing what is missing succeeds") {
    Place const place;
    CHECK_THROWS_AS(Poco::File(place.path()).remove(), Poco::FileNotFoundException);
    CHECK(Koru::File::remove(Koru::make_wstring(place.path())));
}

TEST_CASE("a thread is an object with a function") {
    struct Work : Poco::Runnable {
        void run() override { done = true; }
        bool done = false;
    } work;
    Poco::Thread peer;
    peer.start(work);
    peer.join();
    CHECK(work.done);
    struct Thread : Koru::Thread {
        void* run(void* argument) override {
            *static_cast<bool*>(argument) = true;
            return nullptr;
        }
    } thread;
    bool done = false;
    CHECK(thread.start(&done));
    thread.join();
    CHECK(done);
}

TEST_CASE("a lock that takes too long is an exception") {
    Poco::Mutex peer;
    Koru::Mutex mutex;
    Poco::Mutex::ScopedLock const first(peer);
    std::lock_guard<Koru::Mutex> const second(mutex);
    std::thread([&] {
        CHECK_FALSE(peer.tryLock(20));
        CHECK(messageOf<std::runtime_error>([&] { mutex.lock(20); }) ==
              "failed to obtain mutex within timeout");
    }).join();
}

TEST_CASE("a wait does not see an earlier signal") {
    Poco::Event peer(Poco::Event::EVENT_AUTORESET);
    Koru::Event event(true);
    peer.set();
    event.signal();
    CHECK(peer.tryWait(0));
    CHECK(event.wait(0) == 1);
    CHECK(event.test());
}

TEST_CASE("a date is local time") {
    Poco::DateTime const peer(2026, 11, 22, 14, 30, 5);
    Koru::DateTime const date("2026-11-22 14:30:05");
    std::string const written =
        Poco::DateTimeFormatter::format(peer, Poco::DateTimeFormat::SORTABLE_FORMAT);
    CHECK(written == "2026-11-22 14:30:05");
    CHECK(static_cast<std::string>(date) == "2026-11-22 14:30:05");
    ::setenv("TZ", "CET-1", 1);
    CHECK(peer.timestamp().epochTime() - static_cast<long>(date) == 3600);
    ::setenv("TZ", "UTC", 1);
}

TEST_CASE("the day is not checked against the month") {
    CHECK_FALSE(Poco::DateTime::isValid(2026, 2, 31));
    Koru::DateTime const date("2026-02-31", Koru::DateTime::DATE);
    CHECK(int{date.getDay()} == 31);
}

TEST_CASE("a stopwatch has steps of 128 seconds") {
    Poco::Stopwatch peer;
    peer.start();
    Koru::Timer const timer;
    Koru::Thread::sleep(5);
    CHECK(peer.elapsed() >= 4000);
    std::ostringstream elapsed;
    elapsed << timer;
    CHECK((elapsed.str() == "0.000" || elapsed.str() == "128.000"));
}

TEST_CASE("an identifier is not made") {
    Poco::UUID const peer = Poco::UUIDGenerator::defaultGenerator().createRandom();
    std::string fromKernel;
    std::ifstream("/proc/sys/kernel/random/uuid") >> fromKernel;
    Koru::Uuid const uuid(fromKernel);
    CHECK_FALSE(peer.isNull());
    CHECK(uuid != Koru::Uuid());
    CHECK(static_cast<std::string>(Koru::Uuid(peer.toString())) == peer.toString());
}

TEST_CASE("text that is not an identifier is zero") {
    CHECK_THROWS_AS(Poco::UUID("no identifier"), Poco::SyntaxException);
    CHECK(Koru::Uuid("no identifier") == Koru::Uuid());
}

TEST_CASE("a library that cannot be loaded is false") {
    CHECK_THROWS_AS(Poco::SharedLibrary("/none.so"), Poco::LibraryLoadException);
    CHECK_FALSE(Koru::DynamicLibrary(L"/none.so").load());
}

TEST_CASE("a missing symbol is null") {
    Poco::SharedLibrary peer("libm.so.6");
    Koru::DynamicLibrary library(L"libm.so.6");
    CHECK_THROWS_AS(peer.getSymbol("none"), Poco::NotFoundException);
    CHECK(peer.hasSymbol("cbrt"));
    REQUIRE(library.load());
    CHECK(library.getSymbol(L"none") == nullptr);
    CHECK(library.getSymbol(L"cbrt") != nullptr);
}

TEST_CASE("a line in a log ends where the program ends it") {
    Place const first;
    Place const second;
    Poco::AutoPtr<Poco::FileChannel> channel(new Poco::FileChannel(first.path()));
    channel->log(Poco::Message("", "started", Poco::Message::PRIO_INFORMATION));
    channel->close();
    CHECK(first.bytes() == "started\n");
    Koru::LogFile log(second.path());
    log.open(READ_WRITE);
    log.write("started\n", 8).flush();
    CHECK(second.bytes() == "started\n");
}

TEST_CASE("comparison ignores case") {
    std::string const title = "Title";
    CHECK(Poco::icompare(title, "TITLE") == 0);
    CHECK(Koru::compare("Title", "TITLE") == 0);
}

TEST_CASE("text becomes wide") {
    std::wstring wide;
    Poco::UnicodeConverter::convert("Grüße", wide);
    CHECK(text(wide) == "Grüße");
    CHECK(Koru::make_wstring("Grüße") == wide);
}

TEST_CASE("the host has a name") {
    CHECK(Poco::Environment::nodeName() == text(Koru::System::getName()));
}

TEST_CASE("a full disk costs the old content") {
    Place const place;
    place.write("k: 1\n");
    auto const peer = propertiesOf("k: 2\n");
    {
        FullDisk const disk;
        CHECK_THROWS(peer->save(place.path()));
    }
    CHECK(place.bytes() == "k: 2");
    CHECK(test::afterFullDisk("[s]\nk=1\n") == "[s]\n");
}

TEST_CASE("the whole file is converted") {
    auto const peer = ini("; ours\n[Menu]\nname = File\n");
    SettingsFile settings("", READ_WRITE);
    convert(*peer, settings);
    settings.close();
    CHECK(settings.place.bytes() == "[Menu]\nname=File\n");
}
