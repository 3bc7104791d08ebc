// The size and the alignment of every public class, which programs built before rely on.
#include <doctest/doctest.h>

#include <cstddef>
#include <string>

#include <koru/datafile.h>
#include <koru/datetime.h>
#include <koru/dynamiclibrary.h>
#include <koru/event.h>
#include <koru/file.h>
#include <koru/initializationfile.h>
#include <koru/logfile.h>
#include <koru/mutex.h>
#include <koru/propertyfile.h>
#include <koru/system.h>
#include <koru/thread.h>
#include <koru/timer.h>
#include <koru/uuid.h>

namespace {

struct Layout {
    std::size_t size;
    std::size_t alignment;
};

struct Row {
    std::string name;
    Layout actual;
    Layout on32Bits;
    Layout on64Bits;
};

template <class Class>
Row row(char const* name, Layout on32Bits, Layout on64Bits) {
    return {name, {sizeof(Class), alignof(Class)}, on32Bits, on64Bits};
}

} // namespace

TEST_CASE("every public class has the size and the alignment that programs were built with") {
    Row const rows[] = {
        row<Koru::File>("File", {336, 4}, {608, 8}),
        row<Koru::File::Path>("File::Path", {76, 4}, {104, 8}),
        row<Koru::InitializationFile>("InitializationFile", {340, 4}, {616, 8}),
        row<Koru::PropertyFile>("PropertyFile", {340, 4}, {616, 8}),
        row<Koru::DataFile>("DataFile", {340, 4}, {616, 8}),
        row<Koru::DataFile::Record>("DataFile::Record", {40, 4}, {64, 8}),
        row<Koru::LogFile>("LogFile", {336, 4}, {608, 8}),
        row<Koru::Mutex>("Mutex", {24, 4}, {40, 8}),
        row<Koru::Event>("Event", {80, 4}, {104, 8}),
        row<Koru::Thread>("Thread", {20, 4}, {40, 8}),
        row<Koru::DateTime>("DateTime", {16, 4}, {16, 4}),
        row<Koru::Timer>("Timer", {8, 4}, {8, 4}),
        row<Koru::Uuid>("Uuid", {16, 1}, {16, 1}),
        row<Koru::DynamicLibrary>("DynamicLibrary", {32, 4}, {48, 8}),
        row<Koru::System>("System", {1, 1}, {1, 1}),
    };
    for (Row const& row : rows) {
        CAPTURE(row.name);
        Layout const& expected = sizeof(void*) == 4 ? row.on32Bits : row.on64Bits;
        CHECK(row.actual.size == expected.size);
        CHECK(row.actual.alignment == expected.alignment);
    }
}
