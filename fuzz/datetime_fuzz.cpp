// A text is refused with one of the messages, or read into fields within their ranges that, written
// with the same parts, read the same again.
#include <koru/datetime.h>

#include <stdlib.h>

#include <cstdint>
#include <set>
#include <sstream>
#include <stdexcept>
#include <string>

#include "check.h"

namespace {

using Koru::DateTime;

void checkFields(DateTime const& value, unsigned int parts) {
    bool const hasDate = (parts & DateTime::DATE) != 0;
    bool const hasTime = (parts & DateTime::TIME) != 0;
    KORU_CHECK(value.getYear() == 0 || (value.getYear() >= 1000 && value.getYear() <= 3000));
    KORU_CHECK(value.getMonth() <= 12 && value.getDay() <= 31);
    KORU_CHECK(value.getHour() <= 23 && value.getMinute() <= 59 && value.getSecond() <= 59);
    KORU_CHECK(value.getMillisecond() == 0 && value.getOffset() == 0);
    KORU_CHECK(hasDate || (value.getYear() == 0 && value.getMonth() == 0 && value.getDay() == 0));
    KORU_CHECK(hasTime ||
               (value.getHour() == 0 && value.getMinute() == 0 && value.getSecond() == 0));
}

void checkText(DateTime const& value, unsigned int parts) {
    std::string const text = value;
    std::size_t const sizes[] = {0, 10, 8, 19};
    KORU_CHECK(text.size() == sizes[parts]);
    std::ostringstream out;
    out << value;
    KORU_CHECK(out.str() == text);

    DateTime const again(text, parts);
    std::string const textAgain = again;
    KORU_CHECK(textAgain == text);
    KORU_CHECK(again == value && again <= value && again >= value);
    KORU_CHECK(!(again != value) && !(again < value) && !(again > value));
}

} // namespace

extern "C" int LLVMFuzzerInitialize(int* /*argc*/, char*** /*argv*/) {
    // Not this machine's zone, which may have hours that its clocks show twice.
    return ::setenv("TZ", "UTC0", 1);
}

extern "C" int LLVMFuzzerTestOneInput(std::uint8_t const* data, std::size_t size) {
    static std::set<std::string> const messages = {"incorrect format.",   "year out-of-range",
                                                   "month out-of-range.", "day out-of-range.",
                                                   "hour out-of-range.",  "minute out-of-range."};
    std::string const text(reinterpret_cast<char const*>(data), size);
    for (unsigned int parts = 0; parts <= (DateTime::DATE | DateTime::TIME); ++parts) {
        try {
            DateTime const value(text, parts);
            checkFields(value, parts);
            checkText(value, parts);
        } catch (std::invalid_argument const& e) {
            KORU_CHECK(parts != 0);
            KORU_CHECK(messages.count(e.what()) == 1);
        }
    }
    return 0;
}
