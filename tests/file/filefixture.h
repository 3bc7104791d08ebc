// What the tests of the file base class share: a file in a temporary directory, and other threads
// that want its lock or hold it.
#ifndef KORU_TESTS_FILEFIXTURE_H
#define KORU_TESTS_FILEFIXTURE_H

#include <pthread.h>
#include <sys/stat.h>

#include <atomic>
#include <chrono>
#include <filesystem>
#include <future>
#include <ios>
#include <iterator>
#include <stdexcept>
#include <string>
#include <thread>

#include <koru/file.h>

#include "support/tempdir.h"
#include "support/throws.h"

namespace test {

unsigned long const READ = Koru::File::READ;
unsigned long const WRITE = Koru::File::WRITE;
unsigned long const UPDATE = READ | WRITE;
unsigned long const BINARY = Koru::File::BINARY;
unsigned long const OTHERS = 0x7FFFFFFCUL; ///< all 32 bits that have no meaning

std::ios_base::iostate const GOOD = std::ios_base::goodbit;
std::ios_base::iostate const FAIL = std::ios_base::failbit;
std::ios_base::iostate const BAD = std::ios_base::badbit;
std::ios_base::iostate const END = std::ios_base::eofbit;

/// Long enough for a thread that need not wait to have gone on.
std::chrono::milliseconds const SHORT_WHILE(50);
/// After which a thread that should have gone on is given up.
std::chrono::seconds const LONG_WHILE(20);

char const* const NOT_OPENED = "failed to open file.";

template <class Callable>
std::string complaint(Callable callable) {
    return messageOf<std::runtime_error>(callable);
}

/// Whether there is an entry of that name, be it a dangling link.
inline bool isThere(std::string const& path) {
    return std::filesystem::symlink_status(path).type() != std::filesystem::file_type::not_found;
}

/// Everything that the stream can read from the beginning of the file.
inline std::string contentOf(Koru::File& file) {
    file.seekg(0);
    return std::string(std::istreambuf_iterator<char>(file.rdbuf()), {});
}

inline bool canRead(Koru::File& file) {
    return file.rdbuf()->sgetc() != std::char_traits<char>::eof();
}

inline bool canWrite(Koru::File& file) {
    file.rdbuf()->pubseekpos(0);
    return file.rdbuf()->sputc('W') == 'W' && file.rdbuf()->pubsync() == 0;
}

/// A thread that takes the file's lock, and gives it back once it has it.
class Contender {
public:
    explicit Contender(Koru::File& file)
        : thread_([this, &file] {
              if (!file.lock()) return;
              hasLocked_ = true;
              file.unlock();
          }) {}
    ~Contender() { thread_.join(); }

    /// Whether it is kept waiting. Ask once.
    bool waits() const {
        std::this_thread::sleep_for(SHORT_WHILE);
        return !hasLocked_;
    }

private:
    std::atomic<bool> hasLocked_{false};
    std::thread thread_;
};

/// Whether nobody, the calling thread included, holds the file's lock.
inline bool isFree(Koru::File& file) {
    std::promise<bool> promise;
    std::future<bool> result = promise.get_future();
    std::thread other([&] { promise.set_value(file.lock() && file.unlock()); });
    bool const finished = result.wait_for(LONG_WHILE) == std::future_status::ready;
    if (!finished) ::pthread_cancel(other.native_handle());
    other.join();
    return finished && result.get();
}

/// A closed file named "a" in a temporary directory. There is none of that name yet.
struct OnFile {
    void store(std::string const& content) const { writeFile(path, content); }
    std::string stored() const { return readFile(path); }

    TempDir const dir;
    std::string const path = dir / "a";
    Koru::File file{dir.wide("a")};
};

/// The same where the file is there.
struct OnContent : OnFile {
    OnContent() { store("content"); }
};

} // namespace test

#endif
