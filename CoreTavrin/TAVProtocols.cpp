#include "CoreTavrin/TAVProtocols.h"

#include <algorithm>

#include <fmt/format.h>

#include "CoreTavrin/TAVBag.h"
#include "CoreTavrin/TAVRecordClasses.h"
#include "CoreTavrin/TAVReply.h"
#include "CoreTavrin/TAVRequest.h"
#include "CoreTavrin/TAVSessionConfiguration.h"
#include "docs_ipc_xml.h" // made from docs/ipc/*.xml
#include "platform/values/Dictionary.h"
#include "platform/values/ValueCoder.h"
#include "searchrecords/ZRFeedback.h"

namespace tavrin {

namespace ipc = platform::ipc;
using platform::Dictionary;
using platform::Reply;
using platform::Value;

namespace {

constexpr std::string_view kDiagnostics = "com.quorvane.TAVDiagnosticsXPC";

/// Longest identifier and user agent of a client, in bytes: both are kept, counted by and sent along.
constexpr std::size_t kMaximumName = 1024;

/// A record that a call brought; null for the empty dictionary. An unknown class is told apart from a broken record: it
/// is not an error on the wire.
enum class Refusal { Malformed, UnknownClass };
template <class T>
std::expected<std::shared_ptr<T>, Refusal> record(const Value& value, std::string_view name, ipc::Responder& reply)
{
    if (value.count() == 0) return nullptr;
    auto decoded = platform::castRecord<T>(platform::recordFromValue(value, coreRecordClasses()));
    if (decoded) return std::move(*decoded);
    if (decoded.error().code == platform::Decoder::kUnknownClass) return std::unexpected(Refusal::UnknownClass);
    reply(std::unexpected(ipc::CallError{.message = fmt::format("{}: {}", name, decoded.error().reason())}));
    return std::unexpected(Refusal::Malformed);
}

/// As above; nothing where the call has been refused. An unknown class is as good as no configuration.
std::optional<std::shared_ptr<TAVSessionConfiguration>> configurationIn(const Value& value, ipc::Responder& reply)
{
    auto configuration = record<TAVSessionConfiguration>(value, "configuration", reply);
    if (!configuration && configuration.error() == Refusal::Malformed) return std::nullopt;
    auto found = configuration.value_or(nullptr);
    if (found && std::max(found->identifier.value_or("").size(), found->userAgent.value_or("").size()) > kMaximumName) {
        reply(std::unexpected(ipc::CallError{
            .message = fmt::format("configuration: identifier and userAgent may have {} bytes each", kMaximumName)}));
        return std::nullopt;
    }
    return found;
}

/// Dictionaries without their null entries, which can't travel. An array's nulls become empty dictionaries.
Value withoutNulls(const Value& value)
{
    if (const Value::Array* array = value.asArray()) {
        Value::Array kept;
        for (const Value& element : *array)
            kept.push_back(element.isNull() ? Value(Dictionary()) : withoutNulls(element));
        return kept;
    }
    if (const Dictionary* dictionary = value.asDictionary()) {
        Dictionary kept;
        for (const auto& [key, entry] : *dictionary)
            if (!entry.isNull()) kept.set(key, withoutNulls(entry));
        return kept;
    }
    return value;
}

ipc::Message message(std::vector<Value> args)
{
    return {std::move(args), {}};
}

std::string text(const ipc::Message& message, std::size_t index)
{
    const std::string* string = message.args[index].asString();
    return string ? *string : std::string();
}

Value bagValue(const std::shared_ptr<const TAVBag>& bag)
{
    return bag ? platform::toValue(TAVBagRecord(*bag)) : Value(Dictionary());
}

/// A typed reply that encodes itself into the responder, and frees it when it is abandoned.
template <class... Args, class Encode> Reply<Args...> replyThrough(ipc::Responder responder, Encode encode)
{
    auto shared = std::make_shared<ipc::Responder>(std::move(responder));
    return Reply<Args...>([shared, encode](Args... args) mutable { (*shared)(encode(std::forward<Args>(args)...)); },
                          [shared] { shared->abandon(); });
}

RequestReply requestReply(ipc::Responder responder)
{
    return replyThrough<std::int64_t, std::shared_ptr<TAVReply>, OptionalError>(
        std::move(responder),
        [](std::int64_t queryId, const std::shared_ptr<TAVReply>& reply, const OptionalError& error) {
            return message({queryId, reply ? platform::toValue(*reply) : Value(Dictionary()), valueFromError(error)});
        });
}

class ClientProxy final : public TAVClientXPC {
public:
    explicit ClientProxy(std::weak_ptr<ipc::Connection> connection) : _connection(std::move(connection)) {}
    void bagDidLoad(const std::shared_ptr<const TAVBag>& bag, const OptionalError& error) override
    {
        if (auto connection = _connection.lock())
            connection->push("BagDidLoad", message({bagValue(bag), valueFromError(error)}));
    }

private:
    std::weak_ptr<ipc::Connection> _connection;
};

class FlusherListenerProxy final : public TAVFlusherListener {
public:
    explicit FlusherListenerProxy(std::weak_ptr<ipc::Connection> connection) : _connection(std::move(connection)) {}
    void flushedData(const platform::Bytes& body) override { push("FlushedData", {body}); }
    void receivedFeedbackDescription(const std::string& description) override
    {
        push("ReceivedFeedbackDescription", {description});
    }
    void workDone() override { push("WorkDone", {}); }

private:
    void push(std::string_view signal, std::vector<Value> args)
    {
        if (auto connection = _connection.lock()) connection->push(signal, message(std::move(args)));
    }
    std::weak_ptr<ipc::Connection> _connection;
};

} // namespace

Value valueFromError(const OptionalError& error)
{
    if (!error) return Dictionary();
    Value userInfo = error->userInfo;
    if (!userInfo.asDictionary()) userInfo = Dictionary();
    return Value::dictionaryOf({{"domain", error->domain}, {"code", error->code}, {"userInfo", std::move(userInfo)}});
}

OptionalError errorFromValue(const Value& value)
{
    const std::string* domain = value["domain"].asString();
    if (!domain) return std::nullopt;
    return platform::Error(*domain, value["code"].asInt().value_or(0), value["userInfo"]);
}

const ipc::Interface& daemonInterface()
{
    static const ipc::Interface interface{
        .path = std::string(kObjectPath),
        .name = "com.quorvane.TAVDaemonXPC",
        .methods = {{"Configure", "a{sv}", "s"},
                    {"Bag", "", "a{sv}a{sv}"},
                    {"Request", "a{sv}", "xa{sv}a{sv}"},
                    {"ReportEvent", "sxa{sv}", "", true},
                    {"Feedback", "s", "aa{sv}a{sv}"},
                    {"ListenToFlusher", "", "s"},
                    {"ListSessions", "", "aa{sv}"},
                    {"FileHandleAndAttributesForResource", "s", "aha{sv}a{sv}"},
                    {"Status", "", "a{sv}", false, kDiagnostics},
                    {"Statistics", "", "s", false, kDiagnostics}},
        .listenerName = "com.quorvane.TAVClientXPC",
        .signals = {{"BagDidLoad", "a{sv}a{sv}", ""}},
        .introspection = kDaemonIntrospection,
    };
    return interface;
}

const ipc::Interface& endpointInterface()
{
    static const ipc::Interface interface{
        .path = std::string(kObjectPath),
        .name = "com.quorvane.TAVEndpointXPC",
        .methods = {{"Request", "a{sv}a{sv}", "xa{sv}a{sv}"}, {"LoadImages", "aa{sv}t", "a{sv}"}},
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
        .methods = {{"InitiateConnectionWithIntent", "t", ""}},
        .listenerName = "com.quorvane.TAVFlusherListener",
        .signals = {{"FlushedData", "ay", ""}, {"ReceivedFeedbackDescription", "s", ""}, {"WorkDone", "", ""}},
        .introspection = kFlusherIntrospection,
    };
    return interface;
}

ipc::Handler daemonHandler(std::weak_ptr<TAVDaemonXPC> object, std::weak_ptr<TAVDiagnosticsXPC> diagnostics)
{
    return [object, diagnostics](std::string_view member, ipc::Message arguments, ipc::Responder reply) {
        if (member == "Status" || member == "Statistics") {
            auto source = diagnostics.lock();
            if (!source) return reply.abandon();
            return reply(message({member == "Status" ? source->status() : Value(source->statistics())}));
        }

        auto daemon = object.lock();
        if (!daemon) return reply.abandon();

        if (member == "Configure") {
            auto configuration = configurationIn(arguments.args[0], reply);
            if (!configuration) return;
            daemon->configure(std::move(*configuration),
                              replyThrough<std::string>(std::move(reply), [](std::string endpoint) {
                                  return message({std::move(endpoint)});
                              }));
        } else if (member == "Bag") {
            daemon->bag(replyThrough<std::shared_ptr<const TAVBag>, OptionalError>(
                std::move(reply), [](const std::shared_ptr<const TAVBag>& bag, const OptionalError& error) {
                    return message({bagValue(bag), valueFromError(error)});
                }));
        } else if (member == "Request") {
            auto request = record<TAVRequest>(arguments.args[0], "request", reply);
            if (!request && request.error() == Refusal::Malformed) return;
            if (!request.value_or(nullptr)) return reply.abandon();
            // A caller that can make one call only, such as busctl, introduces itself inside its request.
            if (const Value& introduction = arguments.args[0]["configuration"]; introduction.asDictionary()) {
                auto configuration = configurationIn(introduction, reply);
                if (!configuration) return;
                daemon->configure(std::move(*configuration), Reply<std::string>([](const std::string&) {}));
            }
            daemon->request(std::move(*request), requestReply(std::move(reply)));
        } else if (member == "ReportEvent") {
            auto feedback = record<ZRFeedback>(arguments.args[2], "feedback", reply);
            if (!feedback && feedback.error() == Refusal::Malformed) return;
            if (!feedback.value_or(nullptr)) return reply(message({}));
            // Answered when its last holder lets the event go: a client can't have more of them under way than calls.
            std::shared_ptr<void> call(nullptr, [answer = std::make_shared<ipc::Responder>(std::move(reply))](
                                                    std::nullptr_t) { (*answer)(message({})); });
            daemon->reportEvent(text(arguments, 0), *arguments.args[1].asInt(), std::move(*feedback), std::move(call));
        } else if (member == "Feedback") {
            daemon->feedback(text(arguments, 0),
                             replyThrough<Value::Array, OptionalError>(
                                 std::move(reply), [](Value::Array feedbacks, const OptionalError& error) {
                                     return message({withoutNulls(std::move(feedbacks)), valueFromError(error)});
                                 }));
        } else if (member == "ListenToFlusher") {
            daemon->listenToFlusher(replyThrough<std::string>(
                std::move(reply), [](std::string endpoint) { return message({std::move(endpoint)}); }));
        } else if (member == "ListSessions") {
            daemon->listSessions(replyThrough<Value::Array>(
                std::move(reply), [](Value::Array sessions) { return message({std::move(sessions)}); }));
        } else if (member == "FileHandleAndAttributesForResource") {
            daemon->fileHandleAndAttributesForResource(
                text(arguments, 0),
                replyThrough<platform::FileHandle, Value, OptionalError>(
                    std::move(reply), [](platform::FileHandle file, Value attributes, const OptionalError& error) {
                        if (!attributes.asDictionary()) attributes = Dictionary();
                        ipc::Message answer;
                        Value::Array indexes;
                        if (file) {
                            indexes.emplace_back(0);
                            answer.handles.push_back(std::move(file));
                        }
                        answer.args = {std::move(indexes), std::move(attributes), valueFromError(error)};
                        return answer;
                    }));
        } else {
            reply.abandon();
        }
    };
}

ipc::Handler endpointHandler(std::weak_ptr<TAVEndpointXPC> object)
{
    return [object](std::string_view member, ipc::Message arguments, ipc::Responder reply) {
        auto endpoint = object.lock();
        if (!endpoint) return reply.abandon();

        if (member == "Request") {
            auto configuration = configurationIn(arguments.args[1], reply);
            if (!configuration) return;
            auto request = record<TAVRequest>(arguments.args[0], "request", reply);
            if (!request && request.error() == Refusal::Malformed) return;
            if (!request.value_or(nullptr)) return reply.abandon();
            endpoint->request(std::move(*request), std::move(*configuration), requestReply(std::move(reply)));
        } else if (member == "LoadImages") {
            endpoint->loadImages(*arguments.args[0].asArray(), arguments.args[1].asUInt().value_or(0),
                                 replyThrough<Value>(std::move(reply), [](Value images) {
                                     return message({images.asDictionary() ? std::move(images) : Value(Dictionary())});
                                 }));
        } else {
            reply.abandon();
        }
    };
}

ipc::Handler flusherHandler(std::weak_ptr<TAVFlusherXPC> object)
{
    return [object](std::string_view, ipc::Message arguments, ipc::Responder reply) {
        if (auto flusher = object.lock()) flusher->initiateConnectionWithIntent(arguments.args[0].asUInt().value_or(0));
        reply(message({}));
    };
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
