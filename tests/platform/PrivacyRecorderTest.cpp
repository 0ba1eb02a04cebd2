#include "platform/privacy/PrivacyRecorder.h"

#include <algorithm>
#include <cerrno>
#include <cmath>
#include <random>

#include <gtest/gtest.h>

#include "platform/values/Json.h"
#include "platform/values/Value.h"
#include "tests/support/ByHand.h"
#include "tests/support/MemoryFiles.h"

namespace platform {
namespace {

using namespace std::chrono_literals;
namespace fs = std::filesystem;
using Texts = std::set<std::string>;

const Date kNow = dateFromSecondsSince1970(1767225600);

TEST(PrivacyLedger, ReadsBackWhatItWroteAndNothingElse)
{
    PrivacyLedger ledger;
    ledger.secret.fill(0xa5);
    ledger.debits = {{0, 1}, {3600, 3}, {3600, 8}};
    ledger.time = {3601s, {kNow, 7, "boot"}};
    const std::string text = ledger.text();
    const auto read = PrivacyLedger::parse(text);
    ASSERT_TRUE(read) << text;
    EXPECT_EQ(read->secret, ledger.secret);
    EXPECT_EQ(read->debits, ledger.debits);
    EXPECT_EQ(read->time, ledger.time);

    for (std::size_t i = 0; i < text.size(); ++i) {
        std::string damaged = text;
        damaged[i] ^= 1;
        EXPECT_FALSE(PrivacyLedger::parse(damaged)) << i;
        EXPECT_FALSE(PrivacyLedger::parse(text.substr(0, i))) << i;
    }
    EXPECT_FALSE(PrivacyLedger::parse(text + text));
    // With a right digest, but not of our making.
    using Debits = std::vector<PrivacyLedger::Debit>;
    for (const Debits& debits : {Debits{{2, 1}, {1, 1}}, Debits{{1, 0}}, Debits{{1, -8}}, Debits{{1, 9}},
                                 Debits{{-1, 1}}, Debits{{3602, 1}}, Debits{{INT64_MAX, 1}}, Debits{{INT64_MIN, 1}}}) {
        ledger.debits = debits;
        EXPECT_FALSE(PrivacyLedger::parse(ledger.text())) << ledger.text();
    }
}

TEST(PrivacyLedger, NoDayHasMoreThanTheBudget)
{
    for (unsigned seed = 0; seed < 200; ++seed) {
        std::mt19937 random(seed);
        PrivacyLedger ledger;
        std::vector<PrivacyLedger::Debit> all;
        Duration lived{};
        for (int step = 0; step < 100; ++step) {
            lived += 1h * std::uniform_int_distribution(0, 9)(random);
            const int wanted = std::min(std::uniform_int_distribution(0, 8)(random), ledger.left(lived));
            if (wanted == 0) continue;
            ledger.debit(wanted, lived);
            ledger.time = {lived, {kNow}};
            all.push_back(ledger.debits.back());
            int inADay = 0;
            for (const auto& debit : all) inADay += debit.at > all.back().at - 86400 ? debit.reports : 0;
            ASSERT_LE(inADay, 8) << "seed " << seed << " step " << step;
            ASSERT_LE(ledger.debits.size(), 8u);
            ledger = PrivacyLedger::parse(ledger.text()).value();
        }
    }
}

struct PrivacyRecorderTest : testing::Test, test::ByHand {
    Result<std::size_t> record(const Texts& texts, std::string_view key = "key.app")
    {
        return PrivacyRecorder(files, clock, directory, random).record(key, texts);
    }
    /// Texts by number.
    static Texts some(int count)
    {
        Texts texts;
        for (int i = 0; i < count; ++i) texts.insert("link.example/" + std::to_string(i));
        return texts;
    }
    std::string contents(const char* name)
    {
        return files.files.contains(directory / name) ? files.files[directory / name] : "";
    }
    void fail(std::string_view operation, std::string_view name, int error)
    {
        files.fault = [=](std::string_view asked, const fs::path& path) {
            return asked == operation && path.filename() == name ? error : 0;
        };
    }
    std::size_t reports() { return parseJson(contents("reports.json")).value_or(Value()).count(); }
    int left()
    {
        const PrivacyLedger ledger = PrivacyLedger::parse(contents("ledger")).value();
        return ledger.left(LivedTime(clock, ledger.time).now());
    }

