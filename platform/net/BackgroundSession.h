#pragma once

#include <cstdint>
#include <filesystem>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "platform/net/UrlSession.h"

namespace platform {

class Clock;
class Executor;
class FileSystem;
class NetworkStatus;
class Queue;

/// A transfer that outlives the process; see `BackgroundSession`. The session keeps a task from `resume` until it has
/// ended; before that a task whose last owner lets go of it is removed. Any thread but the run loop's: `resume`,
/// `cancel` and `setNote` write to disk.
class BackgroundTask : public UrlTask {
public:
    /// What the owner wants to remember of the task, kept with it: a small JSON value, 128 KiB of text at most (a
    /// larger one is logged and left out).
    virtual void setNote(Value note) = 0;
    [[nodiscard]] virtual Value note() const = 0;
    /// Whether it uploads a file or downloads one.
    [[nodiscard]] virtual bool isUpload() const = 0;
};

/// Hears how the transfers go, on the session's delegate queue.
class BackgroundSessionDelegate {
public:
    virtual ~BackgroundSessionDelegate() = default;
    /// `sent` of `expected` bytes of an upload's body have left.
    virtual void taskDidSendBodyData(const std::shared_ptr<BackgroundTask>&, std::uint64_t /*sent*/,
                                     std::uint64_t /*expected*/)
    {}
    /// A download's body is in `file`, which is removed when this returns: move it, or copy it, here. Called for any
    /// HTTP status, before taskDidComplete.
    virtual void taskDidFinishDownloading(const std::shared_ptr<BackgroundTask>&, const std::filesystem::path& /*file*/,
                                          const UrlResponse&)
    {}
    /// The task has ended; once for every task, also for one of an earlier process. A response of any HTTP status is a
    /// completion without error. Once this has returned, the task is forgotten on disk too; a process killed before
    /// that reports the task again.
    virtual void taskDidComplete(const std::shared_ptr<BackgroundTask>& task,
                                 const std::optional<UrlResponse>& response, const std::optional<Error>& error) = 0;
    /// No task is left of those that the session knew.
    virtual void sessionDidFinishEvents() {}
    /// The session's store can't be opened, or belongs to another process. The session works in a temporary directory,
    /// and its tasks end with the process. If that isn't possible either, making a task fails; a task that is made a
    /// minute later or more tries again.
    virtual void sessionDidBecomeInvalid(const Error&) {}
};

struct BackgroundSessionConfiguration {
    std::string identifier;    ///< names the session's store; one session of that name for each user
    bool allowsMetered = true; ///< else tasks wait while the network is metered
    /// After this long without anything sent or received an attempt ends, and another is made later.
    Duration requestTimeout = std::chrono::seconds(60);
    /// A task that hasn't ended this long after its resume, waiting included, ends with kUrlTimedOut.
    Duration resourceTimeout = std::chrono::hours(24 * 7);
    std::size_t maximumResponseSize = 64u << 20; ///< bytes of a download, or of an upload's answer
    /// Limits on the tasks kept at once and on the bytes of their bodies. Past either, making a task fails with
    /// kUrlTooLarge.
    std::size_t maximumTasks = 10'000;
    std::uint64_t maximumBodyBytes = 256u << 20;
    unsigned parallelTransfers = 2;
    std::string caFile; ///< as for UrlSessionConfiguration
};

/// Uploads and downloads that survive the process. Any thread but the run loop's: making a task writes to disk.
///
/// A task is on disk, with its own copy of its body, before it is handed out. Nothing is transferred before `resume()`.
/// When the next process makes a session of the same name, the tasks that were resumed go on and report to its
/// delegate; tasks that were never resumed are dropped, with their bodies.
///
/// A resumed task waits while the network is absent (and metered, where that isn't allowed). An attempt that fails
/// below HTTP is repeated after growing, jittered delays, until the resource time-out; what can't get better (a bad
/// URL, a forbidden redirect, an answer too large) ends the task with its error. An HTTP status always ends the task;
/// if it comes with Retry-After (RFC 9110, 10.2.3; a day at most), the session's other tasks to that host wait.
///
/// An attempt that was under way when the process died is repeated with the same body: a service may see a body twice,
/// never a part of it as the whole. How a task ended is on disk before its owner is told.
///
/// The resource time-out is of lived time (`LivedTime`): suspend and days without the process count, leaps of the
/// system clock don't. Destroying the session stops its transfers, for the next session of that name to take up.
class BackgroundSession {
public:
    virtual ~BackgroundSession() = default;
    /// Uploads the contents of `body`, which must not be a link and which the caller may remove at once. Fails with
    /// kUrlBadUrl, kUrlTooLarge, or the error of the disk.
    [[nodiscard]] virtual Result<std::shared_ptr<BackgroundTask>> uploadTask(UrlRequest request,
                                                                             const std::filesystem::path& body) = 0;
    [[nodiscard]] virtual Result<std::shared_ptr<BackgroundTask>> downloadTask(UrlRequest request) = 0;
    /// The tasks that have not ended. Calls back on the delegate queue's executor, never inside the call and never on
    /// the delegate queue itself.
    virtual void getTasks(std::move_only_function<void(std::vector<std::shared_ptr<BackgroundTask>>)> callback) = 0;
};

/// Makes background sessions. One for the process. Any thread.
class BackgroundSessions {
public:
    virtual ~BackgroundSessions() = default;
    /// Makes a session, which takes up the transfers of an earlier process. `delegate` hears of them on
    /// `delegateQueue`, a serial queue. The store is opened on a worker, and made with the first task; a failure of
    /// that is told to the delegate.
    [[nodiscard]] virtual std::shared_ptr<BackgroundSession> make(BackgroundSessionConfiguration configuration,
                                                                  std::weak_ptr<BackgroundSessionDelegate> delegate,
                                                                  std::shared_ptr<Queue> delegateQueue) = 0;
};

/// What background sessions work with. All of it must outlive them.
struct BackgroundEnvironment {
    FileSystem& files;
    UrlLoader& loader;
    NetworkStatus& network;
    Clock& clock;
    Executor& executor;
    std::filesystem::path directory; ///< holds a directory for each session; made when there is something to keep
    std::filesystem::path temporary; ///< for a session whose store can't be opened
};

[[nodiscard]] std::unique_ptr<BackgroundSessions> makeBackgroundSessions(BackgroundEnvironment environment);

} // namespace platform
