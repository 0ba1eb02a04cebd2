// A search that no cache answers, beside the same request made with libcurl and parsed with simdjson, both with a warm
// connection; and beside that and a socket echo of as many bytes, because a client of the daemon is another process.

#include <cmath>
#include <cstdlib>

#include "bench/PlainClient.h"
#include "bench/Support.h"
#include "CoreTavrin/TAVReply.h"
#include "CoreTavrin/TAVRequest.h"

namespace tavrin::bench {

namespace {

constexpr std::size_t kAnswerSize = 60'000;

} // namespace

std::vector<Row> search()
{
    Service service(kAnswerSize);
    const Daemon daemon(service.url("/bag"));
    const auto client = daemon.client();
    PlainClient plain;
    const std::string url = service.url("/search?key=walrus7351&locale=en_US&q=query%20number%201234567");
    std::int64_t queryId = 0;

    const auto run = [](int count, auto&& one) {
        const double begin = now();
        for (int i = 0; i < count; ++i) one();
        return (now() - begin) / count;
    };
    const auto search = [&queryId](TAVClient& from) {
        auto request = TAVSearchRequest::searchRequestWithString("query number " + std::to_string(++queryId),
                                                                 StartSearchTrigger::NewCharacter);
        request->queryId = queryId;
        request->scale = 1;
        request->keyboardInputMode = "en";
        const auto answer = from.request(*request);
        if (!answer || !answer->reply || answer->reply->rawResponse->size() < kAnswerSize) std::abort();
    };
    const auto ours = [&] { search(*client); };
    Echo echo(daemon.sizesOf(search));
    std::vector<Row> rows;
    rows.push_back(compare(
        "search, 60 KB answer, beside libcurl and simdjson", 9, 1.8, [&] { return run(500, ours); },
        [&] { return run(500, [&] { plain.request(url); }); }));
    rows.push_back(compare(
        "the same beside these and a socket echo", 9, INFINITY, [&] { return run(500, ours); },
        [&] {
            return run(500, [&] {
                plain.request(url);
                echo.roundTrip();
            });
        }));
    service.setDelay(0.02);
    rows.push_back(compare(
        "the same with 20 ms of service delay", 5, 1.03, [&] { return run(50, ours); },
        [&] { return run(50, [&] { plain.request(url); }); }));
    return rows;
}

} // namespace tavrin::bench
