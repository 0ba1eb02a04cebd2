#pragma once

#include <string>
#include <vector>

#include "CoreTavrin/TAVClient.h"
#include "platform/values/Value.h"

namespace tavrin::ctl {

/// The outcome of a request.
enum class Outcome {
    Answered,
    Skipped,   ///< the daemon had a reason not to ask the service
    Overtaken, ///< delivered empty, because a later request was accepted before the answer came
    Failed,
};

/// One request and its answer.
struct Exchange {
    std::string query;
    std::int64_t queryId = 0;
    double latency = 0;              ///< milliseconds from the call to its answer
    bool overtaken = false;          ///< a later request was sent before the answer came
    std::string skipReason;          ///< why the daemon would skip this query, by its bag; empty if it wouldn't
    std::optional<TAVAnswer> answer; ///< nothing: no answer in time, or the connection ended
    std::string problem;             ///< what happened instead of an answer
    std::string cause;               ///< more about why there is no bag, for a failure because of that

    bool showHttp = false; ///< the HTTP request and response are to be shown

    [[nodiscard]] Outcome outcome() const;
    [[nodiscard]] bool waiting() const { return !answer && problem.empty(); }
};

/// Returns whether the request failed because the daemon had no bag in time.
[[nodiscard]] bool lacksBag(const Exchange& exchange);

/// Returns "network" or "cache" for the source of an answer, "answered" if the reply is not verbose and hides its
/// source, and the outcome's name for any other outcome.
[[nodiscard]] std::string_view mark(const Exchange& exchange);
/// Returns the number of results, or the reason for having none; may be empty.
[[nodiscard]] std::string explanation(const Exchange& exchange);

/// Explains why the daemon does not send `query` under this bag; empty if it does.
[[nodiscard]] std::string skipReason(const TAVBagAnswer& bag, std::string_view query);

/// A result in a list.
struct ListedResult {
    std::string section;
    std::string title;
    std::string url;
    std::string description;
};
/// Returns every entry with a "title" in the "results" of each result set, in order.
[[nodiscard]] std::vector<ListedResult> resultsIn(const platform::Value& rawResponse);
/// Returns the texts of all suggestions.
[[nodiscard]] std::vector<std::string> suggestionsIn(const platform::Value& rawResponse);
/// Returns the service's answer as a value; null if there is none.
[[nodiscard]] platform::Value rawResponse(const Exchange& exchange);

/// Returns the lines of the card that the answer has: its title, then each section's title and text.
[[nodiscard]] std::vector<std::string> cardLines(const platform::Value& rawResponse);
/// Returns {"query", "outcome", "latency_ms", "results", …} for scripts.
[[nodiscard]] platform::Value describe(const Exchange& exchange);
/// Returns one line with the query, the latency and the outcome.
[[nodiscard]] std::string summary(const Exchange& exchange);
/// Prints at most `limit` results by section (0 for all), the card, the suggestions, and the HTTP request and response
/// if the exchange has `showHttp`.
void printAnswer(const Exchange& exchange, std::size_t limit);

} // namespace tavrin::ctl
