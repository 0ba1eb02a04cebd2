#include "platform/privacy/RandomizedResponse.h"

#include <algorithm>
#include <array>
#include <bit>
#include <cmath>
#include <cstdlib>
#include <fstream>
#include <iterator>
#include <numeric>
#include <random>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "platform/privacy/PrivacyLedger.h"

namespace platform {
namespace {

/// Standard deviations that a right rate stays within in 99.9 of 100 runs. The seeds are fixed, so every run is the
/// same.
constexpr double kConfidence = 3.2905;
constexpr const char* kKey = "com.quorvane.tavrin.AppDeepLink.org.example.news";

/// More for a closer look: TAVRIND_PRIVACY_SAMPLES=1000000.
int samples()
{
    const char* wanted = std::getenv("TAVRIND_PRIVACY_SAMPLES");
    return wanted ? std::max(1000, std::atoi(wanted)) : 20'000;
}

/// A device's secret, or the randomness of a report.
template <class Bytes> Bytes drawn(std::mt19937_64& dice)
{
    Bytes bytes;
    std::ranges::generate(bytes, [&] { return static_cast<std::uint8_t>(dice()); });
    return bytes;
}

int count(const PrivacyBits& bits)
{
    return std::accumulate(bits.begin(), bits.end(), 0, [](int sum, auto byte) { return sum + std::popcount(byte); });
}

void expectRate(double found, double trials, double derived, const char* what)
{
    EXPECT_NEAR(found / trials, derived, kConfidence * std::sqrt(derived * (1 - derived) / trials)) << what;
}

TEST(RandomizedResponse, TurnsBitsOverAtTheRatesThatItsEpsilonIsDerivedFrom)
{
    EXPECT_DOUBLE_EQ(kTrueBitRate, (1 - kPrivacyFlip) * (1 - kPrivacyFlip) + kPrivacyFlip * kPrivacyFlip);
    EXPECT_DOUBLE_EQ(kOtherBitRate, 1 - kTrueBitRate);
    EXPECT_DOUBLE_EQ(kReportEpsilon,
                     std::log(kTrueBitRate / kOtherBitRate) + std::log((1 - kOtherBitRate) / (1 - kTrueBitRate)));
    EXPECT_DOUBLE_EQ(kPermanentEpsilon, 2 * std::log((1 - kPrivacyFlip) / kPrivacyFlip));

    std::mt19937_64 dice(1);
    const int n = samples();
    double permanent = 0, instantaneous = 0, trueBits = 0, otherBits = 0;
    for (int i = 0; i < n; ++i) {
        const DeviceSecret secret = drawn<DeviceSecret>(dice);
        const PrivacyRandom random = drawn<PrivacyRandom>(dice);
        const std::string text = "text " + std::to_string(i);
        permanent += count(permanentFlips(secret, kKey, text));
        instantaneous += count(flips(random));
        const PrivacyReport report = privatised(secret, kKey, text, random);
        const bool set = hasBit(report.bits, privacyBit(report.cohort, kKey, text));
        trueBits += set;
        otherBits += count(report.bits) - set;
    }
    expectRate(permanent, n * 256.0, kPrivacyFlip, "permanent");
    expectRate(instantaneous, n * 256.0, kPrivacyFlip, "instantaneous");
    expectRate(trueBits, n, kTrueBitRate, "the bit of the text");
    expectRate(otherBits, n * 255.0, kOtherBitRate, "other bits");
}

TEST(RandomizedResponse, ManyReportsOfATextTellNoMoreThanItsPermanentResponse)
{
    std::mt19937_64 dice(2);
    const int n = samples();
    const DeviceSecret secret = drawn<DeviceSecret>(dice);
    const unsigned cohort = privacyCohort(secret);
    PrivacyBits permanent = permanentFlips(secret, kKey, "text");
    const unsigned bit = privacyBit(cohort, kKey, "text");
    permanent[bit / 8] ^= static_cast<std::uint8_t>(1u << bit % 8);

    std::array<int, kPrivacyBits> set{};
    for (int i = 0; i < n; ++i) {
        const PrivacyReport report = privatised(secret, kKey, "text", drawn<PrivacyRandom>(dice));
        ASSERT_EQ(report.cohort, cohort);
        for (unsigned each = 0; each < kPrivacyBits; ++each) set[each] += hasBit(report.bits, each);
    }
    for (unsigned each = 0; each < kPrivacyBits; ++each)
        EXPECT_NEAR(set[each], n * (hasBit(permanent, each) ? 1 - kPrivacyFlip : kPrivacyFlip),
                    6 * std::sqrt(n * kPrivacyFlip * (1 - kPrivacyFlip)))
            << each;
    EXPECT_GT(count(permanent), 20) << "which hides the one bit among others";

    const PrivacyBits same = permanentFlips(secret, kKey, "text");
    EXPECT_NE(permanentFlips(secret, kKey, "texts"), same);
    EXPECT_NE(permanentFlips(secret, "other", "text"), same);
    EXPECT_NE(permanentFlips(drawn<DeviceSecret>(dice), kKey, "text"), same);
    EXPECT_NE(permanentFlips(secret, "ab", "c"), permanentFlips(secret, "a", "bc"));
}

/// The chance that `set` of `reports` reports have a bit which the permanent response left set with the chance `rate`.
double chanceOf(int set, int reports, double rate)
{
    const auto given = [&](double bitRate) { return std::pow(bitRate, set) * std::pow(1 - bitRate, reports - set); };
    return rate * given(1 - kPrivacyFlip) + (1 - rate) * given(kPrivacyFlip);
}

TEST(RandomizedResponse, AnyNumberOfReportsOfATextLosesNoMoreThanDerived)
{
    const auto lost = [](int n) { // of two bits
        double most = 0;
        for (int set = 0; set <= n; ++set)
            most =
                std::max(most, std::abs(std::log(chanceOf(set, n, 1 - kPrivacyFlip) / chanceOf(set, n, kPrivacyFlip))));
        return 2 * most;
    };
    for (int n = 1; n <= 40; ++n)
        EXPECT_LE(lost(n), std::min(n * kReportEpsilon, kPermanentEpsilon) + 1e-9) << n << " reports";
    EXPECT_NEAR(lost(1), kReportEpsilon, 1e-9);
    EXPECT_NEAR(lost(40), kPermanentEpsilon, 1e-9);
}

TEST(RandomizedResponse, SpreadsDevicesOverCohortsAndTextsOverBits)
{
    std::mt19937_64 dice(4);
    constexpr int kTrials = 25'600;
    std::array<int, kPrivacyCohorts> cohorts{};
    std::array<int, kPrivacyBits> bits{};
    for (int i = 0; i < kTrials; ++i) {
        ++cohorts.at(privacyCohort(drawn<DeviceSecret>(dice)));
        ++bits.at(privacyBit(3, kKey, std::to_string(i)));
    }
    for (const int devices : cohorts) EXPECT_NEAR(devices, kTrials / 8, 6 * std::sqrt(kTrials / 8.0));
    for (const int texts : bits) EXPECT_NEAR(texts, kTrials / 256, 6 * std::sqrt(kTrials / 256.0));
    EXPECT_NE(privacyBit(0, kKey, "text"), privacyBit(1, kKey, "text"));
    EXPECT_NE(privacyBit(0, "ab", "c"), privacyBit(0, "a", "bc"));
}

TEST(RandomizedResponse, IsAsTheExampleOfThePageSays)
{
    DeviceSecret secret;
    std::iota(secret.begin(), secret.end(), std::uint8_t(0));
    std::ifstream file(SOURCE_DIR "/docs/privacy.md");
    const std::string page{std::istreambuf_iterator<char>(file), {}};
    const unsigned cohort = privacyCohort(secret);
    const std::string numbers =
        "cohort " + std::to_string(cohort) + ", bit " + std::to_string(privacyBit(cohort, kKey, "news.example/today"));
    EXPECT_TRUE(page.contains(numbers)) << numbers;
    const std::string turned = hexText(permanentFlips(secret, kKey, "news.example/today"));
    EXPECT_TRUE(page.contains(turned)) << turned;
}

} // namespace
} // namespace platform
