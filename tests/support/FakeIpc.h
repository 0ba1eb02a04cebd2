#pragma once

#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "platform/ipc/Ipc.h"

namespace platform {
class Clock;
}

namespace platform::test {

/// What became of a call that a test made.
class FakeCall {
public:
    [[nodiscard]] bool pending() const { return _state == State::Pending; }
    [[nodiscard]] bool answered() const { return _state == State::Answered; }
    [[nodiscard]] bool abandoned() const { return _state == State::Abandoned; }
    /// The answer's argument at `index`; the null value while there is none or for an error.
    [[nodiscard]] Value argument(std::size_t index) const;
    /// The whole answer, taken out; only once it is there.
    [[nodiscard]] ipc::CallResult take();

private:
    friend class FakeConnection;
    enum class State { Pending, Answered, Abandoned };
    State _state = State::Pending;
    std::optional<ipc::CallResult> _result;
};

struct FakePush {
    std::string signal;
    ipc::Message message;
};

/// The server's end of a connection whose peer is the test. Like the real one it calls its handler on its queue, sends
/// nothing after it was invalidated, and checks that what crosses it fits the interface: a mismatch fails the test.
class FakeConnection final : public ipc::Connection {
public:
    FakeConnection(const ipc::Interface& interface, ipc::Peer peer, std::shared_ptr<Queue> queue);

    // the peer's side
    std::shared_ptr<FakeCall> call(std::string_view member, std::vector<Value> args = {});
    std::shared_ptr<FakeCall> call(std::string_view member, ipc::Message arguments);
    void end() { finish(false); }
    /// What was pushed so far, in order; it is taken out.
    [[nodiscard]] std::vector<FakePush> takePushes() { return std::exchange(_pushes, {}); }
    [[nodiscard]] bool resumed() const { return _resumed; }
    [[nodiscard]] bool invalidated() const { return _invalidated; }

    // the service's side
    [[nodiscard]] ipc::Peer peer() const override { return _peer; }
    [[nodiscard]] const std::shared_ptr<Queue>& queue() const override { return _queue; }
    void exportObject(ipc::Handler handler) override;
    void setInvalidationHandler(std::move_only_function<void()> handler) override;
    void setPushErrorHandler(std::function<void(const std::string&)> handler) override
    {
        _pushErrorHandler = std::move(handler);
    }
    void resume() override { _resumed = true; }
    void push(std::string_view signal, ipc::Message arguments) override;
    void invalidate() override { finish(true); }

private:
    void finish(bool dropQueuedCalls);

    const ipc::Interface _interface;
    const ipc::Peer _peer;
    const std::shared_ptr<Queue> _queue;
    std::shared_ptr<ipc::Handler> _handler;
    std::move_only_function<void()> _invalidationHandler;
    std::function<void(const std::string&)> _pushErrorHandler;
    std::vector<FakePush> _pushes;
    const std::shared_ptr<bool> _dropCalls = std::make_shared<bool>(false);
    bool _resumed = false;
    bool _invalidated = false;
};

/// Listeners that exist in memory. A test connects to them by interface name, or by the address that it was handed.
class FakeTransport final : public ipc::Transport {
public:
    FakeTransport(Executor& executor, Clock& clock) : _executor(executor), _clock(clock) {}

    /// A connection to the newest living listener of that interface or address, already handed to its acceptor on this
    /// thread; null where there is no such listener or it doesn't accept yet.
    std::shared_ptr<FakeConnection> connect(std::string_view interfaceOrAddress, ipc::Peer peer = {1, 0});
    void endAll();

    [[nodiscard]] Result<std::unique_ptr<ipc::Listener>> listen(const ipc::Interface& interface,
                                                                const std::string& label) override
    {
        return anonymous(interface, label);
    }
    [[nodiscard]] std::unique_ptr<ipc::Listener> anonymous(const ipc::Interface& interface,
                                                           const std::string& label) override;

private:
    struct Endpoint;
    class FakeListener;

    Executor& _executor;
    Clock& _clock;
    std::vector<std::weak_ptr<Endpoint>> _endpoints;
    std::vector<std::weak_ptr<FakeConnection>> _connections;
};

} // namespace platform::test
