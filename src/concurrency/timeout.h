// The time-out for callers who do not want to give up.
#ifndef KORU_CONCURRENCY_TIMEOUT_H
#define KORU_CONCURRENCY_TIMEOUT_H

namespace Koru {

/// To an event, this means no limit at all; a mutex gives up after 49.7 days.
constexpr unsigned long WITHOUT_LIMIT = 0xFFFFFFFFUL;

} // namespace Koru

#endif
