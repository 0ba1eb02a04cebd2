#pragma once

#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/values/Value.h"
#include "tavrind/ClientSessionHeader.h"

namespace platform {
class Queue;
struct Error;
} // namespace platform

namespace tavrin {

struct Assembly;
struct TavrinFeedback;
class ClientSession;
class FileContainer;
enum class FileUse;

/// The current session of a manager: one session, or one for each user agent. Any thread.
class Session {
public:
    virtual ~Session() = default;
    /// Adds an event. `call` (may be null) is the client's call that reported it: it is released once the event is
    /// written or dropped.
    virtual void addFeedback(std::shared_ptr<TavrinFeedback> feedback, std::shared_ptr<void> call = {}) = 0;
    /// Returns the user's GUID at the beginning of the session.
    [[nodiscard]] virtual const platform::Uuid& userGuid() const = 0;
    /// Returns the events that are kept in memory (see `Assembly::testFeedbacks`), oldest first.
    [[nodiscard]] virtual std::vector<std::shared_ptr<TavrinFeedback>> getSessionFeedbacks() = 0;
    /// Returns the same events as dictionaries, with timestamps in milliseconds since the first event.
    [[nodiscard]] virtual platform::Value::Array feedbacksWithRelativeTimestamp() = 0;
    /// Calls back with the session of each user agent; `last` is true for the final one.
    virtual void enumerateSessions(const std::function<void(ClientSession& session, bool last)>& callback) = 0;
};

/// One session of one user agent. Writes its events to its own file as they arrive, until the session is complete;
/// `StoredSession` is the content of that file. Any thread.
class ClientSession final : public Session {
public:
    /// Begins a session with `feedback`, whose agent and GUID become the session's, and creates its file.
    ClientSession(Assembly& assembly, std::shared_ptr<TavrinFeedback> feedback, std::int64_t previousSessionEndReason,
                  std::shared_ptr<void> call = {});
    /// Begins a one-off session: `feedback` is its only record, and the caller completes it.
    ClientSession(Assembly& assembly, std::shared_ptr<TavrinFeedback> feedback, std::shared_ptr<void> call = {});
    ~ClientSession() override;

    void addFeedback(std::shared_ptr<TavrinFeedback> feedback, std::shared_ptr<void> call = {}) override;
    /// Ends the session: closes its file and lists it for upload.
    void sessionComplete();
    [[nodiscard]] const platform::Uuid& userGuid() const override { return _header.userGuid; }
    std::vector<std::shared_ptr<TavrinFeedback>> getSessionFeedbacks() override;
    platform::Value::Array feedbacksWithRelativeTimestamp() override;
    void enumerateSessions(const std::function<void(ClientSession& session, bool last)>& callback) override
    {
        callback(*this, true);
    }

    [[nodiscard]] const ClientSessionHeader& header() const { return _header; }
    [[nodiscard]] const std::string& agent() const { return _header.agent; }

    /// Creates a one-off session with an error of the daemon.
    [[nodiscard]] static std::shared_ptr<ClientSession> createFeedbackSessionFromError(const platform::Error& error,
                                                                                       Assembly& assembly);

private:
    ClientSession(Assembly& assembly, std::shared_ptr<TavrinFeedback> feedback, std::int64_t previousSessionEndReason,
                  std::shared_ptr<void> call, FileUse use);
    void _write(std::shared_ptr<TavrinFeedback> feedback, std::shared_ptr<void> call);
    // On the assembly's dateQueue.
    [[nodiscard]] bool _firstUseOfTheDay();
    [[nodiscard]] bool _updateFirstUseDate(const std::optional<std::string>& key);

    Assembly& _assembly;
    ClientSessionHeader _header;
    std::shared_ptr<FileContainer> _storageHandle;
    std::shared_ptr<platform::Queue> _sessionQueue;
    /// On the queue; shared with pending writes. Filled only if the assembly's `testFeedbacks` is set.
    std::shared_ptr<std::vector<std::shared_ptr<TavrinFeedback>>> _sessionFeedbacks;
};

/// Returns the user default with the date of a client's latest first session of a day; nothing for an untracked client.
[[nodiscard]] std::optional<std::string> firstUseKey(std::string_view userAgent);

} // namespace tavrin
