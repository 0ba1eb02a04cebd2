#pragma once

#include <array>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <tuple>
#include <utility>

#include "CoreTavrin/TAVBag.h"
#include "CoreTavrin/TAVProtocols.h"
#include "CoreTavrin/TAVRecordClasses.h"
#include "platform/ipc/Ipc.h"
#include "platform/values/Record.h"
#include "platform/values/ValueCoder.h"

/// Every method and signal of the daemon's interfaces, one typed row each.
///
/// The C++ types of a row determine its D-Bus signatures and how its arguments are encoded and decoded. The daemon's
/// handlers (TAVProtocols.cpp) and the client (TAVClient.cpp) use the same rows. docs/ipc/*.xml describes them to other
/// languages; a test compares the two.
namespace tavrin {

/// Convert an error to its wire form and back: a{sv} with domain, code and userInfo, or an empty one for no error.
[[nodiscard]] platform::Value valueFromError(const OptionalError& error);
[[nodiscard]] OptionalError errorFromValue(const platform::Value& value);

namespace wire {

/// Returns the D-Bus type of a C++ type. Records, bags, errors and dictionaries are a{sv}; an empty one means no value.
template <class T> constexpr std::string_view typeOf()
{
    if constexpr (std::is_same_v<T, std::string>) return "s";
    if constexpr (std::is_same_v<T, bool>) return "b";
    if constexpr (std::is_same_v<T, std::int64_t>) return "x";
    if constexpr (std::is_same_v<T, std::uint64_t>) return "t";
    if constexpr (std::is_same_v<T, platform::Bytes>) return "ay";
    if constexpr (std::is_same_v<T, platform::Value::Array>) return "aa{sv}";
    if constexpr (std::is_same_v<T, platform::FileHandle>) return "ah"; // one handle, or none
    return "a{sv}";
}

template <class... T>
inline constexpr auto kSignatureText = [] {
    std::array<char, (typeOf<T>().size() + ... + 1)> text{};
    std::size_t at = 0;
    [[maybe_unused]] const auto add = [&](std::string_view type) {
        for (const char c : type) text[at++] = c;
    };
    (add(typeOf<T>()), ...);
    return text;
}();
/// Returns the D-Bus signature of arguments of these types.
template <class... T> constexpr std::string_view signatureOf()
{
    return {kSignatureText<T...>.data(), kSignatureText<T...>.size() - 1};
}

/// Whether arguments of a type are sent as records. A bag is sent as a `TAVBagRecord`.
template <class T> inline constexpr bool kIsRecord = false;
template <class T> inline constexpr bool kIsRecord<std::shared_ptr<T>> = true;

/// Returns which arguments of these types are records.
template <class... T> constexpr platform::ipc::RecordArguments recordsIn()
{
    platform::ipc::RecordArguments records{.classes = coreRecordClasses};
    [[maybe_unused]] std::uint32_t bit = 1;
    ((records.which |= kIsRecord<T> ? bit : 0, bit <<= 1), ...);
    return records;
}

/// Appends one argument to a message.
template <class T>
    requires std::is_constructible_v<platform::Value, T>
void append(platform::ipc::Message& message, T value)
{
    message.args.emplace_back(std::move(value));
}
/// Appends a dictionary; any other value is sent as an empty one.
void append(platform::ipc::Message& message, platform::Value value);
void append(platform::ipc::Message& message, std::shared_ptr<const platform::Record> record);
/// The record must outlive the message.
void append(platform::ipc::Message& message, const platform::Record& record);
void append(platform::ipc::Message& message, const std::shared_ptr<const TAVBag>& bag);
void append(platform::ipc::Message& message, const OptionalError& error);
void append(platform::ipc::Message& message, platform::FileHandle file);
/// Takes the record at `index` out of the message, or decodes it from its dictionary. Returns null for an empty one.
platform::Result<std::shared_ptr<platform::Record>> takeRecord(platform::ipc::Message& message, std::size_t index);

/// Decodes the argument at `index`, and may move it out of the message. The message must have the row's signature.
/// Fails for a record that can't be decoded or that reports a `problem()`. A record of an unknown class, or of a class
/// that the row does not accept, decodes as null.
template <class T> struct Take {
    static platform::Result<T> from(platform::ipc::Message& message, std::size_t index);
};
template <class R> struct Take<std::shared_ptr<R>> {
    static platform::Result<std::shared_ptr<R>> from(platform::ipc::Message& message, std::size_t index)
    {
        auto record = platform::castRecord<R>(takeRecord(message, index));
        if (!record && record.error().code == platform::Decoder::kUnknownClass) return nullptr;
        if constexpr (requires { (*record)->problem(); })
            if (auto problem = record && *record ? (*record)->problem() : std::nullopt)
                return platform::malformed(std::move(*problem));
        return record;
    }
};
template <> struct Take<std::shared_ptr<const TAVBag>> {
    static platform::Result<std::shared_ptr<const TAVBag>> from(platform::ipc::Message& message, std::size_t index);
};

/// Decodes all arguments of a message. `names` has their names, separated by blanks; an error begins with the name of
/// the argument that failed.
template <class... T>
platform::Result<std::tuple<T...>> takeAll(platform::ipc::Message& message, std::string_view names)
{
    if (message.args.size() != sizeof...(T)) return platform::malformed("a wrong number of arguments");
    std::optional<platform::Error> failure;
    std::size_t index = 0;
    [[maybe_unused]] const auto next = [&]<class Argument>(std::type_identity<Argument>) {
        const std::string_view name = names.substr(0, names.find(' '));
        names.remove_prefix(std::min(name.size() + 1, names.size()));
        auto taken = Take<Argument>::from(message, index++);
        if (taken) return std::move(*taken);
        if (!failure) failure = platform::malformed(std::string(name) + ": " + taken.error().reason()).error();
        return Argument();
    };
    std::tuple<T...> all{next(std::type_identity<T>())...}; // braces evaluate in order
    if (failure) return std::unexpected(std::move(*failure));
    return all;
}

} // namespace wire

template <class... T> struct In {};
template <class... T> struct Out {};

/// A method: the types of its arguments and results, and their names, separated by blanks.
template <class Arguments, class Results = Out<>> struct Method;
template <class... I, class... O> struct Method<In<I...>, Out<O...>> : platform::ipc::Member {
    using Reply = platform::Reply<O...>;
    using Results = std::tuple<O...>;

    constexpr Method(std::string_view name_, std::string_view inNames_, std::string_view outNames_ = {})
        : Member{.name = name_,
                 .in = wire::signatureOf<I...>(),
                 .out = wire::signatureOf<O...>(),
                 .inNames = inNames_,
                 .outNames = outNames_,
                 .inRecords = wire::recordsIn<I...>(),
                 .outRecords = wire::recordsIn<O...>()}
    {}

    /// Returns this method as a member of the interface `home` instead of its object's main one.
    [[nodiscard]] constexpr Method on(std::string_view home) const
    {
        Method method = *this;
        method.interface = home;
        return method;
    }
    /// Returns this method with the mark that callers needn't request its empty answer.
    [[nodiscard]] constexpr Method withoutReply() const
    {
        Method method = *this;
        method.noReply = true;
        return method;
    }

    /// Encodes a call. Records may be passed by reference; they must outlive the message.
    template <class... Given> [[nodiscard]] static platform::ipc::Message call(Given&&... arguments)
    {
        static_assert(sizeof...(Given) == sizeof...(I));
        platform::ipc::Message message;
        (wire::append(message, std::forward<Given>(arguments)), ...);
        return message;
    }
    [[nodiscard]] platform::Result<std::tuple<I...>> arguments(platform::ipc::Message call) const
    {
        return wire::takeAll<I...>(call, inNames);
    }
    [[nodiscard]] static platform::ipc::Message answer(O... results)
    {
        platform::ipc::Message message;
        (wire::append(message, std::move(results)), ...);
        return message;
    }
    [[nodiscard]] platform::Result<std::tuple<O...>> results(platform::ipc::Message answer) const
    {
        return wire::takeAll<O...>(answer, outNames);
    }
};

/// A signal, which has no answer.
template <class... I> using Signal = Method<In<I...>>;

namespace members {

using Configuration = std::shared_ptr<TAVSessionConfiguration>;
using Request = std::shared_ptr<TAVRequest>;
using Answer = Out<std::int64_t, std::shared_ptr<TAVReply>, OptionalError>;
using Bag = std::shared_ptr<const TAVBag>;
using Dictionaries = platform::Value::Array;

inline constexpr std::string_view kDiagnosticsInterface = "com.quorvane.TAVDiagnosticsXPC";

// com.quorvane.TAVDaemonXPC
inline constexpr Method<In<Configuration>, Out<std::string>> kConfigure{"Configure", "configuration", "endpoint"};
inline constexpr Method<In<>, Out<Bag, OptionalError>> kBag{"Bag", "", "bag error"};
inline constexpr Method<In<Request>, Answer> kRequest{"Request", "request", "queryId reply error"};
inline constexpr auto kReportEvent =
    Method<In<std::string, std::int64_t, std::shared_ptr<ZRFeedback>>>{"ReportEvent", "event queryId feedback"}
        .withoutReply();
inline constexpr Method<In<std::string>, Out<Dictionaries, OptionalError>> kFeedback{"Feedback", "argument",
                                                                                     "feedbacks error"};
inline constexpr Method<In<>, Out<std::string>> kListenToFlusher{"ListenToFlusher", "", "endpoint"};
inline constexpr Method<In<>, Out<Dictionaries>> kListSessions{"ListSessions", "", "sessions"};
inline constexpr Method<In<std::string>, Out<platform::FileHandle, platform::Value, OptionalError>> kResource{
    "FileHandleAndAttributesForResource", "resource", "file attributes error"};
// com.quorvane.TAVDiagnosticsXPC, on the same object
inline constexpr auto kStatus = Method<In<>, Out<platform::Value>>{"Status", "", "status"}.on(kDiagnosticsInterface);
inline constexpr auto kStatistics =
    Method<In<>, Out<std::string>>{"Statistics", "", "openMetrics"}.on(kDiagnosticsInterface);
inline constexpr auto kFigures = Method<In<>, Out<platform::Value>>{"Figures", "", "figures"}.on(kDiagnosticsInterface);
inline constexpr auto kWaiting = Method<In<>, Out<platform::Value>>{"Waiting", "", "waiting"}.on(kDiagnosticsInterface);
inline constexpr auto kPreviewUploads =
    Method<In<>, Out<Dictionaries>>{"PreviewUploads", "", "uploads"}.on(kDiagnosticsInterface);
inline constexpr auto kPreviewRequest =
    Method<In<Request>, Out<platform::Value, OptionalError>>{"PreviewRequest", "request", "preview error"}.on(
        kDiagnosticsInterface);
inline constexpr auto kWipe = Method<In<bool>>{"Wipe", "settings"}.on(kDiagnosticsInterface);
// com.quorvane.TAVClientXPC
inline constexpr Signal<Bag, OptionalError> kBagDidLoad{"BagDidLoad", "bag error"};

// com.quorvane.TAVEndpointXPC
inline constexpr Method<In<Request, Configuration>, Answer> kEndpointRequest{"Request", "request configuration",
                                                                             "queryId reply error"};
inline constexpr Method<In<Dictionaries, std::uint64_t>, Out<platform::Value>> kLoadImages{"LoadImages",
                                                                                           "images timeout", "loaded"};

// com.quorvane.TAVFlusherXPC
inline constexpr Method<In<std::uint64_t>> kInitiateConnectionWithIntent{"InitiateConnectionWithIntent", "intent"};
// com.quorvane.TAVFlusherListener
inline constexpr Signal<platform::Bytes> kFlushedData{"FlushedData", "body"};
inline constexpr Signal<std::string> kReceivedFeedbackDescription{"ReceivedFeedbackDescription", "description"};
inline constexpr Signal<> kWorkDone{"WorkDone", ""};
inline constexpr Signal<std::uint64_t, std::int64_t> kReplaced{"Replaced", "intent process"};

} // namespace members

} // namespace tavrin
