// A search that no cache answers, beside the same request made with libcurl and parsed with simdjson, both with a warm
// connection.

#include <cstdlib>

#include <curl/curl.h>
#include <simdjson.h>

#include "bench/Support.h"
#include "CoreTavrin/TAVReply.h"
#include "CoreTavrin/TAVRequest.h"

namespace tavrin::bench {

namespace {

constexpr std::size_t kAnswerSize = 60'000;

class PlainClient {
public:
    explicit PlainClient(const std::string& url) : _curl(curl_easy_init())
    {
        curl_easy_setopt(_curl, CURLOPT_URL, url.c_str());
        curl_easy_setopt(_curl, CURLOPT_WRITEDATA, &_body);
        curl_easy_setopt(
            _curl, CURLOPT_WRITEFUNCTION, +[](char* data, std::size_t size, std::size_t count, void* body) {
                static_cast<std::string*>(body)->append(data, size * count);
                return size * count;
            });
    }
    ~PlainClient() { curl_easy_cleanup(_curl); }
    void request()
    {
        _body.clear();
        if (curl_easy_perform(_curl) != CURLE_OK) std::abort();
        simdjson::dom::element document;
        if (_parser.parse(_body).get(document) != simdjson::SUCCESS || !document.is_array()) std::abort();
    }

private:
    CURL* _curl;
    std::string _body;
    simdjson::dom::parser _parser;
};

} // namespace

std::vector<Row> search()
{
    Service service(kAnswerSize);
    const Daemon daemon(service.url("/bag"));
    const auto client = daemon.client();
    PlainClient plain(service.url("/search?key=walrus7351&locale=en_US&q=query%20number%201234567"));
    std::int64_t queryId = 0;

    const auto run = [](int count, auto&& one) {
        const double begin = now();
        for (int i = 0; i < count; ++i) one();
        return (now() - begin) / count;
    };
    const auto ours = [&] {
        auto request = TAVSearchRequest::searchRequestWithString("query number " + std::to_string(++queryId),
                                                                 StartSearchTrigger::NewCharacter);
        request->queryId = queryId;
        request->scale = 1;
        request->keyboardInputMode = "en";
        const auto answer = client->request(*request);
        if (!answer || !answer->reply || answer->reply->rawResponse->size() < kAnswerSize) std::abort();
    };
    std::vector<Row> rows;
    rows.push_back(compare(
        "search, 60 KB answer, beside libcurl and simdjson", 9, 2, [&] { return run(500, ours); },
        [&] { return run(500, [&] { plain.request(); }); }));
    service.setDelay(0.02);
    rows.push_back(compare(
        "the same with 20 ms of service delay", 5, 1.05, [&] { return run(50, ours); },
        [&] { return run(50, [&] { plain.request(); }); }));
    return rows;
}

} // namespace tavrin::bench
