#include "tavrind/TavrinFlusherXPC.h"

#include <utility>

#include "platform/device/Device.h"
#include "platform/run/Group.h"
#include "platform/run/Queue.h"
#include "platform/values/Dictionary.h"
#include "tavrind/Assembly.h"
#include "tavrind/BackgroundActivitiesManager.h"
#include "tavrind/ClientConnection.h"
#include "tavrind/QueueRanks.h"
#include "tavrind/TavrinFeedback.h"
#include "tavrind/TavrinLogging.h"

namespace tavrin {

namespace {

/// Passes the commands of one tool's connection to the bridge, with the tool's own proxy.
class ToolConnection final : public TAVFlusherXPC {
public:
    ToolConnection(std::weak_ptr<TavrinFlusherXPC> bridge, std::shared_ptr<TAVFlusherListener> tool, pid_t process)
        : _bridge(std::move(bridge)), _tool(std::move(tool)), _process(process)
    {}
    void initiateConnectionWithIntent(std::uint64_t intent) override
    {
        if (const auto bridge = _bridge.lock()) bridge->initiateConnectionWithIntent(intent, _tool, _process);
    }

private:
    std::weak_ptr<TavrinFlusherXPC> _bridge;
    std::shared_ptr<TAVFlusherListener> _tool;
    const pid_t _process;
};

} // namespace

std::shared_ptr<TavrinFlusherXPC> TavrinFlusherXPC::make(Assembly& assembly, GetClientConnections getClientConnections)
{
    auto bridge = std::make_shared<TavrinFlusherXPC>(assembly, std::move(getClientConnections));
    bridge->_ipcListener->setAcceptor(
        [weak = bridge->weak_from_this()](const std::shared_ptr<platform::ipc::Connection>& connection) {
            if (const auto self = weak.lock()) self->_accept(connection);
        });
    bridge->_ipcListener->resume();
    log(kLogFlusher).log("started accepting connections :{}", bridge->endpoint());
    return bridge;
}

TavrinFlusherXPC::TavrinFlusherXPC(Assembly& assembly, GetClientConnections getClientConnections)
    : _assembly(assembly), _getClientConnections(std::move(getClientConnections)),
      _ipcListener(assembly.device.ipc.anonymous(flusherInterface(), "com.quorvane.tavrind.flusherXPC")),
      _queue(assembly.device.serialQueue("com.quorvane.tavrind.flusherXPCQueue", rank::kStore))
{}

TavrinFlusherXPC::~TavrinFlusherXPC()
{
    log(kLogFlusher).log("stopped listening for TAVFlusherListener connections");
}

std::string TavrinFlusherXPC::endpoint() const
{
    return _ipcListener->endpoint();
}

void TavrinFlusherXPC::_accept(const std::shared_ptr<platform::ipc::Connection>& connection)
{
    const Tool tool = makeFlusherListenerProxy(connection);
    const auto commands = std::make_shared<ToolConnection>(weak_from_this(), tool, connection->peer().pid);
    connection->setPushErrorHandler(
        [](const std::string& reason) { log(kLogFlusher).error("remote proxy error: {}", reason); });
    connection->exportObject(flusherHandler(commands));
    // The handler owns the connection and its exported object until the connection ends.
    connection->setInvalidationHandler([connection, commands, tool, weak = weak_from_this()] {
        log(kLogFlusher).log("listener invalidated");
        if (const auto self = weak.lock()) self->_removeDelegate(tool);
    });
    _queue->async([self = shared_from_this(), tool] { self->_remoteObject = tool; });
    connection->resume();
}

void TavrinFlusherXPC::_removeDelegate(const Tool& tool)
{
    const auto remove = [&tool](Tool& role, const char* what) {
        if (role != tool) return;
        role = nullptr;
        log(kLogFlusher).log("Removed {} listener", what);
    };
    _queue->sync([&] {
        remove(_receivingStreamListener, "receiving stream");
        remove(_sendingStreamListener, "sending stream");
        remove(_remoteObject, "remote");
        _eventsAreWatched = _receivingStreamListener != nullptr;
        _processes.erase(tool.get());
    });
}

platform::Value TavrinFlusherXPC::watchers() const
{
    return _queue->sync([this] {
        platform::Dictionary watchers;
        const auto add = [&](const char* name, const Tool& tool) {
            if (tool) watchers.set(name, _processes.at(tool.get()));
        };
        add("events", _receivingStreamListener);
        add("flushes", _sendingStreamListener);
        return platform::Value(std::move(watchers));
    });
}

void TavrinFlusherXPC::initiateConnectionWithIntent(std::uint64_t intent, std::shared_ptr<TAVFlusherListener> tool,
                                                    pid_t process)
{
    const void* delegate = tool.get();
    const auto assign = [&](Tool TavrinFlusherXPC::* role) {
        const Tool before = _queue->sync([&] {
            _processes[tool.get()] = process;
            Tool replaced = std::exchange(this->*role, tool);
            _remoteObject = tool;
            _eventsAreWatched = _receivingStreamListener != nullptr;
            return replaced;
        });
        const bool watched = role != &TavrinFlusherXPC::_remoteObject;
        if (watched && before && before != tool) before->replaced(static_cast<FlusherIntent>(intent), process);
    };
    switch (static_cast<FlusherIntent>(intent)) {
    case FlusherIntent::WatchFlushes:
        assign(&TavrinFlusherXPC::_sendingStreamListener);
        return log(kLogFlusher).log("new listener for flusher client sessions, delegate: {}", delegate);
    case FlusherIntent::WatchEvents:
        assign(&TavrinFlusherXPC::_receivingStreamListener);
        return log(kLogFlusher).log("new listener for client feedbacks, delegate: {}", delegate);
    case FlusherIntent::StopFlushing:
        assign(&TavrinFlusherXPC::_remoteObject);
        log(kLogFlusher).log("flushing stopped; dump command will start flushing again");
        _assembly.backgroundFlusher->setStopFlushing(true);
        return tool->workDone();
    case FlusherIntent::Dump: assign(&TavrinFlusherXPC::_remoteObject); return _dump(tool);
    }
    log(kLogFlusher).log("Unsupported command yet: {}", intent);
}

void TavrinFlusherXPC::_dump(const Tool& tool)
{
    _queue->sync([&] {
        if (_sendingStreamListener) return;
        log(kLogFlusher).log("no listener for sending stream setting this client as remote");
        _sendingStreamListener = tool;
    });
    const auto flusher = _assembly.backgroundFlusher;
    platform::Group passes;
    for (const auto& connection : _getClientConnections ? _getClientConnections() : ClientConnections()) {
        connection->flushSession([flusher, agent = connection->userAgent(), pass = passes.enter()]() mutable {
            log(kLogFlusher).log("session flushed because of dump command {}", agent);
            flusher->insertFlushActivity([pass = std::move(pass)] {});
        });
    }
    passes.notify([flusher, tool] {
        flusher->setStopFlushing(false);
        tool->workDone();
    });
}

TavrinFlusherXPC::Tool TavrinFlusherXPC::_holderOf(Tool TavrinFlusherXPC::* role) const
{
    return _queue->sync([&] { return this->*role; });
}

void TavrinFlusherXPC::sendDataToSendingStreamListener(const platform::Bytes& body)
{
    if (const Tool listener = _holderOf(&TavrinFlusherXPC::_sendingStreamListener)) listener->flushedData(body);
}

void TavrinFlusherXPC::sendDataToReceivingStreamListener(const TavrinFeedback& feedback)
{
    // An event that nobody watches takes no turn on the queue.
    const Tool listener = _eventsAreWatched ? _holderOf(&TavrinFlusherXPC::_receivingStreamListener) : nullptr;
    const bool logged = platform::Log::enabled(platform::LogLevel::Debug);
    if (!listener && !logged) return;
    const std::string description = feedback.description();
    log(kLogFlusher)
        .debug("id {} agent {} event {}", feedback.queryId, feedback.userAgent, platform::Private{description});
    if (listener) listener->receivedFeedbackDescription(description);
}

} // namespace tavrin
