#pragma once

#include <concepts>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "platform/values/ArchivedRecord.h"
#include "platform/values/JsonSink.h"
#include "searchrecords/ZRSearchResult.h"

namespace platform {
struct Error;
}

namespace tavrin {

enum class EventType : std::int64_t;
enum class ResultEngagementDestination : std::int64_t;
struct ZRResultRankingFeedback;
struct ZRSectionRankingFeedback;
class SessionProcessingHelper;

/// What an event says besides its record.
struct EventContext {
    EventType type{};
    std::optional<std::int64_t> queryId;        ///< if events of the type have one
    std::optional<std::uint64_t> clientQueryId; ///< likewise, and if the client numbers its queries
    std::uint64_t timestamp = 0;
};

/// Writes the fields of one event: `fields("id", section["identifier"_field])`. docs/feedback.md shows one event of
/// each type. A missing text, array or record is null. One thread at a time.
class JsonFields {
public:
    /// With `identifiers`, results and suggestions have their replacements in place of the client's identifiers. All
    /// must outlive the fields.
    JsonFields(platform::JsonSink& sink, const EventContext& event, const SessionProcessingHelper* identifiers)
        : _sink(sink), _event(event), _identifiers(identifiers)
    {}

    template <class T> JsonFields& operator()(std::string_view key, const T& value)
    {
        _sink.key(key);
        write(value);
        return *this;
    }
    /// Adds a field that holds the identifier of a result or suggestion.
    JsonFields& identifier(std::string_view key, std::optional<std::string_view> identifier);
    /// Adds a field that holds records, each in an archive of its own. They were opened before.
    template <class R, class Archives>
    void records(std::string_view key, const Archives& archives, platform::OpenArchive& open)
    {
        _sink.key(key);
        _sink.beginArray();
        for (const std::string_view archive : archives)
            if (open.open(archive)) write(open.root().as<R>());
        _sink.endArray();
    }
    /// Adds the entries of a client's own dictionary. The event's context replaces entries with the same keys.
    void readyMade(const platform::ArchivedValue& dictionary);
    /// Adds the rest of the event's context.
    void finish();

private:
    [[nodiscard]] bool hasContext(std::size_t index) const;
    void addContext(std::size_t index);

    void write(std::nullptr_t) { _sink.null(); }
    void write(bool value) { _sink.boolean(value); }
    void write(std::signed_integral auto value) { _sink.integer(value); }
    void write(std::unsigned_integral auto value) { _sink.unsignedInteger(value); }
    void write(double value) { _sink.real(value); }
    void write(std::string_view value) { _sink.string(value); }
    void write(const std::string& value) { _sink.string(value); }
    void write(const char* value) { _sink.string(value); }
    void write(const platform::Value& value) { _sink.value(value); }
    void write(const platform::ArchivedValue& value) { value.write(_sink); }
    template <class T> void write(const std::optional<T>& value) { value ? write(*value) : _sink.null(); }
    template <class R> void write(const platform::ArchivedRecord<R>& record)
    {
        if (!record) return _sink.null();
        _sink.beginObject();
        addObject(*this, record);
        _sink.endObject();
    }
    template <class R> void write(const platform::ArchivedArray<std::shared_ptr<R>>& records)
    {
        _sink.beginArray();
        for (const auto& record : records) write(record);
        _sink.endArray();
    }
    /// A nested object: `fields("result", [&](JsonFields& fields) { … })`.
    template <std::invocable<JsonFields&> Write> void write(const Write& writeFields)
    {
        _sink.beginObject();
        writeFields(*this);
        _sink.endObject();
    }

    platform::JsonSink& _sink;
    const EventContext& _event;
    const SessionProcessingHelper* _identifiers;
    unsigned _contextAdded = 0; ///< bit i for the key i of the context
};

/// Add the fields of an object in an event.
void addObject(JsonFields& fields, const platform::ArchivedRecord<ZRSearchResult>& result);
void addObject(JsonFields& fields, const platform::ArchivedRecord<ZRSearchSuggestion>& suggestion);
void addObject(JsonFields& fields, const platform::ArchivedRecord<ZRResultSection>& section);
void addObject(JsonFields& fields, const platform::ArchivedRecord<ZRResultRankingFeedback>& ranking);
void addObject(JsonFields& fields, const platform::ArchivedRecord<ZRSectionRankingFeedback>& ranking);
/// Adds an error's "code", "domain" and "reason".
void encodeErrorForJSON(JsonFields& fields, const platform::Error& error);

/// Returns the URL that the engagement of a result opened, or nothing. An engaged action opens its own punchout. A
/// result opens its punchout only if `destination` is `Punchout`.
[[nodiscard]] std::optional<std::string_view>
actionDestinationFromResult(const platform::ArchivedRecord<ZRSearchResult>& result,
                            const platform::ArchivedRecord<ZRActionItem>& actionEngaged,
                            ResultEngagementDestination destination);
/// Returns the URL that the client would open, or nothing: `ZRPunchout::preferredOpenableURL`.
[[nodiscard]] std::optional<std::string_view>
preferredOpenableURL(const platform::ArchivedRecord<ZRPunchout>& punchout);

} // namespace tavrin
