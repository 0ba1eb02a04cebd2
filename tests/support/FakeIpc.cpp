#include "tests/support/FakeIpc.h"

#include <algorithm>

#include <gtest/gtest.h>

#include "platform/values/Record.h"
#include "platform/values/ValueCoder.h"
#include "tests/support/BusMessages.h"

namespace platform::test {

namespace {

const ipc::Member* find(const std::vector<ipc::Member>& members, std::string_view name)
{
    auto found = std::ranges::find(members, name, &ipc::Member::name);
    return found == members.end() ? nullptr : &*found;
}

/// `message` with dictionaries in place of its records: as a peer reads it that knows no records.
ipc::Message withoutRecords(ipc::Message message)
{
    for (std::size_t i = 0; i < message.records.size(); ++i)
        if (const Record* record = message.record(i)) message.args[i] = toValue(*record);
    message.records.clear();
    return message;
}

/// Expects that `message` can travel under the D-Bus signature.
void expectShape(std::string_view what, std::string_view signature, const ipc::Message& message)
{
    const auto written = ipc::encodeArguments(newBusMessage().get(), signature, message);
    EXPECT_TRUE(written) << what << ": " << written.error();
}

} // namespace

Value FakeCall::argument(std::size_t index) const
{
    return _result && *_result && index < (*_result)->args.size() ? (*_result)->args[index] : Value();
}

ipc::CallResult FakeCall::take()
{
    if (!_result) return std::unexpected(ipc::CallError{.name = "test.NoAnswer", .message = "there is no answer"});
    return *std::exchange(_result, std::nullopt);
}

FakeConnection::FakeConnection(const ipc::Interface& interface, ipc::Peer peer, std::shared_ptr<Queue> queue)
    : _interface(interface), _peer(peer), _queue(std::move(queue))
{}

std::shared_ptr<FakeCall> FakeConnection::call(std::string_view member, std::vector<Value> args)
{
    return call(member, ipc::Message{std::move(args), {}});
}

std::shared_ptr<FakeCall> FakeConnection::call(std::string_view member, ipc::Message arguments)
{
    auto call = std::make_shared<FakeCall>();
    const ipc::Member* found = find(_interface.methods, member);
    if (!found) {
        ADD_FAILURE() << _interface.name << " has no method " << member;
        return call;
    }
    arguments = withoutRecords(std::move(arguments));
    expectShape(member, found->in, arguments);

    if (!_resumed || _invalidated) {
        call->_state = FakeCall::State::Abandoned;
        return call;
    }
    _queue->async([dropped = _dropCalls, handler = _handler, name = found->name, out = found->out, call,
                   arguments = std::move(arguments)]() mutable {
        ipc::Responder reply(
            [call, name, out](ipc::CallResult result) {
                if (result) result = withoutRecords(std::move(*result));
                if (result) expectShape(name, out, *result);
                call->_state = FakeCall::State::Answered;
                call->_result = std::move(result);
            },
            [call] { call->_state = FakeCall::State::Abandoned; });
        if (!*dropped && handler && *handler)
            (*handler)(name, std::move(arguments), std::move(reply));
        else
            reply.abandon();
    });
    return call;
}

void FakeConnection::finish(bool dropQueuedCalls)
{
    if (dropQueuedCalls) *_dropCalls = true;
    if (std::exchange(_invalidated, true)) return;
    _handler.reset();
    if (_invalidationHandler) _queue->async(std::exchange(_invalidationHandler, {}));
}

void FakeConnection::exportObject(ipc::Handler handler)
{
    EXPECT_FALSE(_resumed) << "exportObject after resume";
    _handler = std::make_shared<ipc::Handler>(std::move(handler));
}

void FakeConnection::setInvalidationHandler(std::move_only_function<void()> handler)
{
    EXPECT_FALSE(_resumed) << "setInvalidationHandler after resume";
    _invalidationHandler = std::move(handler);
}

void FakeConnection::push(std::string_view signal, ipc::Message arguments)
{
    const ipc::Member* found = find(_interface.signals, signal);
    if (!found) {
        ADD_FAILURE() << _interface.name << " has no signal " << signal;
        return;
    }
    arguments = withoutRecords(std::move(arguments));
    expectShape(signal, found->in, arguments);
    if (_invalidated) {
        if (_pushErrorHandler) _pushErrorHandler("the connection has ended");
        return;
    }
    _pushes.push_back({std::string(signal), std::move(arguments)});
}

/// Shared by a listener, which its service owns, and the transport, which only knows it while that lives.
struct FakeTransport::Endpoint {
    const ipc::Interface interface;
    const std::string label;
    const std::string address;
    ipc::Listener::Acceptor acceptor{};
    bool resumed = false;
};

class FakeTransport::FakeListener final : public ipc::Listener {
public:
    explicit FakeListener(std::shared_ptr<Endpoint> endpoint) : _endpoint(std::move(endpoint)) {}
    void setAcceptor(Acceptor acceptor) override { _endpoint->acceptor = std::move(acceptor); }
    void resume() override { _endpoint->resumed = true; }
    [[nodiscard]] std::string endpoint() override { return _endpoint->address; }

private:
    const std::shared_ptr<Endpoint> _endpoint;
};

std::unique_ptr<ipc::Listener> FakeTransport::anonymous(const ipc::Interface& interface, const std::string& label)
{
    auto address = "unix:path=/fake/" + std::to_string(_endpoints.size());
    auto endpoint = std::make_shared<Endpoint>(interface, label, std::move(address));
    _endpoints.push_back(endpoint);
    return std::make_unique<FakeListener>(std::move(endpoint));
}

std::shared_ptr<FakeConnection> FakeTransport::connect(std::string_view interfaceOrAddress, ipc::Peer peer)
{
    std::shared_ptr<Endpoint> endpoint;
    for (const auto& candidate : _endpoints)
        if (auto living = candidate.lock())
            if (living->interface.name == interfaceOrAddress || living->address == interfaceOrAddress)
                endpoint = std::move(living);
    if (!endpoint || !endpoint->resumed || !endpoint->acceptor) return nullptr;
    auto queue = Queue::make(endpoint->label, Queue::Kind::Serial, _executor, _clock);
    auto connection = std::make_shared<FakeConnection>(endpoint->interface, peer, std::move(queue));
    _connections.push_back(connection);
    // As with the real one, letting go of what the acceptor gets ends the connection.
    const auto acceptor = endpoint->acceptor;
    acceptor(std::shared_ptr<ipc::Connection>(connection.get(),
                                              [connection](ipc::Connection*) { connection->invalidate(); }));
    return connection;
}

void FakeTransport::endAll()
{
    for (const auto& connection : std::exchange(_connections, {}))
        if (const auto living = connection.lock()) living->end();
}

} // namespace platform::test
