// Searches that are answered from memory: a single one beside an echo of as many bytes over a bare socket, and those of
// users who type beside a model of the cache's rules.

#include <cstdio>
#include <cstdlib>

#include <curl/curl.h>
#include <fmt/format.h>

#include "bench/CacheModel.h"
#include "bench/PlainClient.h"
#include "bench/Support.h"
#include "CoreTavrin/TAVBag.h"
#include "CoreTavrin/TAVReply.h"
#include "CoreTavrin/TAVRequest.h"
#include "platform/files/Files.h"
#include "platform/text/Text.h"
#include "platform/values/Json.h"
#include "tools/replay/Corpus.h"
#include "tools/replay/Report.h"

namespace tavrin::bench {

using platform::Value;
using replay::percentile;

namespace {

constexpr std::size_t kAnswerSize = 20'000;
constexpr double kScale = 2;

TAVAnswer search(TAVClient& client, std::int64_t queryId, const std::string& text, bool verbose = false)
{
    auto request = TAVSearchRequest::searchRequestWithString(text, StartSearchTrigger::NewCharacter);
    request->queryId = queryId;
    request->scale = kScale;
    request->keyboardInputMode = "en";
    request->verboseReply = verbose;
    auto answer = client.request(*request);
    require(answer && answer->reply && answer->reply->rawResponse, "no answer to \"" + text + "\"");
    return std::move(*answer);
}

std::string percentiles(const std::vector<double>& latencies)
{
    return fmt::format("{} / {} / {}", seconds(percentile(latencies, 50)), seconds(percentile(latencies, 90)),
                       seconds(percentile(latencies, 99)));
}

/// A control call of the development service.
void control(const std::string& url, const std::string& body)
{
    CURL* curl = curl_easy_init();
    curl_easy_setopt(curl, CURLOPT_URL, url.c_str());
    curl_easy_setopt(curl, CURLOPT_POSTFIELDS, body.c_str());
    curl_easy_setopt(curl, CURLOPT_FAILONERROR, 1L);
    curl_easy_setopt(
        curl, CURLOPT_WRITEFUNCTION, +[](char*, std::size_t size, std::size_t count, void*) { return size * count; });
    require(curl_easy_perform(curl) == CURLE_OK, url);
    curl_easy_cleanup(curl);
}

} // namespace

std::vector<Row> hit()
{
    constexpr int kRounds = 9;
    constexpr int kCalls = 500;
    const OneCore pinned;
    Service service(kAnswerSize, 0, "weather in the mountains");
    const Daemon daemon(service.url("/bag"));
    const auto client = daemon.client();
    std::int64_t queryId = 0;
    (void)search(*client, ++queryId, "wea");
    service.setDelay(-1); // from here on, a search that isn't answered from memory isn't answered
    const auto searchFurther = [&queryId](TAVClient& asking) {
        if (search(asking, ++queryId, "weather").reply->rawResponse->size() < kAnswerSize) std::abort();
    };
    Echo echo(daemon.sizesOf(searchFurther));
    const PlainServer server(kAnswerSize + 100); // the size of `service`'s answer, to a result
    const auto plainClient = server.client();

    std::vector<double> ours, plain, beside;
    for (int round = 0; round < kRounds; ++round) {
        std::fprintf(stderr, "\ranswers from memory: round %d of %d ", round + 1, kRounds);
        for (int i = 0; i < kCalls; ++i) ours.push_back(timeOf([&] { searchFurther(*client); }));
        for (int i = 0; i < kCalls; ++i) plain.push_back(timeOf([&] { searchFurther(*plainClient); }));
        for (int i = 0; i < kCalls; ++i) beside.push_back(timeOf([&] { echo.roundTrip(); }));
    }
    std::fputc('\n', stderr);

    const double median = percentile(ours, 50), itsMedian = percentile(beside, 50);
    const double spread = percentile(ours, 99) / median, itsSpread = percentile(beside, 99) / itsMedian;
    auto rows = callRows("cached search over IPC, 20 KB answer", 4, median, percentile(plain, 50), itsMedian);
    rows.insert(rows.begin() + 1,
                {"its 99th percentile over its median, beside the echo's", fmt::format("{:.2f}", spread),
                 fmt::format("{:.2f}", itsSpread), spread / itsSpread, 2, "×"});
    return rows;
}

std::vector<Row> typing()
{
    Process service({DEVSERVER, "--http-port", "0", "--https-port", "0", "--cert-dir",
                     (std::filesystem::temp_directory_path() / "tavrin-bench-certificate").string(), "--quiet"},
                    {});
    const auto ready = platform::parseJson(service.firstLine()).value();
    // The pauses are left out, so nothing would expire unless the machine is slow.
    control(*ready["http"].asString() + "/control/search", R"({"max_age": 0})");
    const Daemon daemon(*ready["https"].asString() + "/bag", {"SSL_CERT_FILE=" + *ready["ca"].asString()});
    const auto client = daemon.client();
    const auto bag = client->bag();
    require(bag && bag->bag, "no bag");

    const auto corpus = platform::makeSystemFiles()->read(CORPUS, 1 << 20).value();
    const auto queries = replay::parseCorpus(corpus.view()).value();
    test::CacheModel model;
    std::vector<double> hits, requests;
    std::vector<std::string> urls;
    int expectedHits = 0, differences = 0;
    std::int64_t queryId = 0;
    const double begin = cpu(daemon.pid());
    for (std::size_t i = 0; i < queries.size(); ++i) {
        std::fprintf(stderr, "\rthe typing corpus: query %zu of %zu ", i + 1, queries.size());
        for (const auto& key : queries[i].keys) {
            if (platform::utf16Length(key.text) < bag->bag->minimumQueryLength()) continue;
            const auto* expected = model.get(key.text, kScale, {});
            const std::string expectedAnswer = expected ? platform::toJson(Value::Array{expected->set}) : "";
            expectedHits += expected ? 1 : 0;

            TAVAnswer answer;
            const double latency = timeOf([&] { answer = search(*client, ++queryId, key.text, true); });
            const std::string_view text = answer.reply->rawResponse->view();
            if (!answer.reply->httpResponse) {
                hits.push_back(latency);
                differences += text == expectedAnswer ? 0 : 1;
                continue;
            }
            requests.push_back(latency);
            urls.push_back(answer.reply->httpRequest->url);
            differences += expected ? 1 : 0;
            const Value sets = platform::parseJson(text).value();
            for (const Value& set : *sets.asArray())
                if (set["status"] != Value("ERROR")) model.put(key.text, kScale, set, {});
        }
    }
    std::fputc('\n', stderr);
    const double ours = cpu(daemon.pid()) - begin;
    PlainClient plain(*ready["ca"].asString());
    const double plainBegin = cpu();
    for (const std::string& url : urls) plain.request(url);
    const double beside = cpu() - plainBegin;

    const auto count = [](std::size_t number) { return fmt::format("{}", number); };
    const auto searches = static_cast<double>(hits.size() + requests.size());
    return {{"the typing corpus: keys that are answered otherwise than a model of the cache's rules says",
             count(hits.size()) + " hits", fmt::format("{} hits", expectedHits), static_cast<double>(differences), 0,
             ""},
            {"its searches that the service is asked for; the others are saved", count(requests.size()),
             count(hits.size() + requests.size()), 100 * static_cast<double>(requests.size()) / searches, 50, "%"},
            {"its latencies at 50, 90 and 99 %, of hits beside requests", percentiles(hits), percentiles(requests),
             percentile(hits, 50) / percentile(requests, 50), kReportedOnly, "×"},
            {"the daemon's CPU for a key of it, beside libcurl and simdjson making the requests that remain",
             seconds(ours / searches), seconds(beside / searches), ours / beside, kReportedOnly, "×"}};
}

} // namespace tavrin::bench
