// The C locales that names are compared under: those of the machine, and some that fold characters
// in a way of their own, compiled for the test where they can be.
#ifndef KORU_TESTS_LOCALES_H
#define KORU_TESTS_LOCALES_H

#include <doctest/doctest.h>

#include <locale.h>
#include <stdlib.h>

#include <memory>
#include <sstream>
#include <string>
#include <vector>

#include "support/sanitizers.h"
#include "support/skip.h"
#include "support/subprocess.h"
#include "support/tempdir.h"

#if defined(KORU_ADDRESS_SANITIZER)
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
    std::string path; ///< for LOCPATH, if the C library does not find it elsewhere
    locale_t locale;
};

/// The environment variable as long as the C library looks for a locale.
class LocalePath {
public:
    explicit LocalePath(std::string const& path) {
        if (!path.empty()) ::setenv("LOCPATH", path.c_str(), 1);
    }
    LocalePath(LocalePath const&) = delete;
    LocalePath& operator=(LocalePath const&) = delete;
    ~LocalePath() { ::unsetenv("LOCPATH"); }
};

/// A locale for all threads that have none of their own, for the time of a scope.
class ProcessLocale {
public:
    explicit ProcessLocale(NamedLocale const& locale) {
        LocalePath const path(locale.path);
        REQUIRE(::setlocale(LC_ALL, locale.name.c_str()) != nullptr);
    }
    ProcessLocale(ProcessLocale const&) = delete;
    ProcessLocale& operator=(ProcessLocale const&) = delete;
    ~ProcessLocale() { ::setlocale(LC_ALL, "C"); }
};

class Locales {
public:
    Locales() = default;
    Locales(Locales const&) = delete;
    Locales& operator=(Locales const&) = delete;
    ~Locales() {
        for (NamedLocale const& each : all_) ::freelocale(each.locale);
    }

    std::vector<NamedLocale> const& all() const { return all_; }

    void addInstalled() {
        std::istringstream installed(test::execute("/usr/bin/locale", {"locale", "-a"}).out);
        for (std::string name; std::getline(installed, name);) add(name);
        if (all_.empty()) add("C");
    }

    void compile(std::string const& name, std::string const& source, std::string const& charset) {
        test::execute("/usr/bin/localedef",
                      {"localedef", "--quiet", "-i", source, "-f", charset, directory_ / name});
        add(name, directory_.path());
    }

    void add(std::string const& name, std::string const& path = "") {
        LocalePath const scope(path);
        locale_t const locale = ::newlocale(LC_ALL_MASK, name.c_str(), nullptr);
        if (locale != nullptr)
            all_.push_back({name, path, locale});
        else
            skipped("there is no locale " + name);
    }

private:
    TempDir directory_;
    std::vector<NamedLocale> all_;
};

inline std::vector<NamedLocale> const& allLocales() {
    static auto const locales = [] {
        auto all = std::make_unique<Locales>(); // compiling one takes a second
        all->addInstalled();
        // Turkish pairs i and I differently, and in the Latin ones bytes above 0x7F have case.
        all->compile("tr_TR.UTF-8", "tr_TR", "UTF-8");
        all->compile("tr_TR.ISO-8859-9", "tr_TR", "ISO-8859-9");
        all->compile("de_DE.ISO-8859-1", "de_DE", "ISO-8859-1");
        return all;
    }();
    return locales->all();
}

/// Those that docs/locale.md is about.
inline std::vector<NamedLocale> const& documentedLocales() {
    static auto const locales = [] {
        auto all = std::make_unique<Locales>();
        all->add("C");
        all->add("C.UTF-8");
        all->compile("de_DE.UTF-8", "de_DE", "UTF-8");
        all->compile("tr_TR.UTF-8", "tr_TR", "UTF-8");
        return all;
    }();
    return locales->all();
}

/// Calls `use` under each of the locales in turn.
template <class Use>
void inEachLocale(Use use) {
    for (NamedLocale const& each : allLocales()) {
        CAPTURE(each.name);
        ThreadLocale const locale(each.locale);
        use();
    }
}

} // namespace test

#endif
