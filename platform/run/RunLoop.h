#pragma once

#include <functional>
#include <memory>

#include "platform/run/Queue.h"

struct sd_event;

namespace platform {

/// The main thread's event loop, on sd-event: descriptors, signals, and jobs from other threads.
///
/// The loop's thread is the one that calls `run` or `runOnce`. Everything belongs to it, callbacks included, except
/// `execute` and `stop`, which any thread may call. Nothing on it may block. An idle loop sleeps in the kernel: it has
/// no tick. Aborts if the process can have no epoll descriptor.
class RunLoop final : public Executor {
public:
    RunLoop();
    ~RunLoop() override;

    /// Returns after `stop()`.
    void run();
    /// Dispatches what is ready, and waits at most `timeout` if nothing is. For tests and tools.
    void runOnce(Duration timeout);
    void stop();

    /// Runs the job on the loop's thread, never inside this call, in the order of the calls. Ignores the priority.
    void execute(Priority priority, Job job) override;

    /// Calls `handler` for every such signal, which must be blocked in all threads (`blockSignals`).
    void onSignal(int signal, std::move_only_function<void()> handler);

    /// A watched descriptor. Its destructor ends the watch; the descriptor stays the caller's.
    class Watch {
    public:
        virtual ~Watch() = default;
        /// Sets the events (EPOLLIN, EPOLLOUT …) to wait for; 0 pauses the watch.
        virtual void setEvents(std::uint32_t events) = 0;
    };
    /// Calls `ready` with the events seen on `fd`, level-triggered. `fd` must stay open as long as the watch.
    [[nodiscard]] std::unique_ptr<Watch> watch(int fd, std::uint32_t events, std::function<void(std::uint32_t)> ready);

    /// The loop itself, for libraries that can share it. Owned by this object.
    [[nodiscard]] sd_event* handle() const;

    /// Blocks SIGINT and SIGTERM for this thread and all threads made from it, and ignores SIGPIPE: writing to a closed
    /// peer is an error like any other. To be called before the first thread is made.
    static void blockSignals();

private:
    struct Impl;
    std::unique_ptr<Impl> _impl;
};

} // namespace platform
