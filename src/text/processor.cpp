#include "text/processor.h"

#include <cpuid.h>
#include <immintrin.h>

namespace Koru {

namespace {

struct Answer {
    unsigned int a, b, c, d;
};

/// All zeros where the processor does not know the question.
Answer _ask(unsigned int question) {
    Answer answer = {};
    __get_cpuid_count(question, 0, &answer.a, &answer.b, &answer.c, &answer.d);
    return answer;
}

/// The register that it reads exists where the system uses XSAVE.
__attribute__((target("xsave"))) bool _keepsWideVectors() {
    constexpr unsigned int halves = 0x6; // the lower one, as SSE has it, and the upper one
    return (_xgetbv(0) & halves) == halves;
}

} // namespace

bool const CAN_SHUFFLE = (_ask(1).c & bit_SSSE3) != 0;

bool const HAS_WIDE_VECTORS =
    (_ask(1).c & bit_OSXSAVE) != 0 && // GCOVR_EXCL_BR_LINE: the machine has one processor
    _keepsWideVectors() &&            // GCOVR_EXCL_BR_LINE
    (_ask(7).b & bit_AVX2) != 0;

} // namespace Koru
