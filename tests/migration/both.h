// What the rows of docs/migration share: Koru's settings on the content that the peer has too, and
// a full disk.
#ifndef KORU_TESTS_MIGRATION_BOTH_H
#define KORU_TESTS_MIGRATION_BOTH_H

#include <doctest/doctest.h>

#include <sys/resource.h>

#include <initializer_list>
#include <string>
#include <vector>

#include <koru/file.h>
#include <koru/initializationfile.h>
#include <koru/propertyfile.h>
#include <koru/string.h>

#include "support/filesizelimit.h"
#include "support/ownfile.h"
#include "support/settingsfixture.h"
#include "support/tempdir.h"
#include "support/throws.h"

namespace test {

using Koru::File;
using Koru::InitializationFile;
using Koru::PropertyFile;

/// What Koru gives, as the bytes that most peers give.
inline std::string text(std::wstring const& wide) { return Koru::make_string(wide); }

/// A list in one text, to compare: "one|two".
inline std::string text(std::vector<std::string> const& list) {
    std::string all;
    for (std::string const& each : list) all += (&each == &list.front() ? "" : "|") + each;
    return all;
}
inline std::string text(std::vector<std::wstring> const& list) {
    std::vector<std::string> narrow;
    for (std::wstring const& each : list) narrow.push_back(text(each));
    return text(narrow);
}

/// A disk on which files have room for four bytes, for the time of a scope.
class FullDisk {
public:
    FullDisk() {
        ::getrlimit(RLIMIT_FSIZE, &before_);
        limitFileSize(4);
    }
    FullDisk(FullDisk const&) = delete;
    FullDisk& operator=(FullDisk const&) = delete;
    ~FullDisk() { limitFileSize(before_.rlim_cur); }

private:
    rlimit before_ = {};
};

/// What is left of Koru's file when the disk is full while it is saved, and the object is given up.
inline std::string afterFullDisk(std::string const& bytes) {
    SettingsFile settings(bytes, READ_WRITE);
    {
        FullDisk const disk;
        CHECK(messageOf<std::runtime_error>([&] { settings.close(); }) ==
              "failed to write to file");
    }
    settings.setMode(0);
    std::string const left = settings.place.bytes();
    settings.close();
    return left;
}

} // namespace test

#endif
