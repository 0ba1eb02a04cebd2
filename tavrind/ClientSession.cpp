#include "tavrind/ClientSession.h"

#include "tavrind/ClientSessionManager.h"
#include "tavrind/TavrinFeedback.h"

namespace tavrin {

ClientSession::ClientSession(Assembly& assembly, std::shared_ptr<TavrinFeedback> feedback) : _assembly(assembly)
{
    addFeedback(std::move(feedback));
}

void ClientSession::addFeedback(std::shared_ptr<TavrinFeedback>) {}

void ClientSession::sessionComplete() {}

std::shared_ptr<ClientSession> ClientSession::createFeedbackSessionFromError(const platform::Error& error,
                                                                             Assembly& assembly)
{
    return std::make_shared<ClientSession>(assembly, ClientSessionManager::errorFeedback(error, assembly));
}

} // namespace tavrin
