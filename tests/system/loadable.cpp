// A library for the loader's tests, built once for each KORU_LOADABLE_NUMBER. It reports its life
// in the file that the environment names: "+1" when it is loaded, "-1" when it is unloaded.
#include <fcntl.h>
#include <stdlib.h>
#include <unistd.h>

namespace {

int const NUMBER = KORU_LOADABLE_NUMBER;

void report(char event) {
    char const* const path = ::getenv("KORU_LOADABLE_REPORT");
    if (path == nullptr) return;
    int const fd = ::open(path, O_WRONLY | O_APPEND | O_CREAT | O_CLOEXEC, 0600);
    char const text[2] = {event, static_cast<char>('0' + NUMBER)};
    if (::write(fd, text, sizeof text) != 2) ::abort();
    ::close(fd);
}

__attribute__((constructor)) void loaded() { report('+'); }
__attribute__((destructor)) void unloaded() { report('-'); }

} // namespace

extern "C" {

extern __attribute__((visibility("default"))) int koru_loadable_data;
int koru_loadable_data = NUMBER * 100;

__attribute__((visibility("default"))) int koru_loadable_number();
int koru_loadable_number() { return NUMBER; }

// A name beyond ASCII, in UTF-8 as the symbol table has it.
__attribute__((visibility("default"))) int koru_loadable_size() __asm__("gr\303\266\303\237e");
int koru_loadable_size() { return NUMBER * 1000; }
}
