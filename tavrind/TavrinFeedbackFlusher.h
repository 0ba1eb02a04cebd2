#pragma once

#include <cstdint>
#include <filesystem>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/base/Bytes.h"
#include "platform/net/Url.h"
#include "platform/run/NotificationCenter.h"
#include "tavrind/FeedbacksToSend.h"

namespace platform {
class BackgroundTask;
class Queue;
} // namespace platform

namespace tavrin {

struct Assembly;
struct ZRCustomFeedback;
class OutputStream;
class TAVBag;

/// "crowdsourcing" for 0, "Feedbacks" for 1, else the empty text.
[[nodiscard]] std::string_view convertIdentifierToString(std::int64_t identifier);

/// The names of files that hold an upload's body while it is made begin like this; they are in the temporary directory.
inline constexpr std::string_view kUploadBodyPrefix = "flusher_";

/// The upload session's note on a task: whose it is, the count that its end is booked with in the statistics, and the
/// recorded events in it.
struct UploadNote {
    std::int64_t flusher = 0;
    std::int64_t feedbacks = 0;
    std::uint64_t events = 0;
    std::string process{}; ///< tells tasks of this process from those of earlier ones

    [[nodiscard]] platform::Value value() const;
    [[nodiscard]] static UploadNote from(const platform::Value& value);
};

/// Writes an upload's JSON text, piece by piece. False if it is no JSON object, or the stream is in error.
bool writeJson(FeedbacksToSend& feedbacks, OutputStream& stream);

/// Turns what has feedback to send into compressed JSON files, and uploads each to the endpoint that the bag names.
///
/// Every object gets one attempt: once it is flushed it is gone, uploaded or not. Without an endpoint nothing is
/// uploaded. Any thread.
class TavrinFeedbackFlusher : public std::enable_shared_from_this<TavrinFeedbackFlusher> {
public:
    using Bodies = std::vector<platform::Bytes>;

    /// `identifier`: 0 sends crowdsourcing records, 1 sessions.
    static std::shared_ptr<TavrinFeedbackFlusher> make(Assembly& assembly, std::int64_t identifier);
    TavrinFeedbackFlusher(Assembly& assembly, std::int64_t identifier);
    ~TavrinFeedbackFlusher();

    [[nodiscard]] std::int64_t identifier() const { return _identifier; }

    /// Takes an object for the next flush, soon, then calls back.
    void flush(std::shared_ptr<Flushable> object, std::move_only_function<void()> callback);
    /// The same for a record that is sent on its own; dropped where too many wait.
    void flush(std::shared_ptr<ZRCustomFeedback> record, std::move_only_function<void()> callback);
    void flushSyncFromArray(std::vector<std::shared_ptr<Flushable>> objects);
    /// Forgets what was taken and not flushed.
    void dropFeedbacks();

    /// Flushes, soon. With a callback, it gets the compressed bodies.
    void flushToWireAsync(std::move_only_function<void(Bodies)> callback);
    void flushAllToWire(std::move_only_function<void(Bodies)> callback) { flushToWireAsync(std::move(callback)); }
    /// Flushes, and answers the compressed bodies. Waits for the queue.
    Bodies flushToWireSync();

    // They wait for the queue.
    [[nodiscard]] std::size_t countOfDatabuffer();
    [[nodiscard]] std::vector<std::shared_ptr<Flushable>> sessionBuffer();
    [[nodiscard]] std::optional<platform::Url> serverEndpoint();

    /// What the flusher remembers of an upload until it ends. A task of an earlier process is known by its note.
    void setFeedbacksPerTask(const platform::BackgroundTask& task, std::int64_t count);
    void removeFeedbacksForTask(const platform::BackgroundTask& task);
    [[nodiscard]] std::int64_t getFeedbackCountForTask(const platform::BackgroundTask& task);
    [[nodiscard]] std::map<std::uint64_t, std::int64_t> feedbacksPerTask();

    void setEndpoint(std::optional<platform::Url> endpoint);
    void bagChangeNotification(const std::shared_ptr<const TAVBag>& bag);

private:
    [[nodiscard]] std::optional<platform::Url> _fetchEndpointFromBag(const TAVBag& bag) const;
    Bodies flushToWireWithObjectsReturned(bool returned);
    void _flushObject(Flushable& object, Bodies* bodies);
    void _upload(const std::filesystem::path& fpath, const std::string& digest, std::size_t count, std::size_t events);
    void _saveFile(const std::filesystem::path& fpath, Bodies& bodies);

    Assembly& _assembly;
    const std::int64_t _identifier;
    std::shared_ptr<platform::Queue> _queueBuffer; // guards the buffer and the endpoint
    std::vector<std::shared_ptr<Flushable>> _sessionBuffer;
    std::size_t _recordsBuffered = 0; ///< records in the buffer that go out on their own, and their bytes
    std::size_t _recordBytesBuffered = 0;
    std::optional<platform::Url> _serverEndpoint;
    std::shared_ptr<platform::Queue> _feedbackCountQueue; // guards the counts
    std::map<std::uint64_t, std::int64_t> _feedbacksPerTask;
    platform::NotificationCenter::Token _bagObserver;
};

} // namespace tavrin
