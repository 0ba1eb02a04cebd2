#pragma once

#include "fuzz/Check.h"
#include "fuzz/UploadModel.h"
#include "platform/values/Error.h"
#include "platform/values/Json.h"
#include "platform/values/Value.h"
#include "tavrind/FeedbackBooks.h"
#include "tavrind/OutputStream.h"
#include "tavrind/StoredSession.h"

namespace fuzz {

/// Checks the JSON text that a session's upload would have: every event, then the objects that the events refer to. It
/// must equal the text of the model.
inline void checkUpload(tavrin::StoredSession& session)
{
    constexpr std::size_t kKindsOfMissing = 2; // results and suggestions
    const std::size_t events = session.recordedEvents();
    const std::string expected = UploadModel::upload(session.feedbacks(), session.description());
    tavrin::MemoryOutputStream stream;
    stream.open();
    const auto keys = session.getFeedbacksToSend(stream);
    check(keys.has_value());
    check(stream.contents() == expected, std::string(stream.contents()) + "\n" + expected);

    const auto json = platform::parseJson(stream.contents());
    if (!json) return check(json.error().reason().starts_with("nested deeper"), json.error().description());
    check(json->count() == *keys, stream.contents());
    const platform::Value::Array& sent = *(*json)["fb"].asArray();
    check(sent.size() >= events && sent.size() <= events + kKindsOfMissing, std::to_string(sent.size()));
    for (const platform::Value& event : sent)
        check(event["type"].asString() && event["timestamp"].asUInt(), platform::toJson(event));
}

/// Checks that every event is in exactly one place.
inline void checkBooks(const tavrin::FeedbackBooks& books)
{
    std::int64_t sum = 0;
    for (std::size_t fate = 0; fate < tavrin::kFeedbackFates; ++fate) {
        const std::int64_t events = books.count(static_cast<tavrin::FeedbackFate>(fate));
        check(events >= 0, platform::toJson(books.description()));
        sum += events;
    }
    check(books.recorded() == sum, platform::toJson(books.description()));
}

} // namespace fuzz