    test::MemoryFiles files;
    std::mt19937_64 engine{7};
    RandomBytes random = [this](std::span<std::uint8_t> bytes) {
        std::ranges::generate(bytes, [this] { return static_cast<std::uint8_t>(engine()); });
        return true;
    };
    const fs::path directory = "/state/privacy";
};

TEST_F(PrivacyRecorderTest, TheBudgetIsOneForAllKeysAndComesBackADayLater)
{
    EXPECT_TRUE(record({}));
    EXPECT_TRUE(files.files.empty()) << "nothing costs nothing";
    EXPECT_TRUE(record(some(3)));
    advance(23h);
    EXPECT_TRUE(record(some(2), "key.other"));
    EXPECT_EQ(reports(), 5u);
    EXPECT_EQ(record(some(100)), 3u) << "of a hundred";
    EXPECT_EQ(reports(), 8u);

    const std::string before = contents("reports.json");
    for (const char* key : {"key.app", "key.third"}) {
        const auto refused = record(some(1), key);
        ASSERT_FALSE(refused);
        EXPECT_EQ(refused.error().domain, kPrivacyErrorDomain);
        EXPECT_EQ(refused.error().code, kPrivacyBudgetExhausted);
    }
    EXPECT_EQ(contents("reports.json"), before);
    advance(1h - 1s);
    EXPECT_FALSE(record(some(1)));
    advance(1s);
    EXPECT_EQ(left(), 3);
    EXPECT_TRUE(record(some(9)));
    EXPECT_EQ(reports(), 11u);
}

TEST_F(PrivacyRecorderTest, AClockThatIsSetBringsNothingAndCostsNothing)
{
    for (const Duration ahead : {1h, 24h * 90, 24h * 365 * 20, -24h, -480'000h}) {
        SCOPED_TRACE(toSeconds(ahead));
        files.files.clear();
        clock.setWall(kNow + ahead);
        EXPECT_TRUE(record(some(8)));
        clock.setWall(kNow);
        EXPECT_FALSE(record(some(1)));
        advance(24h);
        EXPECT_EQ(record(some(9)), 8u);
    }
}

TEST_F(PrivacyRecorderTest, PaysBeforeItWrites)
{
    ASSERT_TRUE(record(some(1)));
    fail("write", "reports.json", ENOSPC);
    EXPECT_FALSE(record(some(2)));
    EXPECT_EQ(left(), 5) << "as if the process had been killed there";
    EXPECT_EQ(reports(), 1u);

    fail("write", "ledger", EIO);
    EXPECT_FALSE(record(some(2)));
    files.fault = {};
    EXPECT_EQ(reports(), 1u) << "nothing is told that couldn't be booked";
    EXPECT_EQ(left(), 5);
}

TEST_F(PrivacyRecorderTest, RecordsNothingWithoutASoundLedgerOrWithoutRandomness)
{
    ASSERT_TRUE(record(some(2)));
    const auto sound = files.files;
    const auto refuses = [&](const char* why) {
        const auto before = files.files;
        EXPECT_FALSE(record(some(5))) << why;
        EXPECT_TRUE(files.files == before) << why;
        files.files = sound;
    };
    files.files[directory / "ledger"][20] ^= 1;
    refuses("damaged");
    files.files[directory / "ledger"] = "";
    refuses("empty");
    files.files[directory / "ledger"] = std::string(1 << 20, ' ');
    refuses("too large");
    fail("read", "ledger", EACCES);
    refuses("unreadable");
    fail("lock", "lock", EWOULDBLOCK);
    refuses("another process records");
    files.fault = {};
    const RandomBytes kept = std::exchange(random, [](std::span<std::uint8_t>) { return false; });
    refuses("no randomness");
    files.files.clear();
    EXPECT_FALSE(record(some(1)));
    EXPECT_TRUE(files.files.empty()) << "no secret that isn't one";
    files.files = sound;
    random = kept;
    files.files.erase(directory / "ledger");
    files.directories.insert(directory / "ledger");
    EXPECT_FALSE(record(some(1))) << "a directory in its place";
    files.directories.erase(directory / "ledger");
    files.files = sound;
    EXPECT_TRUE(record(some(1)));
}

TEST_F(PrivacyRecorderTest, ReportsAreKeptAMonthInNoOrderAndSayNeitherKeyNorText)
{
    ASSERT_TRUE(record(some(8), "key.example"));
    const Value all = parseJson(contents("reports.json")).value();
    std::vector<std::string> bits;
    for (std::size_t i = 0; i < all.count(); ++i) {
        EXPECT_EQ(all[i]["day"], Value("2026-01-01"));
        EXPECT_EQ(all[i]["cohort"], all[0]["cohort"]);
        EXPECT_EQ(all[i].count(), 3u);
        bits.push_back(*all[i]["bits"].asString());
        EXPECT_EQ(bits.back().size(), 64u);
    }
    EXPECT_TRUE(std::ranges::is_sorted(bits));
    for (const auto& [path, text] : files.files) EXPECT_FALSE(text.contains("key") || text.contains("example")) << path;

    advance(24h * 30);
    ASSERT_TRUE(record(some(1)));
    EXPECT_EQ(reports(), 9u);
    advance(24h);
    ASSERT_TRUE(record(some(1)));
    EXPECT_EQ(reports(), 2u);

    for (const char* broken : {"", "{}", "[", "[7]"}) {
        advance(24h);
        files.files[directory / "reports.json"] = broken;
        EXPECT_TRUE(record(some(1)));
        EXPECT_EQ(reports(), 1u) << broken;
    }
}

TEST_F(PrivacyRecorderTest, ADeviceKeepsItsSecretAndChoosesAmongTextsByChance)
{
    ASSERT_TRUE(record(some(1)));
    const auto secret = PrivacyLedger::parse(contents("ledger")).value().secret;
    advance(24h);
    ASSERT_TRUE(record(some(1)));
    EXPECT_EQ(PrivacyLedger::parse(contents("ledger")).value().secret, secret);

    // Of two texts one is chosen. The bit of the first is set in three of four reports of one of them and in one of
    // four of the other, so it tells which is chosen how often.
    const unsigned bit = privacyBit(privacyCohort(secret), "key", "a");
    const bool turned = hasBit(permanentFlips(secret, "key", "a"), bit);
    std::string other = "b";
    while (hasBit(permanentFlips(secret, "key", other), bit) != turned) other += "b";
    int set = 0;
    constexpr int kDays = 400;
    for (int day = 0; day < kDays; ++day) {
        advance(24h);
        ASSERT_TRUE(record(some(7)));
        files.files.erase(directory / "reports.json");
        ASSERT_TRUE(record({"a", other}, "key"));
        const Value all = parseJson(contents("reports.json")).value();
        ASSERT_EQ(all.count(), 1u);
        PrivacyBits bits{};
        ASSERT_TRUE(readHex(*all[0]["bits"].asString(), bits));
        set += hasBit(bits, bit);
    }
    EXPECT_NEAR(set, kDays / 2, 4 * std::sqrt(kDays / 4.0));
}

TEST_F(PrivacyRecorderTest, DrawsItsSecretFromTheSystem)
{
    ASSERT_TRUE(PrivacyRecorder(files, clock, directory).record("key", {"a", "b"}));
    EXPECT_NE(PrivacyLedger::parse(contents("ledger"))->secret, DeviceSecret{});
}

} // namespace
} // namespace platform
