#include <gmock/gmock.h>

#include "CoreTavrin/TAVReply.h"
#include "tools/replay/Corpus.h"
#include "tools/replay/Report.h"

namespace tavrin::replay {
namespace {

using testing::HasSubstr;

TEST(Corpus, IsReadKeyByKey)
{
    const auto queries = parseCorpus("# made up\nZü x\t100:Z 20:ü 0:⌫ 30:u 5:␣ 1::\n\nb\t0:b");
    ASSERT_TRUE(queries && queries->size() == 2);
    std::vector<std::string> texts;
    for (const Keystroke& key : queries->front().keys) texts.push_back(key.text);
    EXPECT_EQ(texts, (std::vector<std::string>{"Z", "Zü", "Z", "Zu", "Zu ", "Zu :"}));
    EXPECT_EQ(queries->front().wanted, "Zü x");
    EXPECT_EQ(queries->front().keys.front().pause, std::chrono::milliseconds(100));

    for (const char* bad :
         {"a", "a\t", "a\tb", "a\tx:b", "a\t1:", "a\t1:bc", "a\t-1:b", "a\t99999999999:b", "a\t1:\xbc", "a\t1:a  1:b"})
        EXPECT_THAT(parseCorpus(std::string("#\n") + bad).error().reason(), HasSubstr("line 2")) << bad;
    EXPECT_FALSE(parseCorpus("a\t" + std::string(4000, ' ')));
}

TAVAnswer answer(const char* sets, const char* fetchedFor, bool fromNetwork)
{
    TAVAnswer result{1, std::make_shared<TAVReply>(), std::nullopt};
    result.reply->rawResponse = platform::Bytes(std::string(sets));
    result.reply->httpRequest = std::make_shared<TAVHTTPRequest>();
    result.reply->httpRequest->url = std::string("https://s.example/search?q=") + fetchedFor;
    if (fromNetwork) result.reply->httpResponse = std::make_shared<TAVHTTPResponse>();
    return result;
}

Search search(std::int64_t queryId, std::string text, double sent, double latency = 0.01)
{
    return {.queryId = queryId, .text = std::move(text), .sent = sent, .answered = sent + latency};
}

TEST(Report, FindsStaleAnswers)
{
    constexpr const char* kWeather = R"([{"query": "weather", "max_age": 60}])";
    Report report;
    report.add(search(1, "Wea", 0), answer(kWeather, "Wea", true));
    report.add(search(2, "weat", 59), answer(kWeather, "Wea", false));
    report.add(search(4, "weathe", 59.9), answer(kWeather, "Wea", false));
    EXPECT_TRUE(report.stale().empty());

    const auto next = [&](const Search& what, const TAVAnswer& came, const char* problem) {
        const std::size_t before = report.stale().size();
        report.add(what, came);
        ASSERT_EQ(report.stale().size(), before + 1) << problem;
        EXPECT_THAT(report.stale().back(), HasSubstr(problem));
    };
    next(search(3, "weath", 59), answer(kWeather, "Wea", false), "later key (4)");
    next(search(5, "web", 59), answer(R"([{"query": "weather"}])", "we", false), "results for \"weather\"");
    next(search(6, "we", 59), answer(kWeather, "Wea", false), "fetched for \"Wea\"");
    next(search(7, "weath", 61), answer(kWeather, "Wea", false), "61.0 s ago");
    EXPECT_EQ(report.hits(), 6u);
}

TEST(Report, CountsEachAnswerOnce)
{
    Report report;
    Search tooShort = search(1, "w", 0);
    tooShort.tooShort = true;
    report.add(tooShort, TAVAnswer{1, nullptr, std::nullopt});
    Search overtaken = search(2, "we", 1);
    overtaken.overtaken = true;
    report.add(search(3, "wea", 1, 0.2), answer("[]", "wea", true));
    report.add(overtaken, TAVAnswer{2, nullptr, std::nullopt});
    report.add(search(4, "wea", 2), TAVAnswer{4, nullptr, std::nullopt});
    report.addUnanswered(search(5, "weat", 2));
    EXPECT_EQ(report.requests(), 4u);
    EXPECT_EQ(report.failed().size(), 2u) << "an answer that is empty without a reason";
    EXPECT_TRUE(report.stale().empty()) << "what was overtaken came empty";
    EXPECT_EQ(report.json()["network"]["p50_ms"], platform::Value(200.0));

    EXPECT_EQ(percentile({}, 50), 0);
    EXPECT_EQ(percentile({3, 1, 2, 4}, 50), 2);
    EXPECT_EQ(percentile({3, 1, 2, 4}, 99), 4);
}

} // namespace
} // namespace tavrin::replay
