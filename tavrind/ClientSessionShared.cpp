#include "tavrind/ClientSessionShared.h"

#include <iterator>

#include "platform/device/Device.h"
#include "tavrind/Assembly.h"
#include "tavrind/QueueRanks.h"
#include "tavrind/TavrinFeedback.h"
#include "tavrind/TavrinLogging.h"

namespace tavrin {

namespace {

/// Limit of sessions at a time: one for each user agent, which clients choose. Only as many can have a file.
constexpr std::size_t kMaximumSessions = 2000;

} // namespace

ClientSessionShared::ClientSessionShared(Assembly& assembly, std::shared_ptr<TavrinFeedback> feedback,
                                         std::int64_t previousSessionEndReason, std::shared_ptr<void> call)
    : _assembly(assembly), _userGuid(platform::Uuid::parse(feedback->userGuid).value_or(platform::Uuid())),
      _previousSessionEndReason(previousSessionEndReason),
      _sessionQueue(assembly.device.serialQueue("com.quorvane.tavrind.clientSessionSharedQueue", rank::kShared))
{
    _begin(std::move(feedback), std::move(call));
}

void ClientSessionShared::_begin(std::shared_ptr<TavrinFeedback> feedback, std::shared_ptr<void> call)
{
    const std::string agent = feedback->userAgent;
    _sessionMap[agent] =
        std::make_shared<ClientSession>(_assembly, std::move(feedback), _previousSessionEndReason, std::move(call));
}

void ClientSessionShared::addFeedback(std::shared_ptr<TavrinFeedback> feedback, std::shared_ptr<void> call)
{
    _sessionQueue->async([self = shared_from_this(), feedback = std::move(feedback), call = std::move(call)]() mutable {
        const auto found = self->_sessionMap.find(feedback->userAgent);
        if (found == self->_sessionMap.end()) {
            if (self->_sessionMap.size() < kMaximumSessions) return self->_begin(std::move(feedback), std::move(call));
            log(kLogSession).error("{} user agents have a session, dropping an event of another", kMaximumSessions);
            return self->_assembly.feedbackBooks.record(FeedbackFate::NoContainer);
        }
        found->second->addFeedback(std::move(feedback), std::move(call));
    });
}

template <class List> List ClientSessionShared::_joined(List (ClientSession::*collect)())
{
    return _sessionQueue->sync([&] {
        List all;
        for (const auto& [agent, session] : _sessionMap) {
            List some = ((*session).*collect)();
            std::ranges::move(some, std::back_inserter(all));
        }
        return all;
    });
}

std::vector<std::shared_ptr<TavrinFeedback>> ClientSessionShared::getSessionFeedbacks()
{
    return _joined(&ClientSession::getSessionFeedbacks);
}

platform::Value::Array ClientSessionShared::feedbacksWithRelativeTimestamp()
{
    return _joined(&ClientSession::feedbacksWithRelativeTimestamp);
}

void ClientSessionShared::enumerateSessions(const std::function<void(ClientSession& session, bool last)>& callback)
{
    _sessionQueue->sync([&] {
        for (auto each = _sessionMap.begin(); each != _sessionMap.end(); ++each)
            callback(*each->second, std::next(each) == _sessionMap.end());
    });
}

} // namespace tavrin
