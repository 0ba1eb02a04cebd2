#pragma once

#include <csignal>
#include <memory>
#include <sys/resource.h>
#include <utility>

namespace platform::test {

/// Calls `work` while one of the process's limits has this value.
template <class Work> auto withLimit(int resource, rlim_t value, Work work)
{
    rlimit before{};
    getrlimit(resource, &before);
    const rlimit limit{.rlim_cur = value, .rlim_max = before.rlim_max};
    const std::shared_ptr<void> restored(nullptr, [&](void*) { setrlimit(resource, &before); });
    setrlimit(resource, &limit);
    return work();
}

/// Calls `write` where no file may have more than `size` bytes: a write beyond is cut short, as on a full disk.
template <class Write> auto onFullDisk(rlim_t size, Write write)
{
    const auto before = signal(SIGXFSZ, SIG_IGN);
    const std::shared_ptr<void> restored(nullptr, [&](void*) { signal(SIGXFSZ, before); });
    return withLimit(RLIMIT_FSIZE, size, std::move(write));
}

} // namespace platform::test
