// What comes of downloaded resources: the signature of the installed applications, and the filter of lookup results.

#include <algorithm>
#include <cstring>
#include <memory>
#include <random>
#include <string>
#include <vector>

#include <fmt/format.h>
#include <fmt/ranges.h>
#include <simdjson.h>
#include <unicode/brkiter.h>
#include <unicode/unistr.h>

#include "bench/Support.h"
#include "CoreTavrin/TAVRequest.h"
#include "platform/base/Log.h"
#include "platform/device/InstalledApplications.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Json.h"
#include "tavrind/AppWhitelistController.h"
#include "tavrind/encoder.h"
#include "tavrind/Lookup.h"

namespace tavrin::bench {

namespace {

using platform::Value;

std::string applicationName(std::size_t number)
{
    return fmt::format("org.example.vendor{}.Application{}", number % 977, number);
}

std::string allowList(std::size_t count)
{
    platform::Dictionary applications;
    applications.reserve(count);
    for (std::size_t i = 0; i < count; ++i)
        applications.set(applicationName(i), Value::Array{Value::dictionaryOf({{"encoding_id", i}})});
    const Value inner = Value::dictionaryOf({{"version", "0a1b2c"}, {"apps", std::move(applications)}});
    return platform::toJson(
        Value::dictionaryOf({{"apps", platform::toJson(inner)}, {"compression", "RLE"}, {"encoding", "bitmap"}}));
}

/// Hands over what was read before.
struct Installed final : platform::InstalledApplications {
    std::vector<platform::InstalledApplication> read;
    std::vector<platform::InstalledApplication> applications() override { return std::move(read); }
    void onChange(std::function<void()>) override {}
};

double parseBoth(std::string_view list)
{
    const double begin = now();
    simdjson::dom::parser outerParser, innerParser;
    std::string_view text;
    require(outerParser.parse(list.data(), list.size())["apps"].get(text) == simdjson::SUCCESS, "the outer document");
    require(innerParser.parse(text.data(), text.size()).error() == simdjson::SUCCESS, "the inner document");
    return now() - begin;
}

/// Runs as long as one another, of `length` bits, with every `longer`th one bit longer.
std::string bitmapOfRuns(std::size_t bytes, unsigned length, unsigned longer = 0)
{
    std::string bitmap(bytes, '\0');
    bool value = false;
    std::size_t bit = 0;
    for (unsigned run = 1; bit < bytes * 8; ++run, value = !value)
        for (unsigned i = length + (longer != 0 && run % longer == 0); i > 0 && bit < bytes * 8; --i, ++bit)
            if (value)
                bitmap[bit / 8] = static_cast<char>(static_cast<unsigned char>(bitmap[bit / 8]) | 0x80u >> bit % 8);
    return bitmap;
}

/// Seconds for each of some codings.
double codings(const std::string& bitmap)
{
    constexpr int kCodings = 20;
    const double begin = now();
    for (int i = 0; i < kCodings; ++i) require(!encodeRun(bitmap).bytes.empty(), "a coding");
    return (now() - begin) / kCodings;
}

double copies(const std::string& bitmap)
{
    constexpr int kCopies = 1000;
    static std::string copy(bitmap.size(), '\0');
    const double begin = now();
    for (int i = 0; i < kCopies; ++i) {
        std::memcpy(copy.data(), bitmap.data(), bitmap.size());
        asm volatile("" : : "r"(copy.data()) : "memory"); // every copy counts
    }
    return (now() - begin) / kCopies;
}

} // namespace

std::vector<Row> signature()
{
    const OneCore pinned;
    std::vector<Row> rows;
    constexpr std::size_t kListed = 50'000, kInstalled = 10'000;
    const std::string list = allowList(kListed);
    std::vector<platform::InstalledApplication> applications;
    for (std::size_t i = 0; i < kInstalled; ++i) applications.push_back({applicationName(i * 7919 % kListed), "1.0"});
    Installed installed;
    rows.push_back(compare(
        fmt::format("signature of {} installed of {} listed applications, beside a parse of both documents", kInstalled,
                    kListed),
        21, 3,
        [&] {
            installed.read = applications;
            const double begin = now();
            require(processWhitelist(list, installed).has_value(), "a signature");
            return now() - begin;
        },
        [&] { return parseBoth(list); }));

    // One bit shorter, and the coding would be longer than the bitmap; alternating bits are given up on the way.
    constexpr std::size_t kBytes = 65'535;
    std::string worst;
    double slowest = 0;
    for (const std::string& bitmap : {bitmapOfRuns(kBytes, 1), bitmapOfRuns(kBytes, 9), bitmapOfRuns(kBytes, 9, 64),
                                      bitmapOfRuns(kBytes, 10), bitmapOfRuns(kBytes, 300)}) {
        if (const double time = std::min(codings(bitmap), codings(bitmap)); time > slowest) {
            slowest = time;
            worst = bitmap;
        }
    }
    std::vector<double> times;
    Row row = compare(
        "run-length coding of the worst bitmap of 65,535 bytes, beside memcpy", 21, 0,
        [&] { return times.emplace_back(codings(worst)); }, [&] { return copies(worst); });
    row.figure = median(times) * 1000; // the time is limited, and not the ratio
    row.limit = 1;
    row.unit = "ms";
    rows.push_back(std::move(row));
    return rows;
}

namespace {

constexpr int kResults = 200;

/// A language of a few thousand words, some of them with accents.
struct Prose {
    std::mt19937 random{7};
    std::vector<std::string> words;
    Prose()
    {
        static constexpr const char* kSyllables[] = {"ka",  "lo",  "mi", "ter", "zü", "rich", "stra", "ße", "né", "von",
                                                     "hal", "den", "so", "ta",  "wi", "gen",  "ber",  "ch", "a",  "ul"};
        for (int i = 0; i < 3000; ++i) {
            std::string word;
            for (std::size_t n = 2 + random() % 3; n > 0; --n) word += kSyllables[random() % std::size(kSyllables)];
            words.push_back(std::move(word));
        }
    }
    const std::string& word() { return words[random() % words.size()]; }
    std::string sentence(std::size_t count)
    {
        std::string text;
        for (std::size_t i = 0; i < count; ++i) text += (i == 0 ? "" : i % 9 == 0 ? ", " : " ") + word();
        return text + ".";
    }
};

/// An answer of as many results with instructions, four keywords each of which the context has one, and every text in
/// it.
Value lookupAnswer(Prose& prose, const std::vector<std::string>& contextWords, std::vector<std::string>& texts)
{
    const auto fromContext = [&] { return contextWords[prose.random() % contextWords.size()]; };
    Value::Array results;
    for (int i = 0; i < kResults; ++i) {
        Value::Array keywords;
        for (int k = 0; k < 4; ++k) {
            std::string word = k == 0 ? fromContext() : prose.word();
            texts.push_back(word);
            keywords.push_back(Value::dictionaryOf({{"word", std::move(word)}, {"weight", 0.25}}));
        }
        const std::string completion = i % 4 == 0 ? prose.word() : fromContext();
        const std::string subject = prose.sentence(7) + " " + fromContext();
        texts.push_back(completion);
        texts.push_back(subject);
        results.push_back(
            Value::dictionaryOf({{"title", prose.sentence(5)},
                                 {"url", "https://result.example/"},
                                 {"lookup_instructions", Value::dictionaryOf({{"keywords", std::move(keywords)},
                                                                              {"min_keywords_score", 0.25},
                                                                              {"completion", completion},
                                                                              {"subject", subject},
                                                                              {"min_subject_score", 0.002}})}}));
    }
    return Value::Array{Value::dictionaryOf({{"results", std::move(results)}})};
}

/// Goes through the words of the texts, and does nothing with them.
double iterate(const std::vector<std::string>& texts)
{
    const double begin = now();
    UErrorCode status = U_ZERO_ERROR;
    const std::unique_ptr<icu::BreakIterator> iterator(
        icu::BreakIterator::createWordInstance(icu::Locale("de_CH"), status));
    std::size_t words = 0;
    for (const std::string& text : texts) {
        const auto unicode = icu::UnicodeString::fromUTF8(text);
        iterator->setText(unicode);
        while (iterator->next() != icu::BreakIterator::DONE) words += iterator->getRuleStatus() >= UBRK_WORD_NONE_LIMIT;
    }
    require(words > texts.size() / 2, "words");
    return now() - begin;
}

} // namespace

std::vector<Row> lookupFilter()
{
    const OneCore pinned;
    platform::Log::threshold = platform::LogLevel::Fault;
    Prose prose;
    std::vector<std::string> contextWords;
    for (int i = 0; i < 120; ++i) contextWords.push_back(prose.word());
    TAVLookupRequest request;
    request.queryContext = fmt::format("{}.", fmt::join(contextWords, " "));
    std::vector<std::string> texts{*request.queryContext};
    const Value answer = lookupAnswer(prose, contextWords, texts);
    return {compare(
        fmt::format("filter of {} lookup results, beside ICU's word iteration of the same texts alone", kResults), 51,
        kReportedOnly,
        [&] {
            Value response = answer;
            const double begin = now();
            Lookup::filterLookupResultsWithRequest(request, response, "de_CH");
            const double end = now();
            const std::size_t kept = response[0]["results"].count();
            require(kept > kResults / 4 && kept < kResults, "some results kept, and some dropped");
            return end - begin;
        },
        [&] { return iterate(texts); })};
}

} // namespace tavrin::bench
