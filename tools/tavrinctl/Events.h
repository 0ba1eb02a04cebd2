#pragma once

#include <initializer_list>
#include <string>
#include <string_view>

#include "platform/base/Bytes.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Value.h"

/// Formats feedback as short lines that are safe for a terminal.
namespace tavrin::ctl {

/// Formats the fields of an event or a record: "trigger_event=tap input="weather" results[3]". Omits the fields in
/// `leftOut` and those that are null, false or empty; cuts long texts.
[[nodiscard]] std::string fieldsLine(const platform::Dictionary& fields,
                                     std::initializer_list<std::string_view> leftOut);

/// Returns "query 7", or an empty string for an event without a query.
[[nodiscard]] std::string queryText(const platform::Value& queryId);

/// Formats an event: its type, its query, then its other fields except the time.
[[nodiscard]] std::string eventLine(const platform::Value& event);

/// The body of an upload.
struct FlushedBody {
    std::size_t packedSize = 0;
    std::string text;     ///< decompressed; empty if that failed
    platform::Value json; ///< null if the text is not JSON
    std::string problem;  ///< why the body can't be read; empty if it can
};
/// Decompresses and parses a body.
[[nodiscard]] FlushedBody flushedBody(const platform::Bytes& packed);

/// Formats a session's agent, user, number of events and sizes, and on a second line its first event types; or the keys
/// of a record that was sent on its own.
[[nodiscard]] std::string summary(const FlushedBody& body);
/// Returns {"packed_size", "size", "body"}, or {"packed_size", "error"} for a broken body.
[[nodiscard]] platform::Value describe(const FlushedBody& body);

} // namespace tavrin::ctl
