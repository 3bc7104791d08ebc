// What the processor offers beyond SSE2. Asked when the library is loaded, once, as the answer can
// take a virtual machine microseconds; nothing is offered before. The compiler's own table of
// features, which __builtin_cpu_supports reads, would make the library 5,000 bytes larger.
#ifndef KORU_TEXT_PROCESSOR_H
#define KORU_TEXT_PROCESSOR_H

namespace Koru {

/// Whether it can rearrange the bytes of a register at will.
extern bool const CAN_SHUFFLE;

/// Whether it has vectors of 32 bytes, and the system keeps them for each thread.
extern bool const HAS_WIDE_VECTORS;

} // namespace Koru

#endif
