#include "settings/render.h"

#include <cstdint>
#include <cstring>
#include <limits>
#include <new>

namespace Koru {

namespace {

/// Counts the bytes that a text takes at the most.
class Counter {
public:
    void put(char) { ++size_; }
    void put(StoredText const& text) {
        std::wstring const* const wide = text.wide();
        size_ += wide ? encodedBound(wide->data(), wide->size()) : text.bytes().size();
    }

    std::size_t size() const {
        if (size_ > std::numeric_limits<std::size_t>::max()) throw std::bad_alloc();
        return static_cast<std::size_t>(size_);
    }

private:
    std::uint64_t size_ = 0;
};

/// Writes text as make_string gives it to memory that is large enough.
class Writer {
public:
    explicit Writer(char* to) : to_(to) {}
    void put(char c) { *to_++ = c; }
    void put(StoredText const& text) {
        if (std::wstring const* const wide = text.wide()) {
            to_ = encode(wide->data(), wide->size(), to_);
            return;
        }
        std::string_view const bytes = text.bytes();
        std::memcpy(to_, bytes.data(), bytes.size());
        to_ += bytes.size();
    }

    char const* end() const { return to_; }

private:
    char* to_;
};

template <class Sink>
void _emit(SettingsTable const& table, Headers headers, Sink& sink) {
    SettingsTable::Entry const* previous = nullptr;
    for (SettingsTable::Entry const& entry : table.entries()) {
        if (headers == Headers::OF_SECTIONS &&
            (previous == nullptr || !table.sameSection(*previous, entry))) {
            sink.put('[');
            sink.put(table.sectionOf(entry));
            sink.put(']');
            sink.put('\n');
        }
        sink.put(entry.key);
        sink.put('=');
        sink.put(entry.value);
        sink.put('\n');
        previous = &entry;
    }
}

} // namespace

RenderedText render(SettingsTable const& table, Headers headers) {
    Counter counter;
    _emit(table, headers, counter);
    std::unique_ptr<char[]> bytes(new char[counter.size()]);
    Writer writer(bytes.get());
    _emit(table, headers, writer);
    auto const size = static_cast<std::size_t>(writer.end() - bytes.get());
    return RenderedText(std::move(bytes), size);
}

} // namespace Koru
