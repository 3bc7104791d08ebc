// A library for the loader's tests, built once for each KORU_LOADABLE_NUMBER. It reports its life to
// the program that loads it, if that wants to know: 1 when it is loaded, -1 when it is unloaded.
namespace {

int const NUMBER = KORU_LOADABLE_NUMBER;

} // namespace

extern "C" {

__attribute__((weak)) void koru_loadable_report(int number);

extern __attribute__((visibility("default"))) int koru_loadable_data;
int koru_loadable_data = NUMBER * 100;

__attribute__((visibility("default"))) int koru_loadable_number();
int koru_loadable_number() { return NUMBER; }

// A name beyond ASCII, in UTF-8 as the symbol table has it.
__attribute__((visibility("default"))) int koru_loadable_size() __asm__("gr\303\266\303\237e");
int koru_loadable_size() { return NUMBER * 1000; }
}

namespace {

void report(int number) {
    if (koru_loadable_report != nullptr) koru_loadable_report(number);
}

__attribute__((constructor)) void loaded() { report(NUMBER); }
__attribute__((destructor)) void unloaded() { report(-NUMBER); }

} // namespace
