// Transfers that share a connection over HTTP/2.

#include <algorithm>
#include <atomic>
#include <future>
#include <random>
#include <sys/mman.h>

#include <gtest/gtest.h>

#include "tests/support/TestHttpServer.h"
#include "tests/support/UrlLoads.h"

namespace platform {
namespace {

using namespace std::chrono_literals;
using test::Load;
using test::TestHttpServer;

constexpr std::size_t kFrameHeader = 9;
enum FrameType : char { kData = 0, kHeaders = 1, kSettings = 4 };
constexpr char kEndOfStream = 1;
constexpr char kEndOfHeaders = 4;
constexpr char kAcknowledged = 1;

std::string frame(FrameType type, char flags, std::uint32_t stream, std::string_view payload = {})
{
    const auto size = static_cast<std::uint32_t>(payload.size());
    std::string frame{static_cast<char>(size >> 16), static_cast<char>(size >> 8), static_cast<char>(size), type,
                      flags};
    for (const int shift : {24, 16, 8, 0}) frame += static_cast<char>(stream >> shift);
    return frame.append(payload);
}

constexpr std::size_t kTransfers = 24, kSize = 20'000;

/// A server that waits for `transfers` requests, and then answers them all, with their frames mixed at random.
class MixedAnswers {
public:
    explicit MixedAnswers(unsigned seed, std::size_t transfers = kTransfers) : _random(seed), _transfers(transfers) {}

    TestHttpServer::Answer operator()(const TestHttpServer::Request& request)
    {
        constexpr std::string_view kPreface = "PRI * HTTP/2.0\r\n\r\nSM\r\n\r\n";
        std::string answer;
        _input += request.body;
        if (_input.starts_with(kPreface)) {
            _input.erase(0, kPreface.size());
            answer = frame(kSettings, 0, 0);
        }
        while (_input.size() >= kFrameHeader && _input.size() >= kFrameHeader + number(0, 3)) {
            if (_input[3] == kHeaders) _streams.push_back({number(5, 4), kSize});
            if (_input[3] == kSettings && _input[4] != kAcknowledged) answer += frame(kSettings, kAcknowledged, 0);
            _input.erase(0, kFrameHeader + number(0, 3));
        }
        if (_streams.size() == _transfers) answer += answers();
        return {answer};
    }

private:
    struct Stream {
        std::uint32_t number;
        std::size_t left;
    };

    [[nodiscard]] std::uint32_t number(std::size_t at, std::size_t bytes) const
    {
        std::uint32_t value = 0;
        for (std::size_t i = at; i < at + bytes; ++i) value = value << 8 | static_cast<unsigned char>(_input[i]);
        return value;
    }

    std::string answers()
    {
        constexpr std::string_view kStatus200 = "\x88"; // of HPACK's static table
        std::string all;
        for (const Stream& stream : _streams) all += frame(kHeaders, kEndOfHeaders, stream.number, kStatus200);
        while (!_streams.empty()) {
            const auto one = _streams.begin() + static_cast<std::ptrdiff_t>(_random() % _streams.size());
            const std::size_t size = std::min<std::size_t>(one->left, 1 + _random() % 16384);
            one->left -= size;
            all += frame(kData, one->left == 0 ? kEndOfStream : 0, one->number, std::string(size, 'x'));
            if (one->left == 0) _streams.erase(one);
        }
        return all;
    }

    std::minstd_rand _random;
    std::size_t _transfers;
    std::string _input;
    std::vector<Stream> _streams;
};

using Http2Test = test::UrlLoads;

// libcurl reads for all streams of a connection at once. If the buffer of one was full, the end of a stream was left
// unprocessed in one list of five.
TEST_F(Http2Test, EveryTransferOfAListEndsHoweverTheFramesAreMixed)
{
    for (unsigned seed = 0; seed < 40; ++seed) {
        TestHttpServer server(MixedAnswers(seed), {.certificate = certificate(), .anyProtocol = true});
        const auto session =
            loader->makeSession({.requestTimeout = 5s, .pipelining = true, .caFile = certificate().certificate}, queue);
        std::vector<std::unique_ptr<Load>> loads;
        for (std::size_t i = 0; i < kTransfers; ++i) {
            TransferFiles files;
            files.download = FileHandle(memfd_create("download", MFD_CLOEXEC));
            loads.push_back(std::make_unique<Load>(*session, UrlRequest{.url = server.url()}, queue, std::move(files)));
        }
        for (const auto& load : loads) load->task->resume();
        for (const auto& load : loads) {
            const test::Outcome outcome = load->wait();
            EXPECT_EQ(outcome.code(), 0) << "seed " << seed << ": " << outcome.why();
            EXPECT_EQ(outcome.status(), 200);
        }
        EXPECT_EQ(server.connections(), 1);
    }
}

// libcurl would send the last load on the connection of the download, and take the one's response for the other's.
TEST_F(Http2Test, ALoadDoesNotShareABusyHttp1Connection)
{
    std::atomic<int> http1Requests = 0;
    std::promise<void> underWay;
    TestHttpServer server(
        [&, http2 = MixedAnswers(0, 1)](const TestHttpServer::Request& request) mutable -> TestHttpServer::Answer {
            if (!request.body.starts_with("GET ")) return http2(request);
            if (++http1Requests == 1) underWay.set_value();
            return {};
        },
        {.certificate = certificate(), .anyProtocol = true});
    const UrlSessionConfiguration configuration{.requestTimeout = 5s, .caFile = certificate().certificate};
    TransferFiles files;
    files.download = FileHandle(memfd_create("download", MFD_CLOEXEC));
    const auto download =
        make({.url = server.url(), .maximumResponseSize = 20u << 20}, configuration, std::move(files));
    download->task->resume();
    underWay.get_future().wait();

    for (int i = 0; i < 2; ++i) {
        const test::Outcome outcome = load(server.url(), configuration);
        EXPECT_EQ(outcome.body().size(), kSize) << outcome.why();
    }
    EXPECT_EQ(http1Requests, 1);
    EXPECT_EQ(server.connections(), 2);
    download->task->cancel();
    EXPECT_EQ(download->wait().code(), kUrlCancelled);
}

} // namespace
} // namespace platform
