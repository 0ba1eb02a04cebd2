#pragma once

#include <atomic>
#include <functional>
#include <memory>
#include <set>

#include "platform/base/Mutex.h"
#include "platform/net/BackgroundSession.h"
#include "platform/run/Reply.h"
#include "platform/values/Value.h"

namespace platform {
class Activity;
struct ActivityCriteria;
class Queue;
} // namespace platform

namespace tavrin {

struct Assembly;
class TavrinFeedbackFlusher;

/// Uploads the closed session files, every ten minutes as a background activity and on demand. Records the outcomes
/// that the upload session reports in the books.
///
/// A pass reads each file, deletes it even if it could not be read, and passes its session to the flusher. So no file
/// is read twice. Passes run one at a time. Any thread.
class BackgroundActivitiesManager : public platform::BackgroundSessionDelegate,
                                    public std::enable_shared_from_this<BackgroundActivitiesManager> {
public:
    /// Registers the background activity.
    static std::shared_ptr<BackgroundActivitiesManager> make(Assembly& assembly);
    explicit BackgroundActivitiesManager(Assembly& assembly);
    ~BackgroundActivitiesManager() override;

    /// Returns when the background activity runs.
    [[nodiscard]] static platform::ActivityCriteria criteria();

    /// Runs one pass, asynchronously, then calls back.
    void insertFlushActivity(std::move_only_function<void()> callback);
    /// Replies with what a pass would upload, body by body (see `TavrinFeedbackFlusher::preview`), asynchronously. A
    /// body with "open" is of a session that has not ended, and grows until then. If the bodies exceed 8 MiB, those
    /// that don't fit have their size under "bytes" instead. Changes nothing but the count of files that are too large.
    void previewUploads(platform::Reply<platform::Value::Array> reply);
    /// While this is set, the background activity does nothing; passes on demand still run.
    [[nodiscard]] bool stopFlushing() const { return _stopFlushing; }
    void setStopFlushing(bool stop) { _stopFlushing = stop; }

    [[nodiscard]] const std::shared_ptr<TavrinFeedbackFlusher>& feedbackFlusher() const { return _feedbackFlusher; }
    /// Books the unfinished uploads of an earlier process and removes its incomplete bodies, asynchronously. Call it
    /// after the upload session was created.
    void findUploads();

    void taskDidSendBodyData(const std::shared_ptr<platform::BackgroundTask>& task, std::uint64_t sent,
                             std::uint64_t expected) override;
    void taskDidComplete(const std::shared_ptr<platform::BackgroundTask>& task,
                         const std::optional<platform::UrlResponse>& response,
                         const std::optional<platform::Error>& error) override;
    void sessionDidFinishEvents() override;
    void sessionDidBecomeInvalid(const platform::Error& error) override;

private:
    void _runActivity(const std::shared_ptr<platform::Activity>& activity);
    void _flusherActivity();
    void _sweepUnfinished();
    void _flushToWire(TavrinFeedbackFlusher& flusher);
    void _findUpload(const platform::BackgroundTask& task);

    Assembly& _assembly;
    std::shared_ptr<platform::Queue> _queueFlusher;
    std::shared_ptr<TavrinFeedbackFlusher> _feedbackFlusher;
    std::atomic<bool> _stopFlushing = false;
    platform::Mutex _foundMutex;
    std::set<std::uint64_t> _found GUARDED_BY(_foundMutex); ///< tasks of earlier processes that are in the books
};

} // namespace tavrin
