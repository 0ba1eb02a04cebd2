#include "tavrind/TavrinFlusherXPC.h"

#include "platform/Device.h"
#include "tavrind/Assembly.h"
#include "tavrind/TavrinLogging.h"

namespace tavrin {

std::shared_ptr<TavrinFlusherXPC> TavrinFlusherXPC::make(Assembly& assembly, GetClientConnections getClientConnections)
{
    auto bridge = std::make_shared<TavrinFlusherXPC>(assembly, std::move(getClientConnections));
    bridge->_listener->setAcceptor(
        [weak = bridge->weak_from_this()](std::shared_ptr<platform::ipc::Connection> connection) {
            connection->exportObject(flusherHandler(weak));
            // The handler keeps the connection until it ends.
            connection->setInvalidationHandler(
                [connection] { TavrinLogForCategory(kLogFlusher).log("listener invalidated"); });
            connection->resume();
        });
    bridge->_listener->resume();
    TavrinLogForCategory(kLogFlusher).log("started accepting connections :{}", bridge->endpoint());
    return bridge;
}

TavrinFlusherXPC::TavrinFlusherXPC(Assembly& assembly, GetClientConnections getClientConnections)
    : _assembly(assembly), _getClientConnections(std::move(getClientConnections)),
      _listener(assembly.device.ipc.anonymous(flusherInterface(), "com.quorvane.tavrind.flusherXPC"))
{}

TavrinFlusherXPC::~TavrinFlusherXPC()
{
    TavrinLogForCategory(kLogFlusher).log("stopped listening for TAVFlusherListener connections");
}

std::string TavrinFlusherXPC::endpoint() const
{
    return _listener->endpoint();
}

void TavrinFlusherXPC::initiateConnectionWithIntent(std::uint64_t intent)
{
    TavrinLogForCategory(kLogFlusher).log("Unsupported command yet: {}", intent);
}

} // namespace tavrin
