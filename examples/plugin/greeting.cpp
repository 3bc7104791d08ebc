// A plugin: a library that programs load by name instead of linking it. A plain C function keeps
// its name in the symbol table.
extern "C" __attribute__((visibility("default"))) char const* greeting();

extern "C" char const* greeting() { return "Hello from the plugin"; }
