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
#include "platform/values/Value.h"
#include "searchrecords/ZREnums.h"
#include "tavrind/Flushable.h"

namespace platform {
class BackgroundTask;
class Queue;
} // namespace platform

namespace tavrin {

struct Assembly;
struct ZRCustomFeedback;
class TAVBag;

/// The kind of feedback that a flusher sends. The numbers are stored with upload tasks.
enum class FlusherIdentity : std::int64_t {
    Crowdsourcing, ///< records that clients report for a separate service
    Feedbacks,     ///< sessions
};
template <> inline constexpr auto kTexts<FlusherIdentity> = texts("crowdsourcing", "Feedbacks");

/// Returns the text of an identity; empty for any other number.
[[nodiscard]] std::string_view convertIdentifierToString(FlusherIdentity identifier);

/// The data that the upload session stores with a task.
struct UploadNote {
    FlusherIdentity flusher{};
    std::int64_t feedbacks = 0; ///< added to the statistics when the task ends
    std::uint64_t events = 0;   ///< recorded events in the body
    std::string process{};      ///< the process that made the task: see `FeedbackBooks::process`

    [[nodiscard]] platform::Value value() const;
    [[nodiscard]] static UploadNote from(const platform::Value& value);
};

/// Compresses feedback into JSON files and uploads each to the endpoint that the bag names.
///
/// Each object gets one attempt: a flush discards it, even if the upload fails. Without an endpoint, nothing is
/// uploaded. Any thread.
class TavrinFeedbackFlusher : public std::enable_shared_from_this<TavrinFeedbackFlusher> {
public:
    using Bodies = std::vector<platform::Bytes>;

    /// Creates a flusher whose endpoint follows the bag.
    static std::shared_ptr<TavrinFeedbackFlusher> make(Assembly& assembly, FlusherIdentity identifier);
    TavrinFeedbackFlusher(Assembly& assembly, FlusherIdentity identifier);
    ~TavrinFeedbackFlusher();

    [[nodiscard]] FlusherIdentity identifier() const { return _identifier; }

    /// Adds an object to the next flush, asynchronously, then calls back.
    void flush(std::shared_ptr<Flushable> object, std::move_only_function<void()> callback);
    /// Adds a record that is sent on its own, asynchronously, then calls back. Drops the record if 1,000 of them or 8
    /// MiB of their JSON are buffered.
    void flush(std::shared_ptr<ZRCustomFeedback> record, std::move_only_function<void()> callback);
    /// Adds objects to the next flush. Asynchronous, despite its name.
    void flushSyncFromArray(std::vector<std::shared_ptr<Flushable>> objects);
    /// Drops the objects that are buffered for the next flush, asynchronously.
    void dropFeedbacks();

    /// Flushes asynchronously, then passes the compressed bodies to the callback, if any.
    void flushToWireAsync(std::move_only_function<void(Bodies)> callback);
    void flushAllToWire(std::move_only_function<void(Bodies)> callback) { flushToWireAsync(std::move(callback)); }
    /// Flushes and returns the compressed bodies. Blocks on the queue.
    Bodies flushToWireSync();

    /// Returns what a flush of `object` would upload now: {"flusher", "body" (bytes), "url", "headers", "events"};
    /// "url" and "headers" are missing without an endpoint. Returns null if the object can't be written as JSON. Blocks
    /// on the queue. Uses up the object, unless it is a record that is sent on its own.
    [[nodiscard]] platform::Value preview(Flushable& object);
    // These block on the queue.
    [[nodiscard]] std::size_t countOfDatabuffer();
    [[nodiscard]] std::vector<std::shared_ptr<Flushable>> sessionBuffer();
    [[nodiscard]] std::optional<platform::Url> serverEndpoint();

    /// The count of feedback in each running upload. For a task of an earlier process, it is read from the task's note.
    void setFeedbacksPerTask(const platform::BackgroundTask& task, std::int64_t count);
    void removeFeedbacksForTask(const platform::BackgroundTask& task);
    [[nodiscard]] std::int64_t getFeedbackCountForTask(const platform::BackgroundTask& task);
    [[nodiscard]] std::map<std::uint64_t, std::int64_t> feedbacksPerTask();

    /// Sets the endpoint, asynchronously. The endpoint of sessions gets the query "v=2" in place of its own.
    void setEndpoint(std::optional<platform::Url> endpoint);
    void bagChangeNotification(const std::shared_ptr<const TAVBag>& bag);

private:
    [[nodiscard]] std::optional<platform::Url> _fetchEndpointFromBag(const TAVBag& bag) const;
    Bodies flushToWireWithObjectsReturned(bool returned);
    void _flushObject(Flushable& object, Bodies* bodies);
    void _upload(const std::filesystem::path& fpath, const std::string& digest, std::size_t count, std::size_t events);
    void _saveFile(const std::filesystem::path& fpath, Bodies& bodies);

    Assembly& _assembly;
    const FlusherIdentity _identifier;
    std::shared_ptr<platform::Queue> _queueBuffer; // guards the buffer and the endpoint
    std::vector<std::shared_ptr<Flushable>> _sessionBuffer;
    std::size_t _recordsBuffered = 0; ///< buffered records that are sent on their own, and their bytes
    std::size_t _recordBytesBuffered = 0;
    std::optional<platform::Url> _serverEndpoint;
    std::shared_ptr<platform::Queue> _feedbackCountQueue; // guards the counts
    std::map<std::uint64_t, std::int64_t> _feedbacksPerTask;
    platform::NotificationCenter::Token _bagObserver;
};

} // namespace tavrin
