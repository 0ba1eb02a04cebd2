#pragma once

#include <functional>
#include <memory>

#include "platform/run/Queue.h"

struct sd_event;

namespace platform {

/// The main thread's event loop, on sd-event: descriptors, signals, and jobs from other threads.
///
/// The loop's thread is the one that calls `run` or `runOnce`. All functions and callbacks are confined to it, except
/// `execute` and `stop`, which any thread may call. Callbacks must not block. An idle loop sleeps in the kernel,
/// without a tick. The constructor aborts if it can't create an epoll descriptor.
class RunLoop final : public Executor {
public:
    RunLoop();
    ~RunLoop() override;

    /// Returns after `stop()`.
    void run();
    /// Dispatches ready events; if there are none, waits at most `timeout` for one. For tests and tools.
    void runOnce(Duration timeout);
    void stop();

    /// Runs the job on the loop's thread, never inside this call, in the order of the calls. Ignores the priority.
    void execute(Priority priority, Job job) override;

    /// Calls `handler` for every such signal, which must be blocked in all threads (`blockSignals`).
    void onSignal(int signal, std::move_only_function<void()> handler);

    /// A watched descriptor. Its destructor ends the watch; the caller owns the descriptor.
    class Watch {
    public:
        virtual ~Watch() = default;
        /// Sets the events (EPOLLIN, EPOLLOUT …) to wait for; 0 pauses the watch.
        virtual void setEvents(std::uint32_t events) = 0;
    };
    /// Calls `ready` with the events of `fd`, level-triggered. `fd` must stay open as long as the watch exists.
    [[nodiscard]] std::unique_ptr<Watch> watch(int fd, std::uint32_t events, std::function<void(std::uint32_t)> ready);

    /// Returns the sd-event loop, for libraries that can share it. This object owns it.
    [[nodiscard]] sd_event* handle() const;

    /// Blocks SIGINT and SIGTERM for this thread and all threads that it starts, and ignores SIGPIPE, so that writing
    /// to a closed peer fails with EPIPE. Call it before the first thread starts.
    static void blockSignals();

private:
    struct Impl;
    std::unique_ptr<Impl> _impl;
};

} // namespace platform
