#include "tools/replay/Report.h"

#include <algorithm>
#include <cmath>

#include <fmt/format.h>

#include "CoreTavrin/TAVReply.h"
#include "platform/net/Url.h"
#include "platform/text/Text.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Json.h"

namespace tavrin::replay {

using platform::Value;

namespace {

constexpr double kPercentiles[] = {50, 90, 99};

Value latencies(const std::vector<double>& values)
{
    platform::Dictionary result{{"count", values.size()}};
    for (const double percent : kPercentiles)
        result.set(fmt::format("p{:g}_ms", percent), std::round(percentile(values, percent) * 1e5) / 100);
    result.set("max_ms", std::round(percentile(values, 100) * 1e5) / 100);
    return result;
}

Value arrayOf(const std::vector<std::string>& texts)
{
    Value::Array array;
    for (const std::string& text : texts) array.emplace_back(text);
    return array;
}

std::string latencyLine(std::string_view name, const std::vector<double>& values)
{
    if (values.empty()) return "";
    std::string line = fmt::format("  {:<8}", name);
    for (const double percent : kPercentiles) line += fmt::format(" {:>9.2f}", percentile(values, percent) * 1e3);
    return line + fmt::format(" {:>9.2f}\n", percentile(values, 100) * 1e3);
}

/// Returns the text that the reply's HTTP request was made for.
std::string fetchedFor(const TAVReply& reply)
{
    const auto url = platform::Url::parse(reply.httpRequest->url);
    return url ? url->queryValue("q").value_or("") : "";
}

Value setsIn(const TAVReply& reply)
{
    return reply.rawResponse ? platform::parseJson(reply.rawResponse->view()).value_or(Value()) : Value();
}

} // namespace

Kind kindOf(const platform::Result<TAVAnswer>& answer)
{
    if (!answer || answer->error) return Kind::Failed;
    if (!answer->reply) return Kind::Empty;
    return answer->reply->httpResponse ? Kind::Network : Kind::Cache;
}

void Report::add(const Search& search, const platform::Result<TAVAnswer>& answer)
{
    ++_keys;
    const double latency = search.answered - search.sent;
    const Kind kind = kindOf(answer);
    switch (kind) {
    case Kind::Failed:
        _failed.push_back(fmt::format("\"{}\" ({}): {}", search.text, search.queryId,
                                      answer ? answer->error->reason() : answer.error().reason()));
        break;
    case Kind::Empty:
        if (search.tooShort)
            ++_skipped;
        else if (!search.overtaken)
            _failed.push_back(fmt::format("\"{}\" ({}): empty, without a reason", search.text, search.queryId));
        else {
            ++_overtaken;
            _fetched[search.text] = search.answered;
        }
        break;
    case Kind::Network:
        _network.push_back(latency);
        _fetched[fetchedFor(*answer->reply)] = search.answered;
        break;
    case Kind::Cache:
        _cache.push_back(latency);
        checkCached(search, *answer, setsIn(*answer->reply));
        break;
    }
    if (kind == Kind::Cache || kind == Kind::Network) checkOrder(search);
    _newestAnswered = std::max(_newestAnswered, search.queryId);
}

void Report::addUnanswered(const Search& search)
{
    ++_keys;
    _failed.push_back(fmt::format("\"{}\" ({}): no answer", search.text, search.queryId));
}

/// Answers arrive in the order in which the daemon sent them. An answer with results must not follow that of a later
/// search.
void Report::checkOrder(const Search& search)
{
    if (search.queryId < _newestAnswered)
        _stale.push_back(fmt::format("\"{}\" ({}) came after the answer of a later key ({})", search.text,
                                     search.queryId, _newestAnswered));
}

/// A cached set must have been fetched for a prefix of the typed text, must complete it, and must not be expired.
void Report::checkCached(const Search& search, const TAVAnswer& answer, const Value& sets)
{
    const std::string typed = platform::lowerCased(search.text);
    const std::string input = fetchedFor(*answer.reply);
    if (!typed.starts_with(platform::lowerCased(input)))
        _stale.push_back(fmt::format("\"{}\" got what was fetched for \"{}\"", search.text, input));
    const auto fetched = _fetched.find(input);
    for (std::size_t i = 0; i < sets.count(); ++i) {
        const std::string* query = sets[i]["query"].asString();
        if (!query || !platform::lowerCased(*query).starts_with(typed))
            _stale.push_back(fmt::format("\"{}\" got results for \"{}\"", search.text, query ? *query : ""));
        const double maxAge = sets[i]["max_age"].asDouble().value_or(0);
        // The set was fetched before its answer arrived here, so it is older than this difference.
        if (maxAge > 0 && fetched != _fetched.end() && search.sent - fetched->second > maxAge)
            _stale.push_back(fmt::format("\"{}\" got results of {:.1f} s ago, which last {:g} s", search.text,
                                         search.sent - fetched->second, maxAge));
    }
}

double Report::savedPercent() const
{
    const auto all = static_cast<double>(hits() + requests());
    return all > 0 ? 100 * static_cast<double>(hits()) / all : 0;
}

Value Report::json() const
{
    return Value::dictionaryOf({{"keys", _keys},
                                {"skipped", _skipped},
                                {"hits", hits()},
                                {"requests", requests()},
                                {"overtaken", _overtaken},
                                {"failed", arrayOf(_failed)},
                                {"requests_saved_percent", std::round(savedPercent() * 100) / 100},
                                {"stale", arrayOf(_stale)},
                                {"cache", latencies(_cache)},
                                {"network", latencies(_network)}});
}

std::string Report::text() const
{
    std::string text = fmt::format("{} keys, {} of them without a request\n"
                                   "{} answered from memory, {} requests: {:.1f} % of requests saved\n",
                                   _keys, _skipped, hits(), requests(), savedPercent());
    if (_overtaken > 0) text += fmt::format("{} of the requests were overtaken by a later key\n", _overtaken);
    text += fmt::format("{} stale answers, {} failed\n", _stale.size(), _failed.size());
    for (const std::string& what : _stale) text += "  stale: " + what + "\n";
    for (const std::string& what : _failed) text += "  failed: " + what + "\n";
    text += "  ms             50 %      90 %      99 %   longest\n";
    return text + latencyLine("cache", _cache) + latencyLine("network", _network);
}

double percentile(std::vector<double> values, double percent)
{
    if (values.empty()) return 0;
    const double rank = std::ceil(percent / 100 * static_cast<double>(values.size()));
    const auto nth = values.begin() + static_cast<std::ptrdiff_t>(std::max(rank, 1.0)) - 1;
    std::ranges::nth_element(values, nth);
    return *nth;
}

} // namespace tavrin::replay
