#pragma once

#include <functional>
#include <memory>

#include "platform/run/Queue.h"

struct sd_event;

namespace platform {

/// The main thread's event loop, on sd-event: descriptors, signals, and jobs handed in from other threads.
///
/// `run`, `watch`, `onSignal` and the callbacks belong to the loop's thread; `execute` and `stop` may be called from
/// any thread. An idle loop sleeps in the kernel: it has no tick.
class RunLoop final : public Executor {
public:
    RunLoop();
    ~RunLoop() override;

    /// Runs until `stop()`.
    void run();
    /// Dispatches what is ready, waiting at most `timeout` for the first thing. For tests and tools.
    void runOnce(Duration timeout);
    void stop();

    /// Runs the job on the loop's thread, after those handed in before it. The priority is not looked at.
    void execute(Priority priority, Job job) override;

    /// Calls `handler` on the loop for SIGINT, SIGTERM and the like. The signal must be blocked already
    /// (`blockSignals`).
    void onSignal(int signal, std::move_only_function<void()> handler);

    /// A watched descriptor; destroying it ends the watch.
    class Watch {
    public:
        virtual ~Watch() = default;
        /// EPOLLIN, EPOLLOUT … to wait for; 0 pauses.
        virtual void setEvents(std::uint32_t events) = 0;
    };
    /// Calls `ready` with the events seen on `fd` (level-triggered).
    [[nodiscard]] std::unique_ptr<Watch> watch(int fd, std::uint32_t events, std::function<void(std::uint32_t)> ready);

    /// The loop underneath, for the libraries that can share it. Loop's thread.
    [[nodiscard]] sd_event* handle() const;

    /// Blocks SIGINT and SIGTERM for this thread and every thread made from it, and ignores SIGPIPE: a peer that went
    /// is an error of the write. Call before the first thread.
    static void blockSignals();

private:
    struct Impl;
    std::unique_ptr<Impl> _impl;
};

} // namespace platform
