#include "tavrind/Lookup.h"

#include "CoreTavrin/TAVBag.h"
#include "CoreTavrin/TAVRequest.h"
#include "platform/values/Json.h"
#include "tavrind/TavrinBagController.h"
#include "tests/support/DaemonFixture.h"

namespace tavrin::test {
namespace {

using platform::Url;

struct LookupTest : DaemonTest {
    LookupTest()
    {
        start();
        device.userDefaults.set("TAVDownloadDelay", 60); // exactly, not at some time within the window
    }

    /// The daemon's downloads, which the next bag starts.
    void offer(Dictionary resources)
    {
        device.notifications.post(
            {.name = TAVBagChangeNotification,
             .userInfo = {{"bag", std::make_shared<const TAVBag>(std::move(resources), "Vistrel/4")}}});
        device.drain();
        device.advance(60s);
    }
    void deliver(std::string contents, std::string_view from)
    {
        device.background.loads.at("com.quorvane.tavrind")
            ->tasks.back()
            ->respond(200, std::move(contents), {}, Url::parse(from));
        device.drain();
        assembly().lookup->_drainQueue();
    }
    /// What the store has of a kind: contents and signature.
    std::string installed(int kind)
    {
        const auto file = device.files.files.find("/data/data-detectors/" + std::to_string(kind) + ".source");
        return (file == device.files.files.end() ? "-" : file->second) + " " +
               device.dataDetectors->clientSignature(kind).value_or("-");
    }

