#include "CoreTavrin/TAVClient.h"

#include <algorithm>
#include <cerrno>

#include <fmt/format.h>

#include "CoreTavrin/TAVMembers.h"
#include "CoreTavrin/TAVProtocols.h"
#include "CoreTavrin/TAVReply.h"
#include "CoreTavrin/TAVRequest.h"
#include "CoreTavrin/TAVSessionConfiguration.h"
#include "platform/files/Files.h"
#include "platform/ipc/BusClient.h"
#include "platform/ipc/ListenSocket.h"
#include "platform/values/Dictionary.h"
#include "searchrecords/ZRFeedback.h"

namespace tavrin {

namespace ipc = platform::ipc;
using platform::Result;
using platform::Value;

namespace {

constexpr platform::Duration kConnectTimeout = std::chrono::seconds(10);

platform::Error clientError(std::int64_t code, std::string reason)
{
    return platform::Error::withReason(TAVClientErrorDomain, code, std::move(reason));
}

/// Decodes a row's results from a message, or passes the message's error on.
template <class Row> auto resultsOf(const Row& row, Result<ipc::Message> answer) -> Result<typename Row::Results>
{
    if (!answer) return std::unexpected(std::move(answer.error()));
    return row.results(std::move(*answer));
}

/// Unwraps the only result of a row.
template <class T> Result<T> only(Result<std::tuple<T>> results)
{
    if (!results) return std::unexpected(std::move(results.error()));
    return std::get<0>(std::move(*results));
}

/// Converts a row's results to a structure with the same members.
template <class Structure, class... T> Result<Structure> as(Result<std::tuple<T...>> results)
{
    if (!results) return std::unexpected(std::move(results.error()));
    return std::apply([](auto&&... each) { return Structure{std::move(each)...}; }, std::move(*results));
}

} // namespace

Result<std::unique_ptr<ipc::Client>> TAVConnection::open(const std::string& address)
{
    if (address.empty()) // of an endpoint
        return std::unexpected(clientError(
            ENOENT,
            "the daemon can't create the socket for this; its log says why. Connect again once that is mended"));
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

void TAVConnection::sendCall(const ipc::Member& member, ipc::Message message, MessageHandler handler)
{
    _client->call(_interface.name, member, std::move(message), [handler = std::move(handler)](ipc::CallResult result) {
        if (result) return handler(std::move(*result));
        handler(
            std::unexpected(clientError(EPROTO, fmt::format("{} ({})", result.error().message, result.error().name))));
    });
}

Result<ipc::Message> TAVConnection::call(const ipc::Member& member, ipc::Message message, platform::Duration more)
{
    const platform::Duration timeout = _timeout + more;
    // Shared with the handler, which outlives this call after a time-out.
    auto answer = std::make_shared<std::optional<Result<ipc::Message>>>();
    sendCall(member, std::move(message), [answer](Result<ipc::Message> result) { *answer = std::move(result); });
    if (wait([&] { return answer->has_value(); }, timeout)) return std::move(**answer);
    if (!connected())
        return std::unexpected(
            clientError(ECONNRESET, fmt::format("the daemon closed the connection during {}", member.name)));
    return std::unexpected(clientError(
        ETIMEDOUT, fmt::format("no answer to {} within {:g} s", member.name, platform::toSeconds(timeout))));
}

Result<std::unique_ptr<TAVEndpointClient>> TAVEndpointClient::connect(const std::string& endpoint)
{
    auto client = open(endpoint);
    if (!client) return std::unexpected(std::move(client.error()));
    return std::unique_ptr<TAVEndpointClient>(new TAVEndpointClient(std::move(*client), endpointInterface()));
}

Result<TAVAnswer> TAVEndpointClient::request(const TAVRequest& request, const TAVSessionConfiguration& configuration)
{
    constexpr auto& row = members::kEndpointRequest;
    return as<TAVAnswer>(resultsOf(row, call(row, row.call(request, configuration))));
}

Result<std::map<std::string, platform::Bytes>> TAVEndpointClient::loadImages(const Value::Array& images,
                                                                             platform::Duration limit)
{
    constexpr auto& row = members::kLoadImages;
    limit = std::clamp<platform::Duration>(limit, platform::Duration::zero(), std::chrono::minutes(1));
    const auto nanoseconds = static_cast<std::uint64_t>(limit.count());
    const auto answer = only(resultsOf(row, call(row, row.call(images, nanoseconds), limit)));
    if (!answer) return std::unexpected(answer.error());
    std::map<std::string, platform::Bytes> loaded;
    if (const platform::Dictionary* entries = answer->asDictionary())
        for (const auto& [name, image] : *entries)
            if (image.asBytes()) loaded.emplace(name, *image.asBytes());
    return loaded;
}

Result<std::unique_ptr<TAVFlusherClient>> TAVFlusherClient::connect(const std::string& endpoint,
                                                                    TAVFlusherListener& listener)
{
    auto client = open(endpoint);
    if (!client) return std::unexpected(std::move(client.error()));
    (*client)->onSignal([&listener](std::string_view, std::string_view member, ipc::Message message) {
        if (member == members::kFlushedData.name) {
            if (const auto body = members::kFlushedData.arguments(std::move(message)))
                listener.flushedData(std::get<0>(*body));
        } else if (member == members::kReceivedFeedbackDescription.name) {
            if (const auto text = members::kReceivedFeedbackDescription.arguments(std::move(message)))
                listener.receivedFeedbackDescription(std::get<0>(*text));
        } else if (member == members::kWorkDone.name) {
            listener.workDone();
        } else if (member == members::kReplaced.name) {
            if (const auto by = members::kReplaced.arguments(std::move(message)))
                listener.replaced(static_cast<FlusherIntent>(std::get<0>(*by)), std::get<1>(*by));
        }
    });
    return std::unique_ptr<TAVFlusherClient>(new TAVFlusherClient(std::move(*client), flusherInterface()));
}

Result<void> TAVFlusherClient::initiateConnection(FlusherIntent intent)
{
    constexpr auto& row = members::kInitiateConnectionWithIntent;
    const auto answer = call(row, row.call(static_cast<std::uint64_t>(intent)));
    if (!answer) return std::unexpected(answer.error());
    return {};
}

std::filesystem::path TAVClient::defaultSocket()
{
    return platform::Directories::fromEnvironment().runtime / "com.quorvane.tavrind/socket";
}

std::string TAVClient::defaultAddress()
{
    return ipc::busAddress(defaultSocket());
}

Result<std::unique_ptr<TAVClient>> TAVClient::connect(const std::string& address)
{
    auto client = open(address);
    if (!client) return std::unexpected(std::move(client.error()));
    return std::unique_ptr<TAVClient>(new TAVClient(std::move(*client), daemonInterface()));
}

Result<std::string> TAVClient::configure(const TAVSessionConfiguration& configuration)
{
    return only(resultsOf(members::kConfigure, call(members::kConfigure, members::kConfigure.call(configuration))));
}

Result<TAVBagAnswer> TAVClient::bag()
{
    return as<TAVBagAnswer>(resultsOf(members::kBag, call(members::kBag, {})));
}

Result<TAVAnswer> TAVClient::request(const TAVRequest& request)
{
    constexpr auto& row = members::kRequest;
    return as<TAVAnswer>(resultsOf(row, call(row, row.call(request))));
}

void TAVClient::send(const TAVRequest& request, AnswerHandler handler)
{
    constexpr auto& row = members::kRequest;
    sendCall(row, row.call(request), [handler = std::move(handler)](Result<ipc::Message> answer) {
        handler(as<TAVAnswer>(resultsOf(row, std::move(answer))));
    });
}

void TAVClient::reportEvent(const std::string& event, std::int64_t queryId, const ZRFeedback& feedback,
                            std::function<void(Result<void>)> taken)
{
    constexpr auto& row = members::kReportEvent;
    sendCall(row, row.call(event, queryId, feedback), [taken = std::move(taken)](const Result<ipc::Message>& answer) {
        if (taken) taken(answer ? Result<void>() : std::unexpected(answer.error()));
    });
}

Result<Value::Array> TAVClient::feedback()
{
    auto results = resultsOf(members::kFeedback, call(members::kFeedback, members::kFeedback.call("")));
    if (!results) return std::unexpected(std::move(results.error()));
    auto& [feedbacks, error] = *results;
    if (error) return std::unexpected(std::move(*error));
    return std::move(feedbacks);
}

Result<std::string> TAVClient::listenToFlusher()
{
    return only(resultsOf(members::kListenToFlusher, call(members::kListenToFlusher, {})));
}

Result<Value::Array> TAVClient::sessions()
{
    return only(resultsOf(members::kListSessions, call(members::kListSessions, {})));
}

Result<TAVResourceAnswer> TAVClient::resource(const std::string& identifier)
{
    constexpr auto& row = members::kResource;
    return as<TAVResourceAnswer>(resultsOf(row, call(row, row.call(identifier))));
}

Result<Value> TAVClient::status()
{
    return only(resultsOf(members::kStatus, call(members::kStatus, {})));
}

Result<std::string> TAVClient::statistics()
{
    return only(resultsOf(members::kStatistics, call(members::kStatistics, {})));
}

Result<Value> TAVClient::figures()
{
    return only(resultsOf(members::kFigures, call(members::kFigures, {})));
}

Result<Value> TAVClient::waiting()
{
    return only(resultsOf(members::kWaiting, call(members::kWaiting, {})));
}

Result<Value::Array> TAVClient::previewUploads()
{
    return only(resultsOf(members::kPreviewUploads, call(members::kPreviewUploads, {})));
}

Result<Value> TAVClient::previewRequest(const TAVRequest& request)
{
    constexpr auto& row = members::kPreviewRequest;
    auto answer = resultsOf(row, call(row, row.call(request)));
    if (!answer) return std::unexpected(std::move(answer.error()));
    auto& [preview, error] = *answer;
    if (error) return std::unexpected(std::move(*error));
    return std::move(preview);
}

Result<void> TAVClient::wipe(bool settings)
{
    constexpr auto& row = members::kWipe;
    const auto answer = call(row, row.call(settings));
    if (answer || connected())
        return std::unexpected(answer ? clientError(EPROTO, "the daemon did not start again") : answer.error());
    return {};
}

void TAVClient::onBagDidLoad(std::function<void(TAVBagAnswer)> handler)
{
    _client->onSignal([handler = std::move(handler)](std::string_view, std::string_view member, ipc::Message message) {
        if (member != members::kBagDidLoad.name) return;
        if (auto pushed = as<TAVBagAnswer>(members::kBagDidLoad.arguments(std::move(message))))
            handler(std::move(*pushed));
    });
}

} // namespace tavrin
