// Any calls on paths do what they do to three plain strings; an absolute text is taken apart as the
// plain way does it.
#include <koru/file.h>
#include <koru/string.h>

#include <cstdint>
#include <sstream>
#include <stdexcept>
#include <string>

#include "check.h"
#include "input.h"
#include "textmodel.h"

namespace {

using Koru::File;

struct Parts {
    std::wstring volume, directory, name;
    std::wstring whole() const { return volume + directory + name; }
};

/// Takes an absolute text apart; false where it has no directory below the root.
bool takeApart(std::wstring text, Parts& parts) {
    for (wchar_t& c : text) {
        if (c == L'\\') c = L'/';
    }
    parts = {L"", L"/", L""};
    std::wstring segment;
    for (wchar_t const c : text) {
        if (c != L'/') {
            segment += c;
            continue;
        }
        if (!segment.empty()) parts.directory += segment + L'/';
        segment.clear();
    }
    parts.name = segment;
    return parts.directory.size() > 1;
}

void checkSame(File::Path const& path, Parts const& parts) {
    KORU_CHECK(path.getVolume() == parts.volume);
    KORU_CHECK(path.getDirectory() == parts.directory);
    KORU_CHECK(path.getName() == parts.name);
    std::wstring const whole = path;
    KORU_CHECK(whole == parts.whole());
}

void parse(std::wstring const& text, File::Path& path, Parts& parts) {
    Parts parsed;
    bool const isPath = takeApart(fuzz::upToNul(text), parsed);
    try {
        path = File::Path(text);
        KORU_CHECK(isPath);
        parts = parsed;
    } catch (std::invalid_argument const& e) {
        KORU_CHECK(!isPath && e.what() == std::string("cannot determine path"));
    }
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(std::uint8_t const* data, std::size_t size) {
    fuzz::Input input(data, size);
    File::Path paths[2];
    Parts parts[2];
    while (!input.isAtEnd()) {
        unsigned const which = input.below(2);
        File::Path& path = paths[which];
        Parts& expected = parts[which];
        switch (input.below(6)) {
        case 0:
            path.setVolume(expected.volume = input.name());
            break;
        case 1:
            path.setDirectory(expected.directory = input.name());
            break;
        case 2:
            path.setName(expected.name = input.name());
            break;
        case 3:
            path = paths[1 - which];
            expected = parts[1 - which];
            break;
        case 4:
            parse(L"/" + input.text(), path, expected);
            break;
        default:
            parse(L"/" + Koru::make_wstring(input.bytes()), path, expected);
            break;
        }
        checkSame(path, expected);
        bool const same = Koru::compare(parts[0].whole(), parts[1].whole()) == 0;
        KORU_CHECK((paths[0] == paths[1]) == same && (paths[0] != paths[1]) != same);
    }
    return 0;
}
