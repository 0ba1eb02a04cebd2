#pragma once

#include <memory>

#include "platform/values/Error.h"
#include "tavrind/Assembly.h"

namespace platform {
struct Device;
namespace ipc {
class Listener;
}
} // namespace platform

namespace tavrin {

class TavrinDPAppDeepLinkIngester;
class TavrinService;

/// A started daemon: the services, and what only the entry point holds.
struct Daemon {
    explicit Daemon(platform::Device& device);
    ~Daemon();

    Assembly assembly;
    std::shared_ptr<TavrinDPAppDeepLinkIngester> deepLinkIngester;
    std::shared_ptr<TavrinService> service;
    std::unique_ptr<platform::ipc::Listener> listener;
};

/// Makes the services in their fixed order, and then listens. Fails only if the service's socket can't be had, for
/// example because another daemon serves it. The device must outlive the daemon.
[[nodiscard]] platform::Result<std::unique_ptr<Daemon>> startUp(platform::Device& device);

} // namespace tavrin
