// The images that an answer names, fetched over HTTP/2 and handed to the client, beside a program that fetches the same
// list with libcurl; both on a warm connection. nghttpx speaks HTTP/2 in front of the development service.

#include <arpa/inet.h>
#include <cstdlib>
#include <filesystem>
#include <sys/socket.h>
#include <unistd.h>

#include <curl/curl.h>
#include <fmt/format.h>

#include "bench/Support.h"
#include "CoreTavrin/TAVReply.h"
#include "CoreTavrin/TAVRequest.h"
#include "CoreTavrin/TAVSessionConfiguration.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Json.h"

namespace tavrin::bench {

namespace {

constexpr int kImages = 24;
constexpr std::size_t kSize = 20'000;

sockaddr_in loopback(std::uint16_t port)
{
    sockaddr_in address{};
    address.sin_family = AF_INET;
    address.sin_port = htons(port);
    address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    return address;
}

/// A port that was free a moment ago.
std::uint16_t freePort()
{
    const platform::FileHandle socket(::socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0));
    sockaddr_in address = loopback(0);
    socklen_t length = sizeof(address);
    require(bind(socket.fd(), reinterpret_cast<sockaddr*>(&address), length) == 0 &&
                getsockname(socket.fd(), reinterpret_cast<sockaddr*>(&address), &length) == 0,
            "a loopback socket");
    return ntohs(address.sin_port);
}

void waitForListener(std::uint16_t port)
{
    for (int attempt = 0; attempt < 500; ++attempt, pass(0.02)) {
        const platform::FileHandle socket(::socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0));
        const sockaddr_in address = loopback(port);
        if (connect(socket.fd(), reinterpret_cast<const sockaddr*>(&address), sizeof(address)) == 0) return;
    }
    require(false, "nghttpx doesn't listen");
}

/// Fetches lists of URLs side by side, over one connection.
class PlainClient {
public:
    explicit PlainClient(const std::string& caFile) : _multi(curl_multi_init()), _bodies(kImages)
    {
        for (std::string& body : _bodies) {
            CURL* easy = _easies.emplace_back(curl_easy_init());
            curl_easy_setopt(easy, CURLOPT_CAINFO, caFile.c_str());
            curl_easy_setopt(easy, CURLOPT_HTTP_VERSION, static_cast<long>(CURL_HTTP_VERSION_2TLS));
            curl_easy_setopt(easy, CURLOPT_PIPEWAIT, 1L);
            curl_easy_setopt(easy, CURLOPT_BUFFERSIZE, static_cast<long>(CURL_MAX_READ_SIZE)); // as the daemon does
            curl_easy_setopt(easy, CURLOPT_WRITEDATA, &body);
            curl_easy_setopt(
                easy, CURLOPT_WRITEFUNCTION, +[](char* data, std::size_t size, std::size_t count, void* body_) {
                    static_cast<std::string*>(body_)->append(data, size * count);
                    return size * count;
                });
        }
    }
    ~PlainClient()
    {
        for (CURL* easy : _easies) curl_easy_cleanup(easy);
        curl_multi_cleanup(_multi);
    }
    void fetch(const std::vector<std::string>& urls)
    {
        for (std::size_t i = 0; i < urls.size(); ++i) {
            _bodies[i].clear();
            curl_easy_setopt(_easies[i], CURLOPT_URL, urls[i].c_str());
            curl_multi_add_handle(_multi, _easies[i]);
        }
        for (int running = 1; running > 0;) {
            if (curl_multi_perform(_multi, &running) != CURLM_OK) std::abort();
            if (running > 0) curl_multi_poll(_multi, nullptr, 0, 2, nullptr); // libcurl 7.88 can lose a wake-up
        }
        for (std::size_t i = 0; i < urls.size(); ++i) {
            long version = 0;
            curl_easy_getinfo(_easies[i], CURLINFO_HTTP_VERSION, &version);
            require(_bodies[i].size() == kSize && version == CURL_HTTP_VERSION_2_0, "an image over HTTP/2");
            curl_multi_remove_handle(_multi, _easies[i]);
        }
    }

private:
    CURLM* _multi;
    std::vector<std::string> _bodies;
    std::vector<CURL*> _easies;
};

} // namespace

std::vector<Row> images()
{
    const auto certificates = std::filesystem::temp_directory_path() / "tavrin-bench-certificate";
    Process service(
        {DEVSERVER, "--http-port", "0", "--https-port", "0", "--cert-dir", certificates.string(), "--quiet"}, {});
    const auto ready = platform::parseJson(service.firstLine()).value();
    const std::string http = *ready["http"].asString();
    const std::uint16_t port = freePort();
    const Process proxy({NGHTTPX, "--conf=/dev/null", "--workers=1",
                         // Of either client, or one would keep those that the service serves at a time from the other.
                         "--backend-connections-per-frontend=16", fmt::format("--frontend=127.0.0.1,{}", port),
                         fmt::format("--backend=127.0.0.1,{}", http.substr(http.rfind(':') + 1)),
                         "--errorlog-file=/dev/null", "--accesslog-file=/dev/null", (certificates / "key.pem").string(),
                         (certificates / "cert.pem").string()},
                        {});
    waitForListener(port);

    // Never the same image twice: no cache is to have it.
    int number = 0;
    const auto urls = [&] {
        std::vector<std::string> list;
        for (int i = 0; i < kImages; ++i)
            list.push_back(fmt::format("https://127.0.0.1:{}/images/bench.{}?size={}", port, ++number, kSize));
        return list;
    };

    Service searches(1000);
    const Daemon daemon(searches.url("/bag"), {"SSL_CERT_FILE=" + *ready["ca"].asString()});
    const auto client = daemon.client();
    const auto endpoint =
        std::move(*TAVEndpointClient::connect(client->configure({"com.quorvane.bench", "bench/1"}).value()));
    PlainClient plain(*ready["ca"].asString());

    /// From the search's answer at the client to the bytes of every image there.
    std::int64_t queryId = 0;
    const auto ours = [&] {
        platform::Value::Array described;
        for (const std::string& url : urls()) described.push_back(platform::Dictionary{{"url", url}});
        searches.setAnswer(
            platform::toJson(platform::Value::Array{platform::Dictionary{{"status", "OK"}, {"posters", described}}}));
        auto request = TAVSearchRequest::searchRequestWithString("pictures", StartSearchTrigger::NewCharacter);
        request->queryId = ++queryId;
        request->scale = 1;
        request->keyboardInputMode = "en";
        const auto answer = client->request(*request);
        require(answer && answer->reply && answer->reply->rawResponse, "a search");
        const double begin = now();
        const auto loaded = endpoint->loadImages(described, std::chrono::seconds(30));
        const double end = now();
        require(loaded && loaded->size() == kImages && loaded->begin()->second.size() == kSize,
                loaded ? fmt::format("{} images of {} in {}", loaded->size(), kImages, seconds(end - begin))
                       : "images: " + loaded.error().description());
        return end - begin;
    };
    const auto beside = [&] {
        const auto list = urls();
        const double begin = now();
        plain.fetch(list);
        return now() - begin;
    };
    const auto mean = [](auto one) {
        constexpr int kTimes = 20;
        double sum = 0;
        for (int i = 0; i < kTimes; ++i) sum += one();
        return sum / kTimes;
    };
    (void)ours();
    (void)beside();
    return {compare(
        "24 images of 20 KB after a search, HTTP/2, beside a libcurl multi program", 9, 1.2, [&] { return mean(ours); },
        [&] { return mean(beside); })};
}

} // namespace tavrin::bench