    LogCapture log;
};

TEST_F(LookupTest, HintsAreInstalledWhenTheyComeAndGoWithTheirResource)
{
    offer({{"TAVLookupHintsMonthly", "https://r.example/m"}});
    deliver("months", "https://r.example/de/hints/2026/m1");
    EXPECT_EQ(installed(Lookup::Monthly), "months 2026-m1-hints");
    EXPECT_EQ(installed(Lookup::Weekly), "- -");

    offer({{"TAVLookupHintsWeekly", "https://r.example/w?version=5"}, {"TAVVistrelModels", "https://r.example/f"}});
    EXPECT_EQ(installed(Lookup::Monthly), "- -") << "no longer listed";
    deliver("models", "https://r.example/f");
    EXPECT_EQ(log.count("sourceKind: 2"), 1) << "taken away at first";

    device.files.files["/weeks"] = "weeks";
    for (const char* path : {"/weeks", "/not/there"}) {
        device.notifications.post(
            {.name = TAVFileDownloadCompletedNotification,
             .userInfo = {{"identifier", std::string("TAVLookupHintsWeekly")}, {"url", std::filesystem::path(path)}}});
        device.drain();
        EXPECT_EQ(installed(Lookup::Weekly).starts_with("weeks"), path == std::string("/weeks")) << path;
    }
    EXPECT_EQ(log.count("error trying to open hints file"), 1);
    EXPECT_EQ(installed(Lookup::Weekly), "- -") << "an unreadable file stands for none";
}

TEST_F(LookupTest, StartupInstallsOnlyWhatTheStoreDoesNotHave)
{
    offer({{"TAVLookupHintsWeekly", "https://r.example/w"}});
    deliver("weeks", "https://r.example/de/hints/2026/w1");
    Strings written;
    device.files.fault = [&](std::string_view operation, const std::filesystem::path& path) {
        if (operation == "write" && path.parent_path() == "/data/data-detectors") written.push_back(path.filename());
        return 0;
    };
    start();
    EXPECT_TRUE(written.empty());
    EXPECT_TRUE(log.count("reprocess file doesn't exist")) << "the monthly hints";

    device.files.files.erase("/data/data-detectors/2.signature"); // as if it had ended in between
    start();
    EXPECT_EQ(written, (Strings{"2.source", "2.signature"}));
    EXPECT_EQ(installed(Lookup::Weekly), "weeks 2026-w1-hints");

    device.files.files["/data/data-detectors/2.signature"] = "2025-w9-hints";
    failOn("write", ENOSPC);
    start();
    EXPECT_EQ(log.count("signature (2025-w9-hints) does not match version (2026-w1-hints), DD for kind: 2"), 1);
    EXPECT_TRUE(log.count("failed to push data to data detectors"));
    EXPECT_EQ(installed(Lookup::Weekly), "weeks -") << "the old source, known to be old";
}

TEST_F(LookupTest, SignaturesComeFromThePathAndTheSharedSwitchCounts)
{
    const auto& lookup = *assembly().lookup;
    for (const auto& [url, signature] : {std::pair("https://r.example/a/b/c/d", "c-d-b"),
                                         {"https://r.example/a/b/c/d/e?x", "c-d-b"},
                                         {"https://r.example/a/b/c/", "c--b"},
                                         {"https://r.example/a/b/c", ""},
                                         {"https://r.example", ""}})
        EXPECT_EQ(signatureFromURL(*Url::parse(url)).value_or(""), signature) << url;
    EXPECT_EQ(log.count("invalid lookup hints url"), 2);
    EXPECT_TRUE(lookup.lookupEnabled());
    device.lookupDefaults.set("LookupSuggestionsDisabled", true);
    EXPECT_FALSE(lookup.lookupEnabled());
}

TEST(LookupFilter, KeepsResultsWhoseKeywordsCompletionAndSubjectFit)
{
    const std::string context = "Der Zürcher Hauptbahnhof, im Herzen der Stadt Zürich: 3 Strassen, 3 Plätze";
    const struct {
        const char* instructions;
        bool kept;
    } cases[]{
        {R"({"min_keywords_score": 0.75, "keywords": [{"word": "HAUPTBAHNHOF", "weight": 0.5}, {"word": "zürich", "weight": 0.25}]})",
         true}, // exactly
        {R"({"min_keywords_score": 0.76, "keywords": [{"word": "hauptbahnhof", "weight": 0.5}, {"word": "zürich", "weight": 0.25}]})",
         false},
        {R"({"min_keywords_score": 0.5, "keywords": [{"word": "stadt", "weight": 0.25}, {"word": "stadt", "weight": 0.25}]})",
         false}, // a word counts once
        {R"({"min_keywords_score": 0.5, "keywords": [{"word": "Stadt", "weight": 0.1}, {"word": "Stadt", "weight": 0.5}]})",
         true}, // as it comes last
        {R"({"min_keywords_score": 0.1, "keywords": [{"word": "zurich", "weight": 1}, {"word": "", "weight": 1}, {"weight": 1}, 7]})",
         false},
        {R"({"min_keywords_score": -1, "keywords": [{"word": "stadt", "weight": -2}]})", false},
        {R"({"completion": "herzen der STADT"})", true},
        {R"({"completion": "Herzen von"})", false},
        {R"({"completion": ""})", true},
        {R"({})", true},
        {R"({"min_subject_score": 0, "subject": ""})", true},
        {R"({"min_subject_score": 0.01, "subject": ""})", false},
        {R"({"min_subject_score": 0.01})", false},
        {R"({"min_subject_score": 0.01, "subject": ", :"})", false},
        {R"({"min_subject_score": 0.2, "subject": "Stadt Zürich"})", false}, // 2 of 11 words: 3, der and Der apart
        {R"({"min_subject_score": 0.18, "subject": "Stadt, Zürich, Zürich"})", true},
        {R"({"min_subject_score": 0.01, "subject": "stadt"})", false}, // words as they stand
        {R"({"min_subject_score": -1, "subject": ""})", true},
    };
    TAVLookupRequest request;
    request.queryContext = context;
    for (const auto& c : cases) {
        Value response =
            platform::parseJson(std::string(R"([{"other": 1, "results": [{"n": 1}, {"n": 2, "lookup_instructions": )") +
                                c.instructions + R"(}, {"n": 3, "lookup_instructions": "none"}]}, {"no": 1}, 5])")
                .value();
        const Value copy = response;
        Lookup::filterLookupResultsWithRequest(request, response, "de_CH");
        EXPECT_EQ(response[0]["results"].count(), c.kept ? 3u : 2u) << c.instructions;
        EXPECT_EQ(response[0]["results"][0]["n"], Value(1));
        EXPECT_EQ(response[0]["results"][c.kept ? 2 : 1]["n"], Value(3));
        EXPECT_EQ(response[0]["other"], Value(1));
        EXPECT_EQ(response.count(), 3u);
        EXPECT_EQ(copy[0]["results"].count(), 3u) << "another's copy is untouched";
    }

    LogCapture log;
    platform::Log::privateData = false;
    request.queryContext.reset();
    Value response = platform::parseJson(R"([{"results": [{"lookup_instructions": {"completion": "x"}}]}])").value();
    Lookup::filterLookupResultsWithRequest(request, response, "");
    EXPECT_EQ(response[0]["results"].count(), 0u) << "no context";
    Value array = Value::Array(), text = std::string(1000, 'x');
    Lookup::filterLookupResultsWithRequest(request, array, "");
    Lookup::filterLookupResultsWithRequest(request, text, "");
    EXPECT_EQ(log.count("no data to process for lookup response"), 1);
    EXPECT_EQ(log.count("lookup response is not an array. who knows what this is: <private>"), 1);
}

} // namespace
} // namespace tavrin::test
