#include "CoreTavrin/TAVClient.h"

#include <algorithm>
#include <cerrno>

#include <fmt/format.h>

#include "CoreTavrin/TAVBag.h"
#include "CoreTavrin/TAVProtocols.h"
#include "CoreTavrin/TAVRecordClasses.h"
#include "CoreTavrin/TAVReply.h"
#include "CoreTavrin/TAVRequest.h"
#include "CoreTavrin/TAVSessionConfiguration.h"
#include "platform/files/Files.h"
#include "platform/ipc/BusClient.h"
#include "platform/values/Dictionary.h"
#include "platform/values/ValueCoder.h"
#include "searchrecords/ZRFeedback.h"

namespace tavrin {

namespace ipc = platform::ipc;
using platform::Result;
using platform::Value;

namespace {

constexpr platform::Duration kConnectTimeout = std::chrono::seconds(10);

platform::Error clientError(std::int64_t code, std::string reason)
{
    return platform::Error::withReason(std::string(TAVClientErrorDomain), code, std::move(reason));
}

/// The record in an answer, or none for the empty dictionary.
template <class T> Result<std::shared_ptr<T>> recordIn(const Value& value)
{
    if (value.count() == 0) return nullptr;
    return platform::castRecord<T>(platform::recordFromValue(value, coreRecordClasses()));
}

Result<TAVAnswer> answerIn(const Result<ipc::Message>& result)
{
    if (!result) return std::unexpected(result.error());
    const ipc::Message& message = *result;
    auto reply = recordIn<TAVReply>(message.args[1]);
    if (!reply) return std::unexpected(std::move(reply.error()));
    return TAVAnswer{message.args[0].asInt().value_or(0), std::move(*reply), errorFromValue(message.args[2])};
}

Result<TAVBagAnswer> bagIn(const Result<ipc::Message>& result)
{
    if (!result) return std::unexpected(result.error());
    const ipc::Message& message = *result;
    auto record = recordIn<TAVBagRecord>(message.args[0]);
    if (!record) return std::unexpected(std::move(record.error()));
    return TAVBagAnswer{*record ? (*record)->bag() : nullptr, errorFromValue(message.args[1])};
}

/// What `decode` makes of a message, or the message's error.
template <class Decode>
auto decoded(const Result<ipc::Message>& message, Decode decode) -> Result<std::decay_t<decltype(decode(*message))>>
{
    if (!message) return std::unexpected(message.error());
    return decode(*message);
}

std::string textIn(const Value& value)
{
    const std::string* text = value.asString();
    return text ? *text : std::string();
}

std::string firstText(const ipc::Message& message)
{
    return textIn(message.args[0]);
}

Value::Array arrayIn(const Value& value)
{
    const Value::Array* array = value.asArray();
    return array ? *array : Value::Array();
}

} // namespace

Result<std::unique_ptr<ipc::Client>> TAVConnection::open(const std::string& address)
{
    return ipc::Client::connect(address, std::string(kObjectPath), kConnectTimeout);
}

bool TAVConnection::wait(const std::function<bool()>& done, platform::Duration timeout, int descriptor)
{
    return _client->wait(done, timeout, descriptor);
}

bool TAVConnection::connected() const
{
    return _client->connected();
}

void TAVConnection::send(std::string_view member, std::vector<Value> arguments,
                         std::function<void(Result<ipc::Message>)> handler)
{
    const auto declared = std::ranges::find(_interface.methods, member, &ipc::Member::name);
    _client->call(_interface.name, *declared, {std::move(arguments), {}},
                  [handler = std::move(handler)](ipc::CallResult result) {
                      if (result) return handler(std::move(*result));
                      handler(std::unexpected(
                          clientError(EPROTO, fmt::format("{} ({})", result.error().message, result.error().name))));
                  });
}

Result<ipc::Message> TAVConnection::call(std::string_view member, std::vector<Value> arguments, platform::Duration more)
{
    const platform::Duration timeout = _timeout + more;
    // Shared with the handler, which outlives this call where the time is up first.
    auto answer = std::make_shared<std::optional<Result<ipc::Message>>>();
    send(member, std::move(arguments), [answer](Result<ipc::Message> result) { *answer = std::move(result); });
    if (wait([&] { return answer->has_value(); }, timeout)) return std::move(**answer);
    if (!connected())
        return std::unexpected(
            clientError(ECONNRESET, fmt::format("the daemon closed the connection during {}", member)));
    return std::unexpected(
        clientError(ETIMEDOUT, fmt::format("no answer to {} within {:g} s", member, platform::toSeconds(timeout))));
}

void TAVConnection::sendRequest(std::vector<Value> arguments, AnswerHandler handler)
{
    send("Request", std::move(arguments),
         [handler = std::move(handler)](const Result<ipc::Message>& message) { handler(answerIn(message)); });
}

Result<TAVAnswer> TAVConnection::answerTo(std::vector<Value> arguments)
{
    return answerIn(call("Request", std::move(arguments)));
}

Result<std::unique_ptr<TAVEndpointClient>> TAVEndpointClient::connect(const std::string& endpoint)
{
    auto client = open(endpoint);
    if (!client) return std::unexpected(std::move(client.error()));
    return std::unique_ptr<TAVEndpointClient>(new TAVEndpointClient(std::move(*client), endpointInterface()));
}

Result<TAVAnswer> TAVEndpointClient::request(const TAVRequest& request, const TAVSessionConfiguration& configuration)
{
    return answerTo({platform::toValue(request), platform::toValue(configuration)});
}

Result<std::map<std::string, platform::Bytes>> TAVEndpointClient::loadImages(const Value::Array& images,
                                                                             platform::Duration limit)
{
    limit = std::clamp<platform::Duration>(limit, platform::Duration::zero(), std::chrono::minutes(1));
    const auto message = call("LoadImages", {images, static_cast<std::uint64_t>(limit.count())}, limit);
    if (!message) return std::unexpected(message.error());
    std::map<std::string, platform::Bytes> loaded;
    if (const platform::Dictionary* entries = message->args[0].asDictionary())
        for (const auto& [name, image] : *entries)
            if (image.asBytes()) loaded.emplace(name, *image.asBytes());
    return loaded;
}

Result<std::unique_ptr<TAVFlusherClient>> TAVFlusherClient::connect(const std::string& endpoint,
                                                                    TAVFlusherListener& listener)
{
    auto client = open(endpoint);
    if (!client) return std::unexpected(std::move(client.error()));
    (*client)->onSignal([&listener](std::string_view, std::string_view member, const ipc::Message& message) {
        const Value& argument = message.args.empty() ? Value() : message.args.front();
        if (member == "FlushedData" && argument.asBytes())
            listener.flushedData(*argument.asBytes());
        else if (member == "ReceivedFeedbackDescription" && argument.asString())
            listener.receivedFeedbackDescription(*argument.asString());
        else if (member == "WorkDone")
            listener.workDone();
    });
    return std::unique_ptr<TAVFlusherClient>(new TAVFlusherClient(std::move(*client), flusherInterface()));
}

Result<void> TAVFlusherClient::initiateConnection(FlusherIntent intent)
{
    const auto answer = call("InitiateConnectionWithIntent", {static_cast<std::uint64_t>(intent)});
    if (!answer) return std::unexpected(answer.error());
    return {};
}

std::string TAVClient::defaultAddress()
{
    return "unix:path=" + (platform::Directories::fromEnvironment().runtime / "com.quorvane.tavrind/socket").string();
}

Result<std::unique_ptr<TAVClient>> TAVClient::connect(const std::string& address)
{
    auto client = open(address);
    if (!client) return std::unexpected(std::move(client.error()));
    return std::unique_ptr<TAVClient>(new TAVClient(std::move(*client), daemonInterface()));
}

Result<std::string> TAVClient::configure(const TAVSessionConfiguration& configuration)
{
    return decoded(call("Configure", {platform::toValue(configuration)}), firstText);
}

Result<TAVBagAnswer> TAVClient::bag()
{
    return bagIn(call("Bag"));
}

Result<TAVAnswer> TAVClient::request(const TAVRequest& request)
{
    return answerTo({platform::toValue(request)});
}

void TAVClient::send(const TAVRequest& request, AnswerHandler handler)
{
    sendRequest({platform::toValue(request)}, std::move(handler));
}

void TAVClient::reportEvent(const std::string& event, std::int64_t queryId, const ZRFeedback& feedback,
                            std::function<void(Result<void>)> taken)
{
    TAVConnection::send("ReportEvent", {event, queryId, platform::toValue(feedback)},
                        [taken = std::move(taken)](const Result<ipc::Message>& message) {
                            if (taken) taken(message ? Result<void>() : std::unexpected(message.error()));
                        });
}

Result<Value::Array> TAVClient::feedback()
{
    auto message = call("Feedback", {""});
    if (!message) return std::unexpected(std::move(message.error()));
    if (auto error = errorFromValue(message->args[1])) return std::unexpected(std::move(*error));
    return arrayIn(message->args[0]);
}

Result<std::string> TAVClient::listenToFlusher()
{
    return decoded(call("ListenToFlusher"), firstText);
}

Result<Value::Array> TAVClient::sessions()
{
    return decoded(call("ListSessions"), [](const ipc::Message& message) { return arrayIn(message.args[0]); });
}

Result<TAVResourceAnswer> TAVClient::resource(const std::string& identifier)
{
    auto message = call("FileHandleAndAttributesForResource", {identifier});
    if (!message) return std::unexpected(std::move(message.error()));
    TAVResourceAnswer answer{{}, message->args[1], errorFromValue(message->args[2])};
    if (!message->handles.empty()) answer.file = std::move(message->handles.front());
    return answer;
}

Result<Value> TAVClient::status()
{
    return decoded(call("Status"), [](const ipc::Message& message) { return message.args[0]; });
}

Result<std::string> TAVClient::statistics()
{
    return decoded(call("Statistics"), firstText);
}

void TAVClient::onBagDidLoad(std::function<void(TAVBagAnswer)> handler)
{
    _client->onSignal([handler = std::move(handler)](std::string_view, std::string_view member, ipc::Message message) {
        if (member != "BagDidLoad" || message.args.size() != 2) return;
        if (auto bag = bagIn(std::move(message))) handler(std::move(*bag));
    });
}

} // namespace tavrin
