#include "tavrind/ClientSessionManager.h"

#include "CoreTavrin/TAVSessionConfiguration.h"
#include "platform/Clock.h"
#include "platform/Device.h"
#include "searchrecords/ZRErrorFeedback.h"
#include "tavrind/Assembly.h"
#include "tavrind/TavrinFeedback.h"
#include "tavrind/TavrinLogging.h"
#include "tavrind/TavrinUserGUIDController.h"

namespace tavrin {

ClientSessionManager::ClientSessionManager(Assembly& assembly, std::shared_ptr<TavrinUserGUIDController> guidController,
                                           std::string identifier)
    : _assembly(assembly), _guidController(std::move(guidController)), _identifier(std::move(identifier))
{
    const platform::Log& log = TavrinLogForCategory(kLogSession);
    if (assembly.sharedSession)
        log.log("Tavrin is using shared session for all clients {}", _identifier);
    else
        log.log("Tavrin is using individual session for clients {}", _identifier);
}

void ClientSessionManager::addTavrinFeedback(std::shared_ptr<TavrinFeedback>) {}

void ClientSessionManager::flushSession(std::move_only_function<void()> callback)
{
    if (callback) callback();
}

void ClientSessionManager::flushSessionInvalidation(const std::string&, std::move_only_function<void(bool)> callback)
{
    if (_assembly.sharedSession) return callback(false);
    flushSession([callback = std::move(callback)]() mutable { callback(true); });
}

const std::string& ClientSessionManager::tavrindUserAgent()
{
    static const TAVSessionConfiguration configuration("tavrind", "tavrind/" TAVRIND_VERSION);
    return *configuration.userAgent;
}

std::shared_ptr<TavrinFeedback> ClientSessionManager::errorFeedback(const platform::Error& error, Assembly& assembly)
{
    std::string guid;
    if (assembly.guidController) guid = assembly.guidController->currentUserGUID().string();
    auto record = std::make_shared<ZRErrorFeedback>(error);
    record->timestamp = assembly.device.clock.hostTicks();
    return std::make_shared<TavrinFeedback>(std::move(record), 0, guid, tavrindUserAgent());
}

void ClientSessionManager::reportErrorAsTavrindFeedback(const platform::Error& error, Assembly& assembly)
{
    if (assembly.clientSessionManager) assembly.clientSessionManager->addTavrinFeedback(errorFeedback(error, assembly));
}

} // namespace tavrin
