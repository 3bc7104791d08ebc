// How much memory the string functions take, and what comes of text that no string can hold. A
// program of its own, since the operators that allocate are replaced for all of it.
#include <koru/string.h>

#include <doctest/doctest.h>

#include <sys/mman.h>
#include <unistd.h>

#include <cstddef>
#include <functional>
#include <new>
#include <string>
#include <vector>

#include "support/failingmemory.h"
#include "support/sanitizers.h"
#include "support/skip.h"
#include "support/throws.h"
#include "text/convert.h"

#if defined(KORU_ADDRESS_SANITIZER)
// What the library exports is in this program a second time.
// NOLINTNEXTLINE(bugprone-reserved-identifier,readability-identifier-naming)
extern "C" __attribute__((used)) char const* __asan_default_options() {
    return "detect_odr_violation=0";
}
#endif

using namespace test;

namespace {

/// The same piece of memory again and again, one after the other, followed by zeros: more text than
/// a machine may have memory for.
class Repeated {
public:
    template <class Char>
    Repeated(Char c, std::size_t count) : size_(count * sizeof(Char)) {
        std::vector<Char> const piece(PIECE / sizeof(Char), c);
        int const file = ::memfd_create("piece", 0);
        REQUIRE(::write(file, piece.data(), PIECE) == PIECE);
        void* const memory = ::mmap(nullptr, size_ + PIECE, PROT_READ | PROT_WRITE,
                                    MAP_PRIVATE | MAP_ANONYMOUS | MAP_NORESERVE, -1, 0);
        if (memory != MAP_FAILED) memory_ = static_cast<char*>(memory);
        if (memory_ == nullptr) test::skipped("the address space has no room for the text");
        for (std::size_t at = 0; memory_ != nullptr && at < size_; at += PIECE) {
            REQUIRE(::mmap(memory_ + at, PIECE, PROT_READ | PROT_WRITE, MAP_SHARED | MAP_FIXED,
                           file, 0) != MAP_FAILED);
        }
        ::close(file);
    }
    Repeated(Repeated const&) = delete;
    Repeated& operator=(Repeated const&) = delete;
    ~Repeated() {
        if (memory_ != nullptr) ::munmap(memory_, size_ + PIECE);
    }

    /// Null where the address space has no room for it.
    void* memory() const { return memory_; }

private:
    static constexpr ssize_t PIECE = 1 << 20;

    std::size_t size_;
    char* memory_ = nullptr;
};

/// Whether there can be text that is too long for a string.
bool canBeTooLong() {
    if (sizeof(void*) == 4) return true;
    test::skipped("with 64 bits no memory holds a text too long for a string");
    return false;
}

/// Holds what comes of a text that is too long for a string.
template <class Char, class Convert>
void checkTooLong(Char c, std::size_t count, Convert convert) {
    CAPTURE(count);
    Repeated const text(c, count);
    if (text.memory() == nullptr) return;
    auto const* const s = static_cast<Char const*>(text.memory());
    CHECK(messageOf<std::bad_alloc>([&] { convert(s); }) == "std::bad_alloc");
}

/// The first size that is too much for a string of such characters, and 2 GiB.
template <class Char>
std::vector<std::size_t> sizesTooLong() {
    std::vector<std::size_t> sizes = {std::basic_string<Char>().max_size() + 1};
    // The sanitizer takes an offset of half the address space for an overflow.
    if (ADDRESS_SPACE_CAN_BE_LIMITED)
        sizes.push_back((std::size_t{1} << 31) / sizeof(Char));
    else
        test::skipped("text of 2 GiB under a sanitizer");
    return sizes;
}

} // namespace

TEST_CASE("make_string takes no memory for what comes after a NUL") {
    for (wchar_t const c : {L'x', L'\u00E9', L'\u4E2D', L'\U0001F600', wchar_t{-2}}) {
        std::wstring text(5000, c);
        text += L'\0';
        text.append(5000000, c);
        AllocatedBytes const allocated;
        std::string const result = Koru::make_string(text);
        CHECK(allocated.count() < 50000);
        CHECK((result == Koru::make_string(std::wstring(5000, c))));
    }
}

