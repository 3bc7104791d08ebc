// The C locales that names are compared under: those of the machine, and some that fold characters
// in a way of their own, compiled for the test where they can be.
#ifndef KORU_TESTS_LOCALES_H
#define KORU_TESTS_LOCALES_H

#include <doctest/doctest.h>

#include <locale.h>
#include <stdlib.h>

#include <filesystem>
#include <sstream>
#include <string>
#include <vector>

#include "support/subprocess.h"
#include "support/tempdir.h"

#if defined(__SANITIZE_ADDRESS__)
// Each newlocale of glibc that looks into LOCPATH keeps the list that it makes of it.
// NOLINTNEXTLINE(bugprone-reserved-identifier,readability-identifier-naming)
extern "C" inline __attribute__((used)) char const* __lsan_default_suppressions() {
    return "leak:argz_add_sep";
}
#endif

namespace test {

/// A locale for the calls of this thread, for the time of a scope.
class ThreadLocale {
public:
    explicit ThreadLocale(locale_t locale) : previous_(::uselocale(locale)) {}
    ThreadLocale(ThreadLocale const&) = delete;
    ThreadLocale& operator=(ThreadLocale const&) = delete;
    ~ThreadLocale() { ::uselocale(previous_); }

private:
    locale_t previous_;
};

struct NamedLocale {
    std::string name;
    locale_t locale;
};

class Locales {
public:
    Locales() {
        std::istringstream installed(test::execute("/usr/bin/locale", {"locale", "-a"}).out);
        for (std::string name; std::getline(installed, name);) add(name);
        if (all_.empty()) add("C");
        // Turkish pairs i and I otherwise, and in the Latin ones bytes above 0x7F have case.
        compile("tr_TR.UTF-8", "tr_TR", "UTF-8");
        compile("tr_TR.ISO-8859-9", "tr_TR", "ISO-8859-9");
        compile("de_DE.ISO-8859-1", "de_DE", "ISO-8859-1");
        ::setenv("LOCPATH", directory_.path().c_str(), 1);
        for (std::string const& name : compiled_) add(name);
        ::unsetenv("LOCPATH");
    }
    Locales(Locales const&) = delete;
    Locales& operator=(Locales const&) = delete;
    ~Locales() {
        for (NamedLocale const& each : all_) ::freelocale(each.locale);
    }

    std::vector<NamedLocale> const& all() const { return all_; }

private:
    void compile(std::string const& name, std::string const& source, std::string const& charset) {
        test::execute("/usr/bin/localedef",
                      {"localedef", "--quiet", "-i", source, "-f", charset, directory_ / name});
        if (std::filesystem::exists(directory_ / name))
            compiled_.push_back(name);
        else
            tellMissing(name);
    }

    void add(std::string const& name) {
        locale_t const locale = ::newlocale(LC_ALL_MASK, name.c_str(), nullptr);
        if (locale != nullptr)
            all_.push_back({name, locale});
        else
            tellMissing(name);
    }

    static void tellMissing(std::string const& name) {
        MESSAGE("not tested, as this machine lacks it: locale " << name);
    }

    TempDir directory_;
    std::vector<std::string> compiled_;
    std::vector<NamedLocale> all_;
};

/// Calls `use` under each of the locales in turn.
template <class Use>
void inEachLocale(Use use) {
    static Locales const locales; // compiling one takes a second
    for (NamedLocale const& each : locales.all()) {
        CAPTURE(each.name);
        ThreadLocale const locale(each.locale);
        use();
    }
}

} // namespace test

#endif
