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

/// What a session manager keeps: one session, or one for each user agent. Any thread.
class Session {
public:
    virtual ~Session() = default;
    virtual void addFeedback(std::shared_ptr<TavrinFeedback> feedback) = 0;
    /// The GUID that the session began under.
    [[nodiscard]] virtual const platform::Uuid& userGuid() const = 0;
    /// The feedback kept in memory, oldest first.
    [[nodiscard]] virtual std::vector<std::shared_ptr<TavrinFeedback>> getSessionFeedbacks() = 0;
    /// The same as dictionaries, with milliseconds since the first.
    [[nodiscard]] virtual platform::Value::Array feedbacksWithRelativeTimestamp() = 0;
    /// Calls back with each session of a user agent; `last` with the last one.
    virtual void enumerateSessions(const std::function<void(ClientSession& session, bool last)>& callback) = 0;
};

/// One session of one user agent: what the user saw and did, written to a file of its own as it comes, until the
/// session is complete.
/// (`StoredSession` is what its file gives.) Any thread.
class ClientSession final : public Session {
public:
    /// A new session that begins with `feedback`, which gives it its agent and GUID. Makes its file.
    ClientSession(Assembly& assembly, std::shared_ptr<TavrinFeedback> feedback,
                  std::int64_t previousSessionEndReason = 0);
    ~ClientSession() override;

    void addFeedback(std::shared_ptr<TavrinFeedback> feedback) override;
    /// Ends the session: its file is closed, and waits for its upload.
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

    /// A session whose only record is an error of the daemon's; the caller completes it.
    [[nodiscard]] static std::shared_ptr<ClientSession> createFeedbackSessionFromError(const platform::Error& error,
                                                                                       Assembly& assembly);

private:
    void _write(std::shared_ptr<TavrinFeedback> feedback);
    // On the assembly's dateQueue.
    [[nodiscard]] bool _firstUseOfTheDay();
    [[nodiscard]] bool _updateFirstUseDate();

    Assembly& _assembly;
    ClientSessionHeader _header;
    std::shared_ptr<FileContainer> _storageHandle;
    std::shared_ptr<platform::Queue> _sessionQueue;
    /// On the queue; shared with the writes under way. Filled only where the assembly's testFeedbacks asks for it.
    std::shared_ptr<std::vector<std::shared_ptr<TavrinFeedback>>> _sessionFeedbacks;
};

/// The user default that holds the day of a client's last session; none for a client that isn't followed.
[[nodiscard]] std::optional<std::string> firstUseKey(std::string_view userAgent);
/// The client that such a key counts for in the statistics; none for a key of no client.
[[nodiscard]] std::optional<std::string_view> dailyActiveClient(std::string_view firstUseKey);

} // namespace tavrin
