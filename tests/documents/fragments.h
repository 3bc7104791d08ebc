// What the C++ fragments in the documents take for granted: script/check-documents compiles them
// after this.
#ifndef KORU_TESTS_FRAGMENTS_H
#define KORU_TESTS_FRAGMENTS_H

#include <cxxabi.h>

#include <chrono>
#include <clocale>
#include <iostream>
#include <string>

#include <koru/event.h>
#include <koru/file.h>
#include <koru/initializationfile.h>
#include <koru/mutex.h>
#include <koru/system.h>
#include <koru/thread.h>

extern Koru::InitializationFile settings;
extern Koru::Event event;

void work();
void report();
std::wstring next(std::wstring const& number);

#endif