TEST_CASE("make_wstring takes no memory for what comes after a NUL") {
    std::string text(5000, 'x');
    text += '\0';
    text.append(5000000, 'x');
    AllocatedBytes const allocated;
    CHECK((Koru::make_wstring(text) == std::wstring(5000, L'x')));
    CHECK(allocated.count() < 100000);
}

TEST_CASE("exhausted memory escapes as bad_alloc and leaves the functions usable") {
    std::size_t const size = 100000;
    std::string const narrow(size, 'a');
    std::wstring const wide(size, L'a');
    std::function<void()> const conversions[] = {[&] { Koru::make_string(wide); },
                                                 [&] { Koru::make_string(wide.c_str()); },
                                                 [&] { Koru::make_wstring(narrow); },
                                                 [&] { Koru::make_wstring(narrow.c_str()); },
                                                 [&] { Koru::make_string(narrow.c_str()); },
                                                 [&] { Koru::make_wstring(wide.c_str()); },
                                                 [&] { Koru::wideString(wide.data(), size); }};
    for (std::function<void()> const& convert : conversions) {
        forEachFailure([&](MemoryPlan const& plan) {
            std::string const outcome = runOutOfMemory(plan, convert);
            CHECK(outcome == (memoryRanOut() ? "std::bad_alloc" : "done"));
            return memoryRanOut();
        });
        CHECK(runOutOfMemory(0, Failing::ONE, convert) == "std::bad_alloc");
    }
    CHECK(Koru::make_string(L"\u00E9") == "\xC3\xA9");
    CHECK((Koru::make_wstring("\xC3\xA9") == L"\u00E9"));
}

TEST_CASE("narrow text too long for a narrow string is want of memory") {
    if (!canBeTooLong()) return;
    for (std::size_t const size : sizesTooLong<char>()) {
        checkTooLong('x', size, [](char const* s) { Koru::make_string(s); });
    }
}

TEST_CASE("narrow text too long for a wide string is want of memory") {
    if (!canBeTooLong()) return;
    std::size_t const tooMany = std::wstring().max_size() + 1;
    for (char const c : {'x', '\xC3'}) {
        std::size_t const count = c == 'x' ? tooMany : 2 * tooMany - (1U << 21);
        checkTooLong(c, count, [](char const* s) { Koru::make_wstring(s); });
    }
}

TEST_CASE("wide text whose UTF-8 is too long for a string is want of memory") {
    if (!canBeTooLong()) return;
    // Whole pieces, or the NUL after the text would end each of them.
    std::size_t const count = (std::string().max_size() / 6 & ~0x3FFFFU) + 0x40000;
    Repeated const memory(L'\x7FFFFFFF', count);
    if (memory.memory() == nullptr) return;
    ReserveForHugeBlock const reserve(memory.memory());
    std::wstring const text(count, L'\x7FFFFFFF');
    CHECK(messageOf<std::bad_alloc>([&] { Koru::make_string(text); }) == "std::bad_alloc");
}

TEST_CASE("wide text too long for a string is want of memory") {
    if (!canBeTooLong()) return;
    for (std::size_t const count : sizesTooLong<wchar_t>()) {
        checkTooLong(L'x', count, [](wchar_t const* s) { Koru::make_wstring(s); });
        checkTooLong(L'x', count, [](wchar_t const* s) { Koru::make_string(s); });
    }
}

TEST_CASE("a range of wide text too long for a string is want of memory") {
    if (!canBeTooLong()) return;
    for (std::size_t const count : sizesTooLong<wchar_t>()) {
        checkTooLong(L'x', count, [count](wchar_t const* s) { Koru::wideString(s, count); });
    }
}
