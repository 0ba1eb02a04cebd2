#pragma once

#include <map>
#include <memory>
#include <string>

#include "tavrind/ClientSession.h"

namespace tavrin {

/// The session that all clients share: a `ClientSession` for each user agent that has reported, all under one GUID. Any
/// thread.
class ClientSessionShared final : public Session, public std::enable_shared_from_this<ClientSessionShared> {
public:
    /// Begins with `feedback` and the session of its user agent.
    ClientSessionShared(Assembly& assembly, std::shared_ptr<TavrinFeedback> feedback,
                        std::int64_t previousSessionEndReason, std::shared_ptr<void> call = {});

    /// Adds the event to the session of its user agent, asynchronously.
    void addFeedback(std::shared_ptr<TavrinFeedback> feedback, std::shared_ptr<void> call = {}) override;
    [[nodiscard]] const platform::Uuid& userGuid() const override { return _userGuid; }
    // The results are those of all sessions, ordered by user agent.
    std::vector<std::shared_ptr<TavrinFeedback>> getSessionFeedbacks() override;
    platform::Value::Array feedbacksWithRelativeTimestamp() override;
    void enumerateSessions(const std::function<void(ClientSession& session, bool last)>& callback) override;

private:
    /// Concatenates the results of `collect` for all sessions.
    template <class List> List _joined(List (ClientSession::*collect)());
    void _begin(std::shared_ptr<TavrinFeedback> feedback, std::shared_ptr<void> call);

    Assembly& _assembly;
    const platform::Uuid _userGuid;
    const std::int64_t _previousSessionEndReason;
    std::shared_ptr<platform::Queue> _sessionQueue;
    std::map<std::string, std::shared_ptr<ClientSession>> _sessionMap; // by user agent; on _sessionQueue
};

} // namespace tavrin
