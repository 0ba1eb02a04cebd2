#include "tools/tavrinctl/RequestRunner.h"

#include <fmt/format.h>

#include "CoreTavrin/TAVBag.h"
#include "CoreTavrin/TAVRequest.h"
#include "tools/tavrinctl/StatusText.h"

namespace tavrin::ctl {

namespace {

using Clock = std::chrono::steady_clock;

double millisecondsSince(Clock::time_point begin)
{
    return std::chrono::duration<double, std::milli>(Clock::now() - begin).count();
}

} // namespace

RequestRunner::RequestRunner(const Options& options, bool showHttp)
    : _options(options), _showHttp(showHttp), _session(openSession(options))
{
    _bag = valueOf(_session.client->bag());
}

std::shared_ptr<Exchange> RequestRunner::send(TAVRequest& request, std::string query, Shown answered)
{
    for (const Outstanding& earlier : _outstanding) earlier.exchange->overtaken = true;
    auto exchange = std::make_shared<Exchange>();
    exchange->query = std::move(query);
    exchange->showHttp = _showHttp;
    exchange->queryId = request.queryId = ++_lastQueryId;
    request.verboseReply = true; // shows if the cache or the service answered, and with which status
    if (dynamic_cast<const TAVSearchRequest*>(&request)) exchange->skipReason = skipReason(_bag, exchange->query);
    const auto begin = Clock::now();
    _outstanding.push_back({exchange, begin});

    _session.client->send(request, [this, exchange, begin, answered](platform::Result<TAVAnswer> answer) {
        exchange->latency = millisecondsSince(begin);
        if (answer)
            exchange->answer = std::move(*answer);
        else
            exchange->problem = answer.error().reason();
        std::erase_if(_outstanding, [&](const Outstanding& each) { return each.exchange == exchange; });
        if (lacksBag(*exchange)) _withoutBag.push_back(exchange);
        if (answered) answered(*exchange);
    });
    return exchange;
}

bool RequestRunner::takeAnswers(const std::function<bool()>& done, int descriptor)
{
    while (!_session.client->wait(done, std::chrono::hours(24), descriptor))
        if (!_session.client->connected()) return false;
    return true;
}

void RequestRunner::pause(std::chrono::duration<double, std::milli> duration)
{
    _session.client->wait([] { return false; }, std::chrono::duration_cast<platform::Duration>(duration));
}

void RequestRunner::waitForAll()
{
    if (_session.client->wait([this] { return _outstanding.empty(); }, platform::durationFromSeconds(_options.timeout)))
        return explainMissingBag();
    const std::string problem = _session.client->connected() ? fmt::format("no answer within {:g} s", _options.timeout)
                                                             : "the daemon closed the connection";
    for (const Outstanding& each : _outstanding) {
        each.exchange->problem = problem;
        each.exchange->latency = millisecondsSince(each.begin);
    }
    _outstanding.clear();
}

/// Not called from an answer's callback, in which no other call can wait.
void RequestRunner::explainMissingBag()
{
    if (_withoutBag.empty()) return;
    if (const auto status = _session.client->status())
        for (const auto& exchange : _withoutBag) exchange->cause = lastFetchText((*status)["bag"]);
    _withoutBag.clear();
}

Exchange RequestRunner::run(TAVRequest& request, std::string query)
{
    const auto exchange = send(request, std::move(query));
    waitForAll();
    return *exchange;
}

Exchange RequestRunner::runThroughEndpoint(TAVRequest& request, std::string query)
{
    const auto endpoint = valueOf(TAVEndpointClient::connect(_session.endpoint));
    endpoint->setTimeout(platform::durationFromSeconds(_options.timeout));
    Exchange exchange;
    exchange.query = std::move(query);
    exchange.showHttp = _showHttp;
    exchange.queryId = request.queryId = ++_lastQueryId;
    request.verboseReply = true;
    const auto begin = Clock::now();
    auto answer = endpoint->request(request, _session.configuration);
    exchange.latency = millisecondsSince(begin);
    if (answer)
        exchange.answer = std::move(*answer);
    else
        exchange.problem = answer.error().reason();
    return exchange;
}

std::vector<std::shared_ptr<TAVQueryItem>> queryItems(const std::vector<std::string>& texts)
{
    std::vector<std::shared_ptr<TAVQueryItem>> items;
    for (const std::string& text : texts) {
        const auto equals = text.find('=');
        if (equals == 0 || text.empty()) throw Failure(fmt::format("--item \"{}\" is not NAME=VALUE", text), 2);
        std::optional<std::string> value;
        if (equals != std::string::npos) value = text.substr(equals + 1);
        items.push_back(std::make_shared<TAVQueryItem>(text.substr(0, equals), std::move(value)));
    }
    return items;
}

void finish(const Options& options, const Exchange& exchange)
{
    if (options.json) {
        printJson(describe(exchange));
    } else {
        printLine(summary(exchange));
        printAnswer(exchange, options.limit);
    }
    if (exchange.outcome() == Outcome::Failed) throw Failure("", 1); // the summary has the reason
}

} // namespace tavrin::ctl
