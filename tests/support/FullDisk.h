#pragma once

#include <csignal>
#include <sys/resource.h>

namespace platform::test {

/// Calls `write` where no file may have more than `size` bytes: a write beyond is cut short, as on a full disk.
template <class Write> auto onFullDisk(rlim_t size, Write write)
{
    struct Limit {
        explicit Limit(rlim_t size) : handler(signal(SIGXFSZ, SIG_IGN))
        {
            getrlimit(RLIMIT_FSIZE, &before);
            const rlimit small{.rlim_cur = size, .rlim_max = before.rlim_max};
            setrlimit(RLIMIT_FSIZE, &small);
        }
        ~Limit()
        {
            setrlimit(RLIMIT_FSIZE, &before);
            signal(SIGXFSZ, handler);
        }
        Limit(const Limit&) = delete;
        Limit& operator=(const Limit&) = delete;
        rlimit before{};
        void (*handler)(int);
    } const limit(size);
    return write();
}

} // namespace platform::test
