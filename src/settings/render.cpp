#include "settings/render.h"

#include <cstdint>
#include <cstring>
#include <limits>
#include <new>

#include "text/convert.h"
#include "text/narrow.h"

namespace Koru {

namespace {

using Entry = SettingsTable::Entry;

std::uint64_t _bound(StoredText const& text) {
    std::wstring const* const wide = text.wide();
    if (wide == nullptr) return text.bytes().size();
    bool const ascii = isAscii(wide->data(), wide->size());
    return ascii ? wide->size() : encodedBound(wide->data(), wide->size());
}

char* _encode(std::wstring const& text, char* to) {
    bool const ascii = isAscii(text.data(), text.size());
    return ascii ? narrow(text.data(), text.size(), to) : encode(text.data(), text.size(), to);
}

/// How many bytes the text takes at most. Counts a header wherever there may be one: whether two
/// names are equal depends on the C locale, and another thread may change that before the writing.
std::uint64_t _bound(SettingsTable const& table, Headers headers) {
    std::uint64_t size = 0;
    Entry const* previous = nullptr;
    for (Entry const& entry : table.entries()) {
        if (headers == Headers::OF_SECTIONS &&
            (previous == nullptr || previous->section != entry.section)) {
            size += _bound(table.sectionOf(entry)) + std::strlen("[]\n");
        }
        size += _bound(entry.key) + _bound(entry.value) + std::strlen("=\n");
        previous = &entry;
    }
    return size;
}

/// Writes to memory that is large enough. Most lines of the new text follow each other just as they
/// do in the bytes of the file that was read; such a run is copied at once.
class Writer {
public:
    Writer(char* to, std::string_view file) : to_(to), fileEnd_(file.data() + file.size()) {}

    void put(char c) {
        if (runEnd_ != run_ && runEnd_ != fileEnd_ && *runEnd_ == c) {
            ++runEnd_;
            return;
        }
        finishRun();
        *to_++ = c;
    }

    void put(StoredText const& text) {
        if (std::wstring const* const wide = text.wide()) {
            finishRun();
            to_ = _encode(*wide, to_);
        } else if (!text.empty()) {
            putOfFile(text.bytes());
        }
    }

    /// The end of what was written.
    char const* finish() {
        finishRun();
        return to_;
    }

private:
    void putOfFile(std::string_view bytes) {
        if (bytes.data() != runEnd_) {
            finishRun();
            run_ = bytes.data();
        }
        runEnd_ = bytes.data() + bytes.size();
    }

    void finishRun() {
        auto const size = static_cast<std::size_t>(runEnd_ - run_);
        if (size != 0) std::memcpy(to_, run_, size);
        to_ += size;
        run_ = runEnd_;
    }

    char* to_;
    char const* run_ = nullptr; // bytes of the file that still have to be copied
    char const* runEnd_ = nullptr;
    char const* fileEnd_;
};

void _write(SettingsTable const& table, Headers headers, Writer& writer) {
    Entry const* previous = nullptr;
    for (Entry const& entry : table.entries()) {
        if (headers == Headers::OF_SECTIONS &&
            (previous == nullptr || !table.sameSection(*previous, entry))) {
            writer.put('[');
            writer.put(table.sectionOf(entry));
            writer.put(']');
            writer.put('\n');
        }
        writer.put(entry.key);
        writer.put('=');
        writer.put(entry.value);
        writer.put('\n');
        previous = &entry;
    }
}

} // namespace

RenderedText render(SettingsTable const& table, Headers headers) {
    std::uint64_t const bound = _bound(table, headers);
    if (bound > std::numeric_limits<std::size_t>::max()) throw std::bad_alloc();
    std::unique_ptr<char[]> bytes(new char[static_cast<std::size_t>(bound)]);
    Writer writer(bytes.get(), table.heldBytes());
    _write(table, headers, writer);
    auto const size = static_cast<std::size_t>(writer.finish() - bytes.get());
    return RenderedText(std::move(bytes), size);
}

} // namespace Koru
