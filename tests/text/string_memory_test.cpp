// How much memory the conversions take, and what comes of text that is too long for a string. A
// file of its own, since the operators that allocate memory are replaced for the whole executable
// and the libraries it loaded.
#include <koru/string.h>

#include <doctest/doctest.h>

#include <sys/mman.h>
#include <unistd.h>

#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <new>
#include <string>
#include <vector>

#include "support/throws.h"

namespace {

std::size_t allocated = 0; ///< since it was last set to 0
void* nextHuge = nullptr;  ///< handed out for the next huge allocation, if it is set
constexpr std::size_t HUGE = 1U << 30;

void* _allocate(std::size_t size) {
    allocated += size;
    if (size >= HUGE && nextHuge != nullptr) return nextHuge;
    void* const memory = std::malloc(size == 0 ? 1 : size);
    if (memory == nullptr) throw std::bad_alloc();
    return memory;
}

void _free(void* memory) noexcept {
    if (memory != nextHuge) std::free(memory);
}

} // namespace

void* operator new(std::size_t size) { return _allocate(size); }
void* operator new[](std::size_t size) { return _allocate(size); }
void operator delete(void* memory) noexcept { _free(memory); }
void operator delete[](void* memory) noexcept { _free(memory); }
void operator delete(void* memory, std::size_t) noexcept { _free(memory); }
void operator delete[](void* memory, std::size_t) noexcept { _free(memory); }

namespace {

/// The same piece of memory again and again, one behind the other, followed by zeros: more text
/// than a machine may have memory for.
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

/// The outcome of a conversion that has to run out of memory.
template <class Convert>
std::string outcome(Convert convert) {
    return test::messageOf<std::bad_alloc>(convert);
}

constexpr bool NARROW_ADDRESSES = sizeof(void*) == 4;

} // namespace

TEST_CASE("make_string takes no memory for what stands behind a NUL") {
    for (wchar_t const c : {L'x', L'\u00E9', L'\u4E2D', L'\U0001F600', wchar_t{-2}}) {
        std::wstring text(2000, c);
        text += L'\0';
        text.append(5000000, c);
        allocated = 0;
        std::string const result = Koru::make_string(text);
        CHECK(allocated < 20000);
        CHECK((result == Koru::make_string(std::wstring(2000, c))));
    }
}

TEST_CASE("make_wstring takes no memory for what stands behind a NUL") {
    std::string text(2000, 'x');
    text += '\0';
    text.append(5000000, 'x');
    allocated = 0;
    CHECK((Koru::make_wstring(text) == std::wstring(2000, L'x')));
    CHECK(allocated < 40000);
}

TEST_CASE("narrow text too long for a wide string is want of memory" *
          doctest::skip(!NARROW_ADDRESSES)) {
    std::size_t const tooMany = std::wstring().max_size() + 1;
    for (char const c : {'x', '\xC3'}) {
        Repeated const text(c, c == 'x' ? tooMany : 2 * tooMany - (1U << 21));
        if (text.memory() == nullptr) {
            MESSAGE("no room for the text");
            continue;
        }
        CHECK(outcome([&] { Koru::make_wstring(static_cast<char const*>(text.memory())); }) ==
              "std::bad_alloc");
    }
}

TEST_CASE("wide text whose UTF-8 is too long for a string is want of memory" *
          doctest::skip(!NARROW_ADDRESSES)) {
    // Whole pieces, or the NUL behind the text would end each of them.
    std::size_t const count = (std::string().max_size() / 6 & ~0x3FFFFU) + 0x40000;
    Repeated const memory(L'\x7FFFFFFF', count);
    if (memory.memory() == nullptr) {
        MESSAGE("no room for the text");
        return;
    }
    nextHuge = memory.memory();
    {
        std::wstring const text(count, L'\x7FFFFFFF');
        nextHuge = nullptr;
        CHECK(outcome([&] { Koru::make_string(text); }) == "std::bad_alloc");
        nextHuge = memory.memory();
    }
    nextHuge = nullptr;
}

TEST_CASE("wide text too long for a string is want of memory" * doctest::skip(!NARROW_ADDRESSES)) {
    Repeated const text(L'x', std::wstring().max_size() + 1);
    if (text.memory() == nullptr) {
        MESSAGE("no room for the text");
        return;
    }
    auto const* const s = static_cast<wchar_t const*>(text.memory());
    CHECK(outcome([&] { Koru::make_wstring(s); }) == "std::bad_alloc");
    CHECK(outcome([&] { Koru::make_string(s); }) == "std::bad_alloc");
}
