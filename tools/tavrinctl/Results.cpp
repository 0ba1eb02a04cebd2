#include "tools/tavrinctl/Results.h"

#include <algorithm>
#include <cmath>
#include <span>

#include <fmt/format.h>

#include "CoreTavrin/TAVBag.h"
#include "CoreTavrin/TAVError.h"
#include "CoreTavrin/TAVReply.h"
#include "platform/text/Text.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Json.h"
#include "platform/values/ValueCoder.h"
#include "tools/tavrinctl/Characters.h"
#include "tools/tavrinctl/Tool.h"

namespace tavrin::ctl {

using platform::Dictionary;
using platform::Value;

namespace {

std::string textIn(const Value& value)
{
    const std::string* text = value.asString();
    return text ? *text : std::string();
}

const Value::Array& arrayOf(const Value& value)
{
    static const Value::Array none;
    const Value::Array* array = value.asArray();
    return array ? *array : none;
}

std::string counted(std::size_t count, std::string_view noun)
{
    return fmt::format("{} {}{}", count, noun, count == 1 ? "" : "s");
}

Value valueOfError(const platform::Error& error)
{
    return Value::dictionaryOf({{"domain", error.domain}, {"code", error.code}, {"reason", error.reason()}});
}

/// Returns the error's reason, and what to check next if that is known.
std::string explain(const Exchange& exchange)
{
    const platform::Error& error = *exchange.answer->error;
    if (lacksBag(exchange))
        return fmt::format("the daemon has no bag{}; \"tavrinctl doctor\" says what to do",
                           exchange.cause.empty() ? "" : " (" + printable(exchange.cause) + ")");
    std::string reason = printable(error.reason().empty() ? error.description() : error.reason());
    if (error.domain == platform::kFormatErrorDomain) return "the service's answer is not JSON: " + reason;
    return reason;
}

void printHeaders(const Value& headers)
{
    if (const Dictionary* dictionary = headers.asDictionary())
        for (const auto& [name, value] : *dictionary)
            printLine(dim(fmt::format("    {}: {}", printable(name), plain(value))));
}

void printHttp(const TAVReply& reply)
{
    if (reply.httpRequest) {
        printLine(dim(fmt::format("  {} {}", reply.httpRequest->method, printable(reply.httpRequest->url))));
        printHeaders(reply.httpRequest->headers);
    }
    if (reply.httpResponse) {
        printLine(dim(fmt::format("  → {}", reply.httpResponse->statusCode)));
        printHeaders(reply.httpResponse->headers);
    }
}

std::string_view outcomeName(Outcome outcome)
{
    switch (outcome) {
    case Outcome::Answered: return "answered";
    case Outcome::Skipped: return "skipped";
    case Outcome::Overtaken: return "overtaken";
    case Outcome::Failed: break;
    }
    return "failed";
}

/// Returns the HTTP status of an answer that came from the service; 0 if it did not, or if the reply is not verbose.
int serviceStatus(const Exchange& exchange)
{
    const auto* reply = exchange.answer ? exchange.answer->reply.get() : nullptr;
    return reply && reply->httpResponse ? static_cast<int>(reply->httpResponse->statusCode) : 0;
}

bool serviceFailed(const Exchange& exchange)
{
    const int status = serviceStatus(exchange);
    return status != 0 && (status < 200 || status > 299);
}

} // namespace

Outcome Exchange::outcome() const
{
    if (!answer || answer->error) return Outcome::Failed;
    if (serviceFailed(*this)) return Outcome::Failed;
    if (answer->reply) return Outcome::Answered;
    return overtaken && skipReason.empty() ? Outcome::Overtaken : Outcome::Skipped;
}

bool lacksBag(const Exchange& exchange)
{
    const auto* error = exchange.answer && exchange.answer->error ? &*exchange.answer->error : nullptr;
    return error && error->domain == TAVErrorDomain && error->code == TAVErrorTimeout && error->reason() == "timeout";
}

std::string_view mark(const Exchange& exchange)
{
    const Outcome outcome = exchange.outcome();
    if (outcome != Outcome::Answered || !exchange.answer->reply->httpRequest) return outcomeName(outcome);
    // An answer from the cache has the request that fetched it, and no response.
    return exchange.answer->reply->httpResponse ? "network" : "cache";
}

std::string explanation(const Exchange& exchange)
{
    switch (exchange.outcome()) {
    case Outcome::Answered: {
        const Value raw = rawResponse(exchange);
        return fmt::format("{}, {}", counted(resultsIn(raw).size(), "result"), counted(raw.count(), "set"));
    }
    case Outcome::Skipped: return exchange.skipReason;
    case Outcome::Overtaken: return "overtaken by a later key and delivered empty";
    case Outcome::Failed: break;
    }
    if (!exchange.answer) return exchange.problem;
    if (serviceFailed(exchange)) return fmt::format("the service answered {}", serviceStatus(exchange));
    return explain(exchange);
}

std::string skipReason(const TAVBagAnswer& answer, std::string_view query)
{
    if (!answer.bag) return {};
    if (!answer.bag->isEnabled()) return "the bag disables search";
    if (platform::utf16Length(query) < answer.bag->minimumQueryLength())
        return fmt::format("shorter than the bag's minimum of {}", answer.bag->minimumQueryLength());
    return {};
}

std::vector<ListedResult> resultsIn(const Value& rawResponse)
{
    std::vector<ListedResult> results;
    for (const Value& set : arrayOf(rawResponse)) {
        for (const Value& result : arrayOf(set["results"])) {
            ListedResult listed{textIn(result["section_name"]), textIn(result["title"]), textIn(result["url"]),
                                textIn(result["description"])};
            if (!listed.title.empty()) results.push_back(std::move(listed));
        }
    }
    return results;
}

std::vector<std::string> suggestionsIn(const Value& rawResponse)
{
    std::vector<std::string> suggestions;
    for (const Value& set : arrayOf(rawResponse)) {
        for (const Value& suggestion : arrayOf(set["suggestions"])) {
            if (std::string text = textIn(suggestion["suggestion"]); !text.empty())
                suggestions.push_back(std::move(text));
        }
    }
    return suggestions;
}

Value rawResponse(const Exchange& exchange)
{
    if (!exchange.answer || !exchange.answer->reply || !exchange.answer->reply->rawResponse) return {};
    return platform::parseJson(exchange.answer->reply->rawResponse->view()).value_or(Value());
}

std::vector<std::string> cardLines(const Value& rawResponse)
{
    std::vector<std::string> lines;
    for (const Value& set : arrayOf(rawResponse))
        for (const Value& result : arrayOf(set["results"])) {
            const Value& card = result["card"];
            if (!card.asDictionary()) continue;
            if (const std::string title = textIn(card["title"]); !title.empty()) lines.push_back(printable(title));
            for (const Value& section : arrayOf(card["card_sections"])) {
                const std::string title = printable(textIn(section["title"]));
                const std::string text = printable(textIn(section["text"]));
                if (!title.empty() || !text.empty()) lines.push_back("  " + padded(title, 14) + "  " + text);
            }
        }
    return lines;
}

Value describe(const Exchange& exchange)
{
    Dictionary description{{"query", exchange.query},
                           {"query_id", exchange.queryId},
                           {"outcome", outcomeName(exchange.outcome())},
                           {"latency_ms", std::round(exchange.latency * 100) / 100}};
    if (exchange.outcome() == Outcome::Skipped && !exchange.skipReason.empty())
        description.set("reason", exchange.skipReason);
    if (exchange.outcome() == Outcome::Failed) description.set("reason", explanation(exchange));
    if (const int status = serviceStatus(exchange); status != 0) description.set("http_status", status);
    if (exchange.answer && exchange.answer->error) description.set("error", valueOfError(*exchange.answer->error));
    if (exchange.showHttp && exchange.answer && exchange.answer->reply) {
        const TAVReply& reply = *exchange.answer->reply;
        if (reply.httpRequest) description.set("http_request", platform::toValue(*reply.httpRequest));
        if (reply.httpResponse) description.set("http_response", platform::toValue(*reply.httpResponse));
    }
    if (exchange.outcome() != Outcome::Answered) return description;

    const Value raw = rawResponse(exchange);
    Value::Array results, suggestions;
    for (const ListedResult& result : resultsIn(raw))
        results.push_back(Value::dictionaryOf({{"section", result.section},
                                               {"title", result.title},
                                               {"url", result.url},
                                               {"description", result.description}}));
    for (std::string& suggestion : suggestionsIn(raw)) suggestions.emplace_back(std::move(suggestion));
    if (mark(exchange) != outcomeName(Outcome::Answered)) description.set("source", mark(exchange));
    description.set("results", std::move(results));
    description.set("suggestions", std::move(suggestions));
    description.set("response", raw);
    return description;
}

std::string summary(const Exchange& exchange)
{
    std::string line = fmt::format("{} {:>7.1f} ms  {}", padded("\"" + printable(exchange.query) + "\"", 16),
                                   exchange.latency, mark(exchange));
    if (const std::string why = explanation(exchange); !why.empty()) line += ": " + why;
    return line;
}

void printAnswer(const Exchange& exchange, std::size_t limit)
{
    if (exchange.showHttp && exchange.answer && exchange.answer->reply) printHttp(*exchange.answer->reply);
    if (exchange.outcome() != Outcome::Answered) return;
    const Value raw = rawResponse(exchange);
    std::string section;
    const std::vector<ListedResult> results = resultsIn(raw);
    if (limit == 0) limit = results.size();
    for (const ListedResult& result : std::span(results).first(std::min(limit, results.size()))) {
        if (result.section != section) printLine(bold("  " + printable(section = result.section)));
        printLine(fmt::format("    {}", printable(result.title)));
        if (!result.url.empty()) printLine(dim("      " + printable(result.url)));
    }
    if (results.size() > limit) printLine(dim(fmt::format("    … and {} more", results.size() - limit)));
    for (const std::string& line : cardLines(raw)) printLine("    " + line);
    std::string suggestions;
    for (const std::string& suggestion : suggestionsIn(raw))
        suggestions += (suggestions.empty() ? "" : " · ") + printable(suggestion);
    if (!suggestions.empty()) printLine(bold("  Suggestions") + "\n    " + suggestions);
}

} // namespace tavrin::ctl
