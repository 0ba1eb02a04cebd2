// The HTTP cache: what a hit costs until all bytes of the body are in a buffer of the asker's.

#include "platform/net/HttpCache.h"

#include <array>
#include <cstdlib>
#include <cstring>
#include <fcntl.h>
#include <string>
#include <sys/stat.h>
#include <unistd.h>

#include <fmt/format.h>

#include "bench/Support.h"
#include "platform/files/Files.h"
#include "platform/run/Clock.h"
#include "platform/run/Queue.h"
#include "platform/run/RunLoop.h"
#include "platform/run/SystemClock.h"
#include "platform/run/WorkerPool.h"

namespace tavrin::bench {

namespace {

constexpr std::size_t kBodySize = 20'000;
constexpr int kImages = 40; // as many of this size as memory holds
constexpr int kHits = 5'000;
constexpr int kRounds = 9;

platform::Url url(int number)
{
    return platform::Url::parse(fmt::format("https://images.example/thumbnails/{}.png?scale=2", number)).value();
}

platform::UrlResponse response(int number)
{
    return {.url = url(number),
            .statusCode = 200,
            .headers = {{"Content-Type", "image/png"},
                        {"Content-Length", fmt::to_string(kBodySize)},
                        {"Date", "Thu, 01 Jan 2026 00:00:00 GMT"},
                        {"Cache-Control", "max-age=86400"},
                        {"ETag", "\"0123456789abcdef\""},
                        {"Server", "bench"}}};
}

/// Bytes that a copy can't guess.
std::string body(int number)
{
    std::string bytes(kBodySize, '\0');
    for (std::size_t i = 0; i < bytes.size(); ++i)
        bytes[i] = static_cast<char>(i * 31 + static_cast<std::size_t>(number));
    return bytes;
}

/// Seconds for each of many calls of `copy`, which puts the body of that number into the buffer.
template <class Copy> double each(Copy copy)
{
    std::array<char, kBodySize> buffer{};
    std::size_t sum = 0;
    const double begin = now();
    for (int i = 0; i < kHits; ++i) {
        copy(i % kImages, buffer.data());
        sum += static_cast<unsigned char>(buffer[static_cast<std::size_t>(i)]);
    }
    const double end = now();
    if (sum == 0) std::abort();
    return (end - begin) / kHits;
}

} // namespace

std::vector<Row> httpCache()
{
    const OneCore pinned;
    const Directory directory;
    platform::RunLoop loop;
    const auto clock = platform::makeSystemClock(loop);
    platform::WorkerPool pool;
    const auto system = platform::makeSystemFiles();
    const auto queue = platform::Queue::make("bench.httpCache", platform::Queue::Kind::Serial, pool, *clock);
    const auto open = [&](std::size_t memory) {
        return platform::HttpCache::make({.memoryCapacity = memory,
                                          .directory = directory / "http",
                                          .files = system.get(),
                                          .queue = queue,
                                          .clock = clock.get()});
    };
    std::vector<std::string> bodies, files;
    {
        const auto filled = open(0);
        for (int i = 0; i < kImages; ++i) {
            bodies.push_back(body(i));
            filled->store(url(i), response(i), platform::Bytes(bodies.back()));
            files.push_back(directory / fmt::format("{}.png", i));
            const platform::FileHandle file(::open(files.back().c_str(), O_WRONLY | O_CREAT, 0600));
            require(write(file.fd(), bodies.back().data(), kBodySize) == kBodySize, "writing a file");
        }
        queue->sync([] {});
    }
    std::vector<platform::Url> urls;
    for (int i = 0; i < kImages; ++i) urls.push_back(url(i));
    const auto hits = [&](platform::HttpCache& cache) {
        return each([&](int number, char* buffer) {
            const auto found = cache.find(urls[static_cast<std::size_t>(number)]);
            require(found && found->body.size() == kBodySize, "a hit");
            std::memcpy(buffer, found->body.data(), kBodySize);
        });
    };

    std::vector<Row> rows;
    {
        const auto disk = open(0);
        rows.push_back(compare(
            "hit in the HTTP cache on disk, 20 KB, beside reading the same file", kRounds, 3,
            [&] { return hits(*disk); },
            [&] {
                return each([&](int number, char* buffer) {
                    const platform::FileHandle file(
                        ::open(files[static_cast<std::size_t>(number)].c_str(), O_RDONLY | O_CLOEXEC));
                    struct stat status{};
                    require(fstat(file.fd(), &status) == 0 && read(file.fd(), buffer, kBodySize) == kBodySize,
                            "reading");
                });
            }));
    }
    const auto memory = open(1u << 20);
    for (int i = 0; i < kImages; ++i)
        memory->store(urls[static_cast<std::size_t>(i)], response(i),
                      platform::Bytes(bodies[static_cast<std::size_t>(i)]));
    queue->sync([] {});
    rows.push_back(compare(
        "hit in memory, 20 KB, beside copying the same bytes", kRounds, 5, [&] { return hits(*memory); },
        [&] {
            return each([&](int number, char* buffer) {
                std::memcpy(buffer, bodies[static_cast<std::size_t>(number)].data(), kBodySize);
            });
        }));
    return rows;
}

} // namespace tavrin::bench
