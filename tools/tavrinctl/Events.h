#pragma once

#include <initializer_list>
#include <string>
#include <string_view>

#include "platform/base/Bytes.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Value.h"

/// Feedback as people read it: short lines, safe for a terminal.
namespace tavrin::ctl {

/// The fields of an event or a record but for `left out`: "trigger_event=tap input="weather" results[3]". What is null,
/// false or empty is left out, long texts are shortened.
[[nodiscard]] std::string fieldsLine(const platform::Dictionary& fields,
                                     std::initializer_list<std::string_view> leftOut);

/// "query 7", or nothing for an event of no query.
[[nodiscard]] std::string queryText(const platform::Value& queryId);

/// An event object: its type, its query, then its other fields but for the time.
[[nodiscard]] std::string eventLine(const platform::Value& event);

/// The body of an upload.
struct FlushedBody {
    std::size_t packedSize = 0;
    std::string text;     ///< unpacked; empty where it can't be
    platform::Value json; ///< null where it is none
    std::string problem;  ///< why it can't be read; empty where it can
};
[[nodiscard]] FlushedBody flushedBody(const platform::Bytes& packed);

/// A session's agent, user, number of events and sizes, and on the next line its first event types in their order; or
/// the keys of a record that is sent on its own.
[[nodiscard]] std::string summary(const FlushedBody& body);
/// {"packed_size", "size", "body"}, or {"packed_size", "error"}.
[[nodiscard]] platform::Value describe(const FlushedBody& body);

} // namespace tavrin::ctl
