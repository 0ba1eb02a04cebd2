#pragma once

#include <cstdint>
#include <filesystem>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "platform/net/UrlSession.h"
#include "platform/run/QueueOrder.h"

namespace platform {

class Clock;
class Executor;
class FileSystem;
class NetworkStatus;
class Queue;

/// A transfer that survives the process; see `BackgroundSession`. The session owns a task from `resume` until it has
/// ended. A task that was never resumed is removed when its last owner releases it. `resume`, `cancel` and `setNote`
/// write to disk: any thread but the run loop's.
class BackgroundTask : public UrlTask {
public:
    /// Stores a value of the owner's choice with the task: JSON of at most 128 KiB. Logs and ignores a larger one.
    virtual void setNote(Value note) = 0;
    [[nodiscard]] virtual Value note() const = 0;
    /// Makes the first attempt start at a random time within `window` after `resume`; by default it starts at once.
    /// Call it before `resume`.
    virtual void setStartWindow(Duration window) = 0;
    /// Returns true for an upload, false for a download.
    [[nodiscard]] virtual bool isUpload() const = 0;
};

/// Receives the events of a session's transfers, on the session's delegate queue.
class BackgroundSessionDelegate {
public:
    virtual ~BackgroundSessionDelegate() = default;
    /// `sent` of `expected` bytes of an upload's body were sent.
    virtual void taskDidSendBodyData(const std::shared_ptr<BackgroundTask>&, std::uint64_t /*sent*/,
                                     std::uint64_t /*expected*/)
    {}
    /// A download's body is in `file`, which is removed when this returns: move or copy it here. Runs for any HTTP
    /// status, before taskDidComplete.
    virtual void taskDidFinishDownloading(const std::shared_ptr<BackgroundTask>&, const std::filesystem::path& /*file*/,
                                          const UrlResponse&)
    {}
    /// The task has ended. Runs once for every task, also for one of an earlier process. A response of any HTTP status
    /// comes without an error. After this has returned the task is removed from disk; a process that is killed before
    /// reports the task again at its next start.
    virtual void taskDidComplete(const std::shared_ptr<BackgroundTask>& task,
                                 const std::optional<UrlResponse>& response, const std::optional<Error>& error) = 0;
    /// The last task of the session has been reported.
    virtual void sessionDidFinishEvents() {}
    /// The session's store can't be opened, or another process has locked it. The session uses a temporary directory
    /// instead; its tasks end with the process. If that fails too, creating a task fails. A task that is created at
    /// least a minute later tries to open the store again, unless the temporary directory has tasks.
    virtual void sessionDidBecomeInvalid(const Error&) {}
};

struct BackgroundSessionConfiguration {
    std::string identifier;    ///< names the session's store; one session of that name for each user
    bool allowsMetered = true; ///< if false, tasks wait while the network is metered
    /// An attempt ends after this time without a byte sent or received, and is retried later.
    Duration requestTimeout = std::chrono::seconds(60);
    /// A task ends with kUrlTimedOut this long after its resume, waiting included.
    Duration resourceTimeout = std::chrono::hours(24 * 7);
    std::size_t maximumResponseSize = 64u << 20; ///< bytes of a download, or of an upload's response
    /// Limits of the tasks that exist at once and of the bytes of their bodies. Beyond either, creating a task fails
    /// with kUrlTooLarge.
    std::size_t maximumTasks = 10'000;
    std::uint64_t maximumBodyBytes = 256u << 20;
    unsigned parallelTransfers = 2;
    std::string caFile;     ///< as for UrlSessionConfiguration
    Rank rank = Rank::None; ///< of the queue on which creating, resuming and cancelling a task wait
};

/// Uploads and downloads that survive the process. Creating a task writes to disk: any thread but the run loop's.
///
/// A new task is on disk, with its own copy of its body, before the caller gets it. Transfers start with `resume()`.
/// If a later process creates a session of the same name, resumed tasks continue and report to its delegate; tasks that
/// were never resumed are removed with their bodies.
///
/// A resumed task waits while the network is offline, or metered if that isn't allowed. An attempt that fails below
/// HTTP is repeated after growing, jittered delays until the resource time-out, and at once when the network is back or
/// the host has answered another task with success; permanent errors (a bad URL, a forbidden redirect, a response that
/// is too large) end the task. An HTTP status always ends the task; if it comes with Retry-After (RFC 9110, 10.2.3; at
/// most a day), the session's other tasks to that host wait.
///
/// An attempt that a kill interrupted is repeated with the same body: a service may receive a body twice, but never a
/// truncated one as complete. A task's result is on disk before the delegate is called.
///
/// The resource time-out counts lived time (`LivedTime`): it includes suspend and days without the process, and ignores
/// clock changes. Destroying the session stops its transfers; the next session of that name continues them.
class BackgroundSession {
public:
    virtual ~BackgroundSession() = default;
    /// Creates an upload of the contents of `body`, which must not be a symbolic link; the caller may remove the file
    /// at once. Fails with kUrlBadUrl, kUrlTooLarge, or an I/O error.
    [[nodiscard]] virtual Result<std::shared_ptr<BackgroundTask>> uploadTask(UrlRequest request,
                                                                             const std::filesystem::path& body) = 0;
    [[nodiscard]] virtual Result<std::shared_ptr<BackgroundTask>> downloadTask(UrlRequest request) = 0;
    /// Passes the tasks that have not ended to `callback`, which runs on a queue of the session: never inside this call
    /// and never on the delegate queue.
    virtual void getTasks(std::move_only_function<void(std::vector<std::shared_ptr<BackgroundTask>>)> callback) = 0;
    /// Passes a description of each such task to `callback`, on the same queue: {"identifier", "url", "note", "bytes"
    /// of an upload's body, "failures", "waitsFor"}, and if they are known "inSeconds" until its next attempt,
    /// "problem" of the last one in this process. "waitsFor" is "resume", "network", "unmetered network", "time",
    /// "turn" or "transfer".
    virtual void describe(std::move_only_function<void(Value::Array)> callback) = 0;
};

/// Creates background sessions. One for each process. Any thread.
class BackgroundSessions {
public:
    virtual ~BackgroundSessions() = default;
    /// Creates a session, which continues the transfers of an earlier process. `delegate` is called on `delegateQueue`,
    /// a serial queue. A worker opens an existing store; the first task creates a missing one. A failure is reported to
    /// the delegate.
    [[nodiscard]] virtual std::shared_ptr<BackgroundSession> make(BackgroundSessionConfiguration configuration,
                                                                  std::weak_ptr<BackgroundSessionDelegate> delegate,
                                                                  std::shared_ptr<Queue> delegateQueue) = 0;
};

/// The services that background sessions use. All must outlive the sessions.
struct BackgroundEnvironment {
    FileSystem& files;
    UrlLoader& loader;
    NetworkStatus& network;
    Clock& clock;
    Executor& executor;
    std::filesystem::path directory; ///< has a subdirectory for each session; created with the first task
    std::filesystem::path temporary; ///< for a session whose store can't be opened
};

/// Returns sessions that transfer with `environment.loader`.
[[nodiscard]] std::unique_ptr<BackgroundSessions> makeBackgroundSessions(BackgroundEnvironment environment);

} // namespace platform
