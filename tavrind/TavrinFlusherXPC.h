#pragma once

#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "CoreTavrin/TAVProtocols.h"

namespace tavrin {

struct Assembly;
class ClientConnection;

/// Lets a diagnostic tool watch and steer the feedback pipeline, on an endpoint of its own. There is no feedback to
/// watch; every intent is answered as unsupported. Any thread.
class TavrinFlusherXPC : public TAVFlusherXPC, public std::enable_shared_from_this<TavrinFlusherXPC> {
public:
    using GetClientConnections = std::function<std::vector<std::shared_ptr<ClientConnection>>()>;

    static std::shared_ptr<TavrinFlusherXPC> make(Assembly& assembly, GetClientConnections getClientConnections);
    TavrinFlusherXPC(Assembly& assembly, GetClientConnections getClientConnections);
    ~TavrinFlusherXPC() override;

    /// The listener's address.
    [[nodiscard]] std::string endpoint() const;
    void initiateConnectionWithIntent(std::uint64_t intent) override;

private:
    Assembly& _assembly;
    GetClientConnections _getClientConnections;
    std::unique_ptr<platform::ipc::Listener> _listener;
};

} // namespace tavrin
