#include "CoreTavrin/TAVProtocols.h"

#include <algorithm>
#include <functional>

#include "CoreTavrin/TAVMembers.h"
#include "CoreTavrin/TAVReply.h"
#include "CoreTavrin/TAVRequest.h"
#include "CoreTavrin/TAVSessionConfiguration.h"
#include "docs_ipc_xml.h" // generated from docs/ipc/*.xml
#include "platform/values/Dictionary.h"
#include "searchrecords/ZRFeedback.h"

namespace tavrin {

namespace ipc = platform::ipc;
using platform::Value;

namespace {

// MARK: - serving rows

/// A method and the function that serves its calls.
template <class Object> struct Row {
    ipc::Member member;
    void (*serve)(Object&, ipc::Message, ipc::Responder);
};

/// Returns a typed reply that encodes its results for the responder. Abandoning it abandons the responder.
template <class... I, class... O>
platform::Reply<O...> replyThrough(const Method<In<I...>, Out<O...>>&, ipc::Responder responder)
{
    auto shared = std::make_shared<ipc::Responder>(std::move(responder));
    return platform::Reply<O...>(
        [shared](O... results) { (*shared)(Method<In<I...>, Out<O...>>::answer(std::move(results)...)); },
        [shared] { shared->abandon(); });
}

/// Returns the row that serves `method` with `call`: a member function of `Object`, or a function on an `Object&`, that
/// takes the method's arguments and its reply. Arguments that can't be decoded end the call with an error.
template <class Object, const auto& method, auto call> constexpr Row<Object> row()
{
    return {method, [](Object& object, ipc::Message message, ipc::Responder responder) {
                auto arguments = method.arguments(std::move(message));
                if (!arguments)
                    return responder(std::unexpected(ipc::CallError{.message = arguments.error().reason()}));
                std::apply(
                    [&](auto&&... each) {
                        std::invoke(call, object, std::move(each)..., replyThrough(method, std::move(responder)));
                    },
                    std::move(*arguments));
            }};
}

constexpr Row<TAVDaemonXPC> kDaemonRows[] = {
    row<TAVDaemonXPC, members::kConfigure, &TAVDaemonXPC::configure>(),
    row<TAVDaemonXPC, members::kBag, &TAVDaemonXPC::bag>(),
    row<TAVDaemonXPC, members::kRequest,
        [](TAVDaemonXPC& daemon, std::shared_ptr<TAVRequest> request, RequestReply reply) {
            if (!request) return reply.abandon();
            if (request->configuration)
                daemon.configure(request->configuration, platform::Reply<std::string>([](const std::string&) {}));
            daemon.request(std::move(request), std::move(reply));
        }>(),
    row<TAVDaemonXPC, members::kReportEvent,
        [](TAVDaemonXPC& daemon, const std::string& event, std::int64_t queryId, std::shared_ptr<ZRFeedback> feedback,
           platform::Reply<> reply) {
            if (!feedback) return reply();
            // The answer is sent when the last holder releases the event: the limit on a client's pending calls then
            // also limits its pending events.
            std::shared_ptr<void> call(nullptr, [answer = std::make_shared<platform::Reply<>>(std::move(reply))](
                                                    std::nullptr_t) { (*answer)(); });
            daemon.reportEvent(event, queryId, std::move(feedback), std::move(call));
        }>(),
    row<TAVDaemonXPC, members::kFeedback, &TAVDaemonXPC::feedback>(),
    row<TAVDaemonXPC, members::kListenToFlusher, &TAVDaemonXPC::listenToFlusher>(),
    row<TAVDaemonXPC, members::kListSessions, &TAVDaemonXPC::listSessions>(),
    row<TAVDaemonXPC, members::kResource, &TAVDaemonXPC::fileHandleAndAttributesForResource>(),
};

constexpr Row<TAVDiagnosticsXPC> kDiagnosticsRows[] = {
    row<TAVDiagnosticsXPC, members::kStatus,
        [](TAVDiagnosticsXPC& daemon, platform::Reply<Value> reply) { reply(daemon.status()); }>(),
    row<TAVDiagnosticsXPC, members::kStatistics,
        [](TAVDiagnosticsXPC& daemon, platform::Reply<std::string> reply) { reply(daemon.statistics()); }>(),
    row<TAVDiagnosticsXPC, members::kFigures,
        [](TAVDiagnosticsXPC& daemon, platform::Reply<Value> reply) { reply(daemon.figures()); }>(),
    row<TAVDiagnosticsXPC, members::kWaiting, &TAVDiagnosticsXPC::waiting>(),
    row<TAVDiagnosticsXPC, members::kPreviewUploads, &TAVDiagnosticsXPC::previewUploads>(),
    row<TAVDiagnosticsXPC, members::kPreviewRequest,
        [](TAVDiagnosticsXPC& daemon, std::shared_ptr<TAVRequest> request,
           platform::Reply<Value, OptionalError> reply) {
            if (!request) return reply.abandon();
            daemon.previewRequest(std::move(request), std::move(reply));
        }>(),
    row<TAVDiagnosticsXPC, members::kWipe, &TAVDiagnosticsXPC::wipe>(),
};

constexpr Row<TAVEndpointXPC> kEndpointRows[] = {
    row<TAVEndpointXPC, members::kEndpointRequest,
        [](TAVEndpointXPC& endpoint, std::shared_ptr<TAVRequest> request,
           std::shared_ptr<TAVSessionConfiguration> configuration, RequestReply reply) {
            if (!request) return reply.abandon();
            endpoint.request(std::move(request), std::move(configuration), std::move(reply));
        }>(),
    row<TAVEndpointXPC, members::kLoadImages, &TAVEndpointXPC::loadImages>(),
};

constexpr Row<TAVFlusherXPC> kFlusherRows[] = {
    row<TAVFlusherXPC, members::kInitiateConnectionWithIntent,
        [](TAVFlusherXPC& flusher, std::uint64_t intent, platform::Reply<> reply) {
            flusher.initiateConnectionWithIntent(intent);
            reply();
        }>(),
};

/// If the table has a row of that name, serves the call with it and returns true; otherwise consumes nothing.
template <class Object, std::size_t Count>
bool serve(const Row<Object> (&rows)[Count], const std::weak_ptr<Object>& object, std::string_view member,
           ipc::Message& message, ipc::Responder& responder)
{
    const auto found = std::ranges::find(rows, member, [](const Row<Object>& row) { return row.member.name; });
    if (found == std::end(rows)) return false;
    if (auto living = object.lock())
        found->serve(*living, std::move(message), std::move(responder));
    else
        responder.abandon();
    return true;
}

template <class Object, std::size_t Count>
ipc::Handler handlerOf(const Row<Object> (&rows)[Count], std::weak_ptr<Object> object)
{
    return [&rows, object = std::move(object)](std::string_view member, ipc::Message message, ipc::Responder reply) {
        if (!serve(rows, object, member, message, reply)) reply.abandon();
    };
}

template <class... Rows> std::vector<ipc::Member> membersOf(const Rows&... tables)
{
    std::vector<ipc::Member> all;
    const auto add = [&](const auto& rows) {
        for (const auto& row : rows) all.push_back(row.member);
    };
    (add(tables), ...);
    return all;
}

// MARK: - pushing signals

template <class... I>
void push(const std::weak_ptr<ipc::Connection>& connection, const Signal<I...>& signal, const I&... arguments)
{
    if (auto living = connection.lock()) living->push(signal.name, signal.call(arguments...));
}

class ClientProxy final : public TAVClientXPC {
public:
    explicit ClientProxy(std::weak_ptr<ipc::Connection> connection) : _connection(std::move(connection)) {}
    void bagDidLoad(const std::shared_ptr<const TAVBag>& bag, const OptionalError& error) override
    {
        push(_connection, members::kBagDidLoad, bag, error);
    }

private:
    std::weak_ptr<ipc::Connection> _connection;
};

class FlusherListenerProxy final : public TAVFlusherListener {
public:
    explicit FlusherListenerProxy(std::weak_ptr<ipc::Connection> connection) : _connection(std::move(connection)) {}
    void flushedData(const platform::Bytes& body) override { push(_connection, members::kFlushedData, body); }
    void receivedFeedbackDescription(const std::string& description) override
    {
        push(_connection, members::kReceivedFeedbackDescription, description);
    }
    void workDone() override { push(_connection, members::kWorkDone); }
    void replaced(FlusherIntent intent, std::int64_t process) override
    {
        push(_connection, members::kReplaced, static_cast<std::uint64_t>(intent), process);
    }

private:
    std::weak_ptr<ipc::Connection> _connection;
};

} // namespace

const ipc::Interface& daemonInterface()
{
    static const ipc::Interface interface{
        .path = std::string(kObjectPath),
        .name = "com.quorvane.TAVDaemonXPC",
        .methods = membersOf(kDaemonRows, kDiagnosticsRows),
        .listenerName = "com.quorvane.TAVClientXPC",
        .signals = {members::kBagDidLoad},
        .introspection = kDaemonIntrospection,
    };
    return interface;
}

const ipc::Interface& endpointInterface()
{
    static const ipc::Interface interface{
        .path = std::string(kObjectPath),
        .name = "com.quorvane.TAVEndpointXPC",
        .methods = membersOf(kEndpointRows),
        .listenerName = "",
        .signals = {},
        .introspection = kEndpointIntrospection,
    };
    return interface;
}

const ipc::Interface& flusherInterface()
{
    static const ipc::Interface interface{
        .path = std::string(kObjectPath),
        .name = "com.quorvane.TAVFlusherXPC",
        .methods = membersOf(kFlusherRows),
        .listenerName = "com.quorvane.TAVFlusherListener",
        .signals = {members::kFlushedData, members::kReceivedFeedbackDescription, members::kWorkDone,
                    members::kReplaced},
        .introspection = kFlusherIntrospection,
    };
    return interface;
}

ipc::Handler daemonHandler(std::weak_ptr<TAVDaemonXPC> object, std::weak_ptr<TAVDiagnosticsXPC> diagnostics)
{
    return [object = std::move(object),
            diagnostics = std::move(diagnostics)](std::string_view member, ipc::Message message, ipc::Responder reply) {
        if (!serve(kDaemonRows, object, member, message, reply) &&
            !serve(kDiagnosticsRows, diagnostics, member, message, reply))
            reply.abandon();
    };
}

ipc::Handler endpointHandler(std::weak_ptr<TAVEndpointXPC> object)
{
    return handlerOf(kEndpointRows, std::move(object));
}

ipc::Handler flusherHandler(std::weak_ptr<TAVFlusherXPC> object)
{
    return handlerOf(kFlusherRows, std::move(object));
}

std::shared_ptr<TAVClientXPC> makeClientProxy(std::weak_ptr<ipc::Connection> connection)
{
    return std::make_shared<ClientProxy>(std::move(connection));
}

std::shared_ptr<TAVFlusherListener> makeFlusherListenerProxy(std::weak_ptr<ipc::Connection> connection)
{
    return std::make_shared<FlusherListenerProxy>(std::move(connection));
}

} // namespace tavrin
