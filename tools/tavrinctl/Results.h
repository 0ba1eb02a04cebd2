#pragma once

#include <string>
#include <vector>

#include "CoreTavrin/TAVClient.h"
#include "platform/values/Value.h"

namespace tavrin::ctl {

/// What became of a request, as a user would say it.
enum class Outcome {
    Answered,
    Skipped,   ///< the daemon had a reason not to ask the service
    Overtaken, ///< a later request was accepted before the answer came, which was then delivered empty
    Failed,
};
[[nodiscard]] std::string_view outcomeName(Outcome outcome);

/// One request and its answer.
struct Exchange {
    std::string query;
    std::int64_t queryId = 0;
    double latency = 0;              ///< milliseconds from the call to its answer
    bool overtaken = false;          ///< a later request was sent before the answer came
    std::string skipReason;          ///< why the daemon would skip this query, by its bag; empty if it wouldn't
    std::optional<TAVAnswer> answer; ///< none: no answer in time, or the connection ended
    std::string problem;             ///< what happened instead of an answer

    bool showHttp = false; ///< the HTTP request and response are to be shown

    [[nodiscard]] Outcome outcome() const;
    [[nodiscard]] bool waiting() const { return !answer && problem.empty(); }
};

/// "network" or "cache", where the answer came from; "answered" where a reply that isn't verbose doesn't tell. Else its
/// outcome's name.
[[nodiscard]] std::string_view mark(const Exchange& exchange);
/// How much came, or why nothing did; may be empty.
[[nodiscard]] std::string explanation(const Exchange& exchange);

/// Why the daemon doesn't ask the service for `query` under this bag; empty if it does.
[[nodiscard]] std::string skipReason(const TAVBagAnswer& bag, std::string_view query);

/// A result as it is listed.
struct ListedResult {
    std::string section;
    std::string title;
    std::string url;
    std::string description;
};
/// The results of an answer, in order: what has a "title" in the "results" of a result set.
[[nodiscard]] std::vector<ListedResult> resultsIn(const platform::Value& rawResponse);
/// The texts of its suggestions.
[[nodiscard]] std::vector<std::string> suggestionsIn(const platform::Value& rawResponse);
/// The service's answer as a value; null where there is none.
[[nodiscard]] platform::Value rawResponse(const Exchange& exchange);

/// {"query", "outcome", "latency_ms", "results", …} for scripts.
[[nodiscard]] platform::Value describe(const Exchange& exchange);
/// One line: what was asked, what became of it, how long it took.
[[nodiscard]] std::string summary(const Exchange& exchange);
/// Results by section, suggestions, and the HTTP request and response where they are to be shown. At most `limit`
/// results; 0 is all.
void printAnswer(const Exchange& exchange, std::size_t limit);

} // namespace tavrin::ctl
