#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "CoreTavrin/TAVSessionConfiguration.h"
#include "platform/net/Url.h"
#include "platform/values/Record.h"
#include "searchrecords/ZREnums.h"

/// The clients' requests: one record for each kind, all with the fields of `TAVRequest`.
namespace tavrin {

/// An additional item for the HTTP request's query. Without a value, only its name is sent.
struct TAVQueryItem : platform::RecordOf<TAVQueryItem> {
    static constexpr std::string_view kClass = "TAVQueryItem";
    std::string name;
    std::optional<std::string> value;

    TAVQueryItem() = default;
    TAVQueryItem(std::string name_, std::optional<std::string> value_)
        : name(std::move(name_)), value(std::move(value_))
    {}
    static constexpr auto fields()
    {
        return std::tuple{platform::field("name", &TAVQueryItem::name), platform::field("value", &TAVQueryItem::value)};
    }
};

/// The fields of all requests. Only subclasses are served.
struct TAVRequest : platform::RecordOf<TAVRequest> {
    static constexpr std::string_view kClass = "TAVRequest";

    std::string queryString;         ///< what the user typed
    std::int64_t queryId = 0;        ///< increases with every request of a connection
    std::uint64_t clientQueryId = 0; ///< the client's own number for the query; 0 for none
    std::vector<std::shared_ptr<TAVQueryItem>> queryItems;
    double scale = 0;          ///< of the client's screen, for images; 0 is the main screen's
    bool verboseReply = false; ///< the reply includes the HTTP request and response
    StartSearchTrigger triggerEvent = StartSearchTrigger::Unknown;
    std::optional<std::string> uuid;
    std::optional<std::string> keyboardInputMode; ///< default: the current keyboard's
    platform::Value topics;                       ///< the user's top topics: an array or dictionary, or null
    /// Set by a caller that can make only one call, such as busctl: introduces the client before the request is served.
    std::shared_ptr<TAVSessionConfiguration> configuration;

    /// Returns why the daemon refuses a call with this record; nothing if the record is valid.
    [[nodiscard]] std::optional<std::string> problem() const
    {
        return configuration ? configuration->problem() : std::nullopt;
    }

    static constexpr auto fields()
    {
        return std::tuple{platform::field("queryString", &TAVRequest::queryString),
                          platform::field("queryId", &TAVRequest::queryId),
                          platform::field("clientQueryId", &TAVRequest::clientQueryId),
                          platform::field("queryItems", &TAVRequest::queryItems),
                          platform::field("scale", &TAVRequest::scale),
                          platform::field("verboseReply", &TAVRequest::verboseReply),
                          platform::field("triggerEvent", &TAVRequest::triggerEvent),
                          platform::field("uuid", &TAVRequest::uuid),
                          platform::field("keyboardInputMode", &TAVRequest::keyboardInputMode),
                          platform::field("topics", &TAVRequest::topics),
                          platform::field("configuration", &TAVRequest::configuration)};
    }
};

/// A search while the user types.
struct TAVSearchRequest : platform::RecordOf<TAVSearchRequest, TAVRequest> {
    static constexpr std::string_view kClass = "TAVSearchRequest";
    static std::shared_ptr<TAVSearchRequest> searchRequestWithString(std::string queryString,
                                                                     StartSearchTrigger triggerEvent)
    {
        auto request = std::make_shared<TAVSearchRequest>();
        request->queryString = std::move(queryString);
        request->triggerEvent = triggerEvent;
        return request;
    }
    static constexpr auto fields() { return std::tuple<>{}; }
};

/// Suggestions before anything is typed.
struct TAVZeroKeywordRequest : platform::RecordOf<TAVZeroKeywordRequest, TAVRequest> {
    static constexpr std::string_view kClass = "TAVZeroKeywordRequest";
    static constexpr auto fields() { return std::tuple<>{}; }
};

/// More results of a section.
struct TAVMoreResultsRequest : platform::RecordOf<TAVMoreResultsRequest, TAVRequest> {
    static constexpr std::string_view kClass = "TAVMoreResultsRequest";
    std::optional<platform::Url> moreResultsURL; ///< from the earlier answer
    static constexpr auto fields()
    {
        return std::tuple{platform::field("moreResultsURL", &TAVMoreResultsRequest::moreResultsURL)};
    }
};

/// A result's card.
struct TAVCardRequest : platform::RecordOf<TAVCardRequest, TAVRequest> {
    static constexpr std::string_view kClass = "TAVCardRequest";
    std::optional<platform::Url> cardURL; ///< from the result
    static constexpr auto fields() { return std::tuple{platform::field("cardURL", &TAVCardRequest::cardURL)}; }
};

/// Words that the user looks up in a text; `queryString` has the words.
struct TAVLookupRequest : platform::RecordOf<TAVLookupRequest, TAVRequest> {
    static constexpr std::string_view kClass = "TAVLookupRequest";
    std::optional<std::string> clientContext; ///< what the text is part of: "mail", "article"
    std::optional<std::string> hintDomain;    ///< domain of the hint that was tapped
    LookupSelectionType selectionType = LookupSelectionType::Default;
    std::optional<std::string> queryContext; ///< the text around the words
    static constexpr auto fields()
    {
        using Self = TAVLookupRequest;
        return std::tuple{platform::field("clientContext", &Self::clientContext),
                          platform::field("hintDomain", &Self::hintDomain),
                          platform::field("selectionType", &Self::selectionType),
                          platform::field("queryContext", &Self::queryContext)};
    }
};

/// One flight, by the number in `queryString`.
struct TAVFlightLookupRequest : platform::RecordOf<TAVFlightLookupRequest, TAVRequest> {
    static constexpr std::string_view kClass = "TAVFlightLookupRequest";
    static constexpr auto fields() { return std::tuple<>{}; }
};

/// Flights that match `queryString`.
struct TAVFlightSearchRequest : platform::RecordOf<TAVFlightSearchRequest, TAVRequest> {
    static constexpr std::string_view kClass = "TAVFlightSearchRequest";
    static constexpr auto fields() { return std::tuple<>{}; }
};

} // namespace tavrin
