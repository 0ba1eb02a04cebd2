#include "platform/net/HttpCache.h"

#include <fcntl.h>
#include <fstream>
#include <unistd.h>

#include <fmt/format.h>
#include <gtest/gtest.h>

#include "platform/files/Files.h"
#include "platform/run/Queue.h"
#include "tests/support/ByHand.h"
#include "tests/support/FullDisk.h"
#include "tests/support/LogCapture.h"
#include "tests/support/TemporaryDirectory.h"

namespace platform {
namespace {

namespace fs = std::filesystem;
using namespace std::chrono_literals;

Url url(int number)
{
    return *Url::parse(fmt::format("https://example.com/{}", number));
}

/// A cache in a directory, whose queue runs when the test says so, or when it is waited for.
struct HttpCacheTest : testing::Test, test::ByHand {
    const std::unique_ptr<FileSystem> files = makeSystemFiles();
    ~HttpCacheTest() override
    {
        cache.reset();
        drain(); // what waits keeps the cache
    }
    void open(std::size_t memory = 0, std::uint64_t disk = 1u << 20)
    {
        cache.reset();
        cache = HttpCache::make({.memoryCapacity = memory,
                                 .diskCapacity = disk,
                                 .minimumMappedSize = 16384,
                                 .directory = directory / "http",
                                 .files = files.get(),
                                 .queue = queue,
                                 .clock = &clock});
    }
    void store(int number, std::string body, HttpHeaders headers = {{"Content-Type", "image/png"}})
    {
        cache->store(url(number), {.url = url(number), .statusCode = 200, .headers = std::move(headers)},
                     Bytes(std::move(body)));
    }
    [[nodiscard]] std::string find(int number) const
    {
        const auto found = cache->find(url(number));
        return found ? std::string(found->body.view()) : "(none)";
    }
    /// The files of bodies; or all but the lock.
    [[nodiscard]] std::vector<fs::path> cacheFiles(bool bodiesOnly) const
    {
        std::vector<fs::path> found;
        for (const auto& entry : fs::directory_iterator(directory / "http"))
            if (bodiesOnly ? entry.path().extension() == ".body" : entry.path().filename() != "lock")
                found.push_back(entry.path());
        return found;
    }
    [[nodiscard]] std::size_t bodyFiles() const { return cacheFiles(true).size(); }
    /// Looks up a response, appends the first three letters of its body, or "-", to `seen`, then calls `next`.
    void lookUp(int number, const std::function<void()>& next = [] {})
    {
        cache->lookUp(url(number), [this, next](auto found) {
            seen += found ? found->body.view().substr(0, 3) : "-";
            next();
        });
    }

