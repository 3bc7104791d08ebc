// How long callers wait who do not want to give up.
#ifndef KORU_CONCURRENCY_TIMEOUT_H
#define KORU_CONCURRENCY_TIMEOUT_H

namespace Koru {

/// The time-out that stands for none: an event waits without limit, a mutex for 49.7 days.
constexpr unsigned long WITHOUT_LIMIT = 0xFFFFFFFFUL;

} // namespace Koru

#endif
