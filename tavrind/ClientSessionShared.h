#pragma once

#include <map>
#include <memory>
#include <string>

#include "tavrind/ClientSession.h"

namespace tavrin {

/// One session that all clients share: a `ClientSession` for each user agent that has reported, all begun under one
/// GUID. Any thread.
class ClientSessionShared final : public Session, public std::enable_shared_from_this<ClientSessionShared> {
public:
    /// Begins with `feedback`, and the session of its user agent.
    ClientSessionShared(Assembly& assembly, std::shared_ptr<TavrinFeedback> feedback,
                        std::int64_t previousSessionEndReason);

    /// Soon, to the session of the feedback's user agent.
    void addFeedback(std::shared_ptr<TavrinFeedback> feedback) override;
    [[nodiscard]] const platform::Uuid& userGuid() const override { return _userGuid; }
    /// Those of one user agent behind those of another; the same holds below.
    std::vector<std::shared_ptr<TavrinFeedback>> getSessionFeedbacks() override;
    platform::Value::Array feedbacksWithRelativeTimestamp() override;
    void enumerateSessions(const std::function<void(ClientSession& session, bool last)>& callback) override;

private:
    /// What `collect` answers for each session, joined.
    template <class List> List _joined(List (ClientSession::*collect)());
    void _begin(std::shared_ptr<TavrinFeedback> feedback);

    Assembly& _assembly;
    const platform::Uuid _userGuid;
    const std::int64_t _previousSessionEndReason;
    std::shared_ptr<platform::Queue> _sessionQueue;
    std::map<std::string, std::shared_ptr<ClientSession>> _sessionMap; // by user agent; on _sessionQueue
};

} // namespace tavrin