    test::TemporaryDirectory directory;
    std::shared_ptr<Queue> queue = makeQueue("test.httpCache");
    test::LogCapture log;
    std::shared_ptr<HttpCache> cache;
    std::string seen;
};

const std::string kSmall(1000, 's');
const std::string kLarge(20'000, 'l');

TEST_F(HttpCacheTest, AnswersAreFoundWholeAtOnceAndAfterARestart)
{
    open();
    EXPECT_FALSE(fs::exists(directory / "http")) << "nothing is opened before there is need";
    const HttpHeaders headers{{"ETag", "\"a:b\""}, {"X", ""}, {"x", " two "}};
    store(1, kSmall, headers);
    store(2, kLarge, headers);
    store(3, "", headers);
    store(4, std::string("a\0\xff\n", 4), headers);
    for (const char* when : {"before it is written", "afterwards"}) {
        EXPECT_EQ(find(1), kSmall) << when;
        EXPECT_EQ(find(2), kLarge) << when;
        EXPECT_EQ(find(3), "") << when;
        EXPECT_EQ(find(4), std::string("a\0\xff\n", 4)) << when;
        EXPECT_EQ(find(5), "(none)") << when;
    }
    EXPECT_EQ(bodyFiles(), 1u) << "small ones are in the index";
    open();
    const auto found = cache->find(*Url::parse(url(2).string() + "#part"));
    ASSERT_TRUE(found);
    EXPECT_EQ(found->body.view(), kLarge);
    EXPECT_EQ(found->response.statusCode, 200);
    EXPECT_EQ(found->response.url, url(2));
    EXPECT_EQ(found->response.headers, headers);
    EXPECT_EQ(find(1), kSmall);
    for (const std::optional<bool> publicPeer : {std::optional<bool>(), {true}, {false}}) {
        cache->store(url(9), {.url = url(9), .statusCode = 200, .publicPeer = publicPeer}, Bytes(kSmall));
        open();
        EXPECT_EQ(cache->find(url(9)).value().response.publicPeer, publicPeer);
    }

    store(2, "replaced");
    EXPECT_EQ(find(2), "replaced");
    EXPECT_EQ(bodyFiles(), 0u);
    EXPECT_EQ(found->body.view(), kLarge) << "who holds the old one keeps it";
    cache->remove(url(1));
    EXPECT_EQ(find(1), "(none)");
    open();
    EXPECT_EQ(find(1), "(none)");
    EXPECT_EQ(find(2), "replaced");

    EXPECT_EQ(test::modeOf(directory / "http"), 0700u);
    EXPECT_EQ(test::modeOf(directory / "http/index.db"), 0600u);
}

TEST_F(HttpCacheTest, MemoryAnswersWithoutTheDiskAndGivesUpWhatWasUsedLeast)
{
    cache = HttpCache::make({.memoryCapacity = 100'000});
    for (int i = 0; i < 12; ++i) {
        store(i, std::string(8000, static_cast<char>('a' + i)));
        (void)find(0);
    }
    EXPECT_EQ(find(0), std::string(8000, 'a')) << "used all the time";
    EXPECT_EQ(find(1), "(none)");
    EXPECT_EQ(find(11), std::string(8000, 'l'));
    store(11, std::string(20'000, 'x'));
    EXPECT_EQ(find(11), "(none)") << "more than a tenth; and the one before is outdated";
    store(3, "short");
    EXPECT_EQ(find(3), "short");
}

TEST_F(HttpCacheTest, TheDiskGivesUpWhatWasUsedLeastAlsoAfterARestart)
{
    constexpr std::uint64_t kCapacity = 250'000; // for 11 of them
    open(0, kCapacity);
    for (int i = 0; i < 10; ++i) store(i, kLarge);
    EXPECT_EQ(find(0), kLarge);
    open(0, kCapacity);
    for (int i = 10; i < 14; ++i) store(i, kLarge);
    EXPECT_EQ(find(0), kLarge) << "used before the restart";
    EXPECT_EQ(find(1), "(none)");
    EXPECT_EQ(find(13), kLarge);
    EXPECT_LE(bodyFiles() * kLarge.size(), kCapacity);
    EXPECT_GE(bodyFiles(), 10u) << "no more than had to";
    store(13, std::string(26'000, 'x'));
    EXPECT_EQ(find(13), "(none)") << "more than a tenth; and the one before is outdated";
}

TEST_F(HttpCacheTest, UsesInMemoryCountOnDisk)
{
    open(1u << 20, 250'000);
    for (int i = 0; i < 40; ++i) {
        store(i, kLarge);
        EXPECT_EQ(find(0), kLarge);
        drain();
    }
    open(0, 250'000);
    EXPECT_EQ(find(0), kLarge);
    EXPECT_EQ(find(20), "(none)");
}

TEST_F(HttpCacheTest, LookUpsQueueBehindWhatIsBeingWrittenAndAskTheDiskOnlyWhereTheyMust)
{
    open();
    lookUp(1);
    EXPECT_EQ(seen, "") << "nobody knows yet what is on the disk";
    drain();
    EXPECT_EQ(seen, "-");
    lookUp(1);
    EXPECT_EQ(seen, "--") << "it is known to be nowhere";
    store(1, "one");
    lookUp(1);
    store(1, "two");
    lookUp(1);
    cache->remove(url(1));
    lookUp(1);
    EXPECT_EQ(seen, "--");
    drain();
    EXPECT_EQ(seen, "--onetwo-");

    open(1u << 20);
    store(1, "memory");
    lookUp(1);
    EXPECT_EQ(seen, "--onetwo-mem") << "at once";
}

TEST_F(HttpCacheTest, WhatWasStoredIsThereWhereverItWaits)
{
    open();
    store(1, "old");
    open();
    // The second look-up is made by the first, while all that was stored still waits behind it.
    lookUp(3, [&] {
        for (const int number : {1, 2, 3, 4}) lookUp(number);
    });
    store(1, "new");
    store(2, "two");
    cache->remove(url(2));
    store(2, "too");
    store(3, "thr");
    drain();
    EXPECT_EQ(seen, "--newtoothr");
}

TEST_F(HttpCacheTest, ASlowDiskDoesNotFillTheMemory)
{
    open(0, 1u << 30);
    store(0, "before");
    EXPECT_EQ(find(0), "before");
    const std::string megabytes(16u << 20, 'x');
    for (const int number : {1, 2, 3, 4, 0}) store(number, megabytes);
    for (const int number : {1, 2, 3}) EXPECT_EQ(find(number).size(), megabytes.size());
    EXPECT_EQ(find(4), "(none)");
    EXPECT_EQ(find(0), "(none)") << "the one before is outdated";
    store(4, megabytes);
    EXPECT_EQ(find(4).size(), megabytes.size()) << "the disk has caught up";

    open(0, 10 * kLarge.size());
    store(5, kLarge);
    store(6, kLarge + "l");
    EXPECT_EQ(find(5), kLarge) << "a tenth of the disk is the most";
    EXPECT_EQ(find(6), "(none)");
}

TEST_F(HttpCacheTest, NothingOutdatedComesFromTheDiskIntoMemory)
{
    open();
    store(1, "old");
    open(1u << 20);
    lookUp(1);
    store(1, "new");
    cache->remove(url(1));
    drain();
    EXPECT_EQ(seen, "old");
    EXPECT_EQ(find(1), "(none)");
}

TEST_F(HttpCacheTest, ASecondProcessRunsWithoutTheDisk)
{
    open();
    store(1, kLarge);
    drain();
    const auto first = std::exchange(cache, nullptr);
    open(1u << 20);
    EXPECT_EQ(find(1), "(none)");
    store(2, "in memory");
    drain();
    EXPECT_EQ(find(2), "in memory");
    EXPECT_TRUE(first->find(url(1)));
    EXPECT_EQ(log.count("can't be used"), 1);
}

TEST_F(HttpCacheTest, DamageIsDroppedAndNeverAnswered)
{
    using Spoil = void (*)(const fs::path&);
    const std::pair<const char*, Spoil> cases[]{
        {"cut off", [](const fs::path& path) { fs::resize_file(path, 100); }},
        {"empty", [](const fs::path& path) { fs::resize_file(path, 0); }},
        {"gone", [](const fs::path& path) { fs::remove(path); }},
        {"overwritten",
         [](const fs::path& path) {
             const FileHandle file(::open(path.c_str(), O_WRONLY));
             for (off_t at = 64; at < static_cast<off_t>(fs::file_size(path)); at += 128)
                 EXPECT_EQ(pwrite(file.fd(), "!?", 2, at), 2);
         }},
        {"directories",
         [](const fs::path& path) {
             fs::remove(path);
             fs::create_directory(path);
         }},
        {"links",
         [](const fs::path& path) {
             fs::remove(path);
             fs::create_symlink("/dev/zero", path);
         }},
    };
    for (const auto& [what, spoil] : cases) {
        for (const bool running : {true, false}) {
            SCOPED_TRACE(fmt::format("{}, {}", what, running ? "running" : "restarted"));
            open();
            store(1, kSmall);
            store(2, kLarge);
            EXPECT_EQ(find(2), kLarge);
            if (!running) cache.reset();
            for (const fs::path& file : cacheFiles(false)) spoil(file);
            if (!running) open();
            for (const int number : {1, 2}) {
                const std::string found = find(number);
                EXPECT_TRUE(found == "(none)" || found == (number == 1 ? kSmall : kLarge));
            }
            EXPECT_NE(find(2), kLarge) << "its file is spoilt, whatever the index says";
            store(3, "goes on");
            drain();
            cache.reset();
            fs::remove_all(directory / "http");
        }
    }
}

TEST_F(HttpCacheTest, SoManyMappingsAreKeptOnly)
{
    open(0, 100u << 20);
    for (int round = 0; round < 2; ++round) {
        for (int i = 0; i < 100; ++i) {
            if (round == 0) store(i, kLarge + std::to_string(i));
            EXPECT_EQ(find(i), kLarge + std::to_string(i));
        }
    }
    const auto mapped = [] {
        std::ifstream maps("/proc/self/maps");
        int count = 0;
        for (std::string line; std::getline(maps, line);) count += line.ends_with(".body") ? 1 : 0;
        return count;
    };
    EXPECT_EQ(mapped(), 64);
    for (int i = 0; i < 5; ++i) {
        store(i, std::string(5u << 20, 'x'));
        (void)find(i);
    }
    EXPECT_EQ(mapped(), 3) << "more would be too large";
    cache.reset();
    drain();
    EXPECT_EQ(mapped(), 0);
}

TEST_F(HttpCacheTest, OneDamagedBodyCostsNoOther)
{
    open();
    store(1, kLarge);
    drain();
    const fs::path spoilt = cacheFiles(true).at(0);
    store(2, kLarge);
    drain();
    {
        const FileHandle file(::open(spoilt.c_str(), O_WRONLY));
        ASSERT_EQ(pwrite(file.fd(), "x", 1, 12'345), 1);
    }
    EXPECT_EQ(find(1), "(none)");
    EXPECT_FALSE(fs::exists(spoilt));
    EXPECT_EQ(find(2), kLarge);
    EXPECT_EQ(log.count("damaged"), 1);

    test::writeFile(directory / "http/99.body", "of nobody");
    test::writeFile(directory / "http/7.body.1a2b3c4d.tmp", "half-writ");
    open();
    EXPECT_EQ(find(2), kLarge);
    EXPECT_FALSE(fs::exists(directory / "http/99.body"));
    EXPECT_FALSE(fs::exists(directory / "http/7.body.1a2b3c4d.tmp"));
}

TEST_F(HttpCacheTest, ADirectoryThatWasTakenAwayIsMadeAnew)
{
    open();
    store(1, kLarge);
    drain();
    fs::remove_all(directory / "http");
    EXPECT_EQ(find(1), "(none)");
    store(2, kLarge);
    EXPECT_EQ(find(2), kLarge);
    EXPECT_EQ(bodyFiles(), 1u);
    open();
    EXPECT_EQ(find(2), kLarge);

    // Something else in its place; and a minute after that has gone it is in use again.
    cache.reset();
    fs::remove_all(directory / "http");
    test::writeFile(directory / "http", "a file");
    open();
    store(3, kLarge);
    EXPECT_EQ(find(3), "(none)");
    fs::remove(directory / "http");
    store(3, kLarge);
    EXPECT_EQ(find(3), "(none)") << "not tried again at once";
    clock.advance(61s, [] {});
    store(3, kLarge);
    EXPECT_EQ(find(3), kLarge);
}

TEST_F(HttpCacheTest, AFullDiskKeepsWhatIsThere)
{
    open();
    store(1, kLarge);
    store(2, kSmall);
    drain();
    test::onFullDisk(10'000, [&] {
        store(1, std::string(30'000, 'n'));
        store(3, kLarge);
        drain();
    });
    EXPECT_NE(find(1), kLarge) << "an answer that was replaced is no longer true";
    EXPECT_EQ(find(3), "(none)");
    EXPECT_EQ(find(2), kSmall);
    store(3, kLarge);
    EXPECT_EQ(find(3), kLarge);
    EXPECT_GT(log.count("can't be used"), 0);
}

/// Makes root somebody to whom directories may be read-only.
struct AsNobody {
    explicit AsNobody(const fs::path& directory)
    {
        if (geteuid() != 0) return;
        constexpr uid_t kNobody = 65534;
        if (chown(directory.c_str(), kNobody, static_cast<gid_t>(-1)) != 0 || seteuid(kNobody) != 0) std::abort();
    }
    ~AsNobody()
    {
        if (seteuid(getuid()) != 0) std::abort();
    }
};

TEST_F(HttpCacheTest, AReadOnlyDirectoryIsReadAndNothingElse)
{
    const AsNobody nobody(directory.path);
    open();
    store(1, kLarge);
    store(2, kLarge);
    drain();
    fs::permissions(directory / "http", fs::perms::owner_read | fs::perms::owner_exec);
    EXPECT_EQ(find(1), kLarge);
    store(2, std::string(30'000, 'n'));
    store(3, kLarge);
    EXPECT_NE(find(2), kLarge) << "an answer that was replaced is no longer true";
    EXPECT_EQ(find(3), "(none)");
    EXPECT_EQ(find(1), kLarge);
    EXPECT_EQ(log.count("can't be used"), 1);
    fs::permissions(directory / "http", fs::perms::owner_all);
    cache.reset();
}

} // namespace
} // namespace platform
