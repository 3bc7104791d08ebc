// A limit on the size of files, as good as a full disk for a test.
#ifndef KORU_TESTS_FILESIZELIMIT_H
#define KORU_TESTS_FILESIZELIMIT_H

#include <signal.h>
#include <sys/resource.h>

namespace test {

/// Limits the size of files that this process writes, from now on and in its children too. Writing
/// beyond it fails and raises no signal.
inline void limitFileSize(rlim_t bytes) {
    ::signal(SIGXFSZ, SIG_IGN);
    rlimit limit = {};
    ::getrlimit(RLIMIT_FSIZE, &limit);
    limit.rlim_cur = bytes;
    ::setrlimit(RLIMIT_FSIZE, &limit);
}

} // namespace test

#endif
