#pragma once

#include <memory>
#include <string>

#include "platform/net/BackgroundSession.h"
#include "platform/values/Error.h"
#include "tavrind/Assembly.h"
#include "tavrind/Restart.h"

namespace platform {
struct Device;
namespace ipc {
class Listener;
}
} // namespace platform

namespace tavrin {

class TavrinDPAppDeepLinkIngester;
class TavrinService;

/// A started daemon: the services, and the objects that only the entry point owns.
struct Daemon {
    explicit Daemon(platform::Device& device);
    ~Daemon();

    Assembly assembly;
    std::shared_ptr<TavrinDPAppDeepLinkIngester> deepLinkIngester;
    std::shared_ptr<TavrinService> service;
    std::unique_ptr<platform::ipc::Listener> listener;
};

/// The configurations of the background sessions. `caFile` as in `Assembly`.
[[nodiscard]] platform::BackgroundSessionConfiguration downloadConfiguration(std::string caFile);
[[nodiscard]] platform::BackgroundSessionConfiguration uploadConfiguration(std::string caFile);

/// Creates the services in their fixed order, then starts to listen. Fails only if the service's socket is not
/// available, for example because another daemon serves it. The device must outlive the daemon.
[[nodiscard]] platform::Result<std::unique_ptr<Daemon>> startUp(platform::Device& device, StartOptions options = {});

} // namespace tavrin
