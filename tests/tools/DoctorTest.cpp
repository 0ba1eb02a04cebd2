#include <functional>

#include <gmock/gmock.h>

#include "platform/values/Dictionary.h"
#include "platform/values/Json.h"
#include "tools/tavrinctl/Findings.h"
#include "tools/tavrinctl/Top.h"

namespace tavrin::ctl {
namespace {

using platform::Dictionary;
using platform::Value;
using testing::HasSubstr;

Value json(const char* text)
{
    return platform::parseJson(text).value();
}

/// Sets the value at a path of keys, which are separated by dots.
void set(Value& value, const std::string& path, const Value& to)
{
    const auto dot = path.find('.');
    const std::string key = path.substr(0, dot);
    Value inner = dot == path.npos ? to : value[key];
    if (dot != path.npos) set(inner, path.substr(dot + 1), to);
    value.mutableDictionary().set(key, inner);
}

/// A device on which all is in order.
Snapshot healthy()
{
    Snapshot snapshot;
    snapshot.now = 1'700'000'000;
    snapshot.toolVersion = "1.2.3";
    snapshot.address = "unix:path=/run/socket";
    snapshot.status = json(R"({"version": "tavrind/1.2.3", "uptime": 90, "flushingStopped": false,
        "bag": {"version": "7", "enabled": true, "expiresIn": 7200, "lastFetch": {"ago": 5, "at": 1699999995,
                "url": "https://b.example/bag", "status": 200, "serverDate": "Tue, 14 Nov 2023 22:13:10 GMT"}},
        "feedback": {"recorded": 3, "open": 1, "closed": 0, "uploading": 0, "sent": 1, "notSent": 0, "unknown": 0,
                     "dropped": {"feedbackOff": 1}}})");
    snapshot.waiting = json(R"({"uploads": [], "downloads": [],
        "activities": [{"identifier": "flush", "state": "waiting", "inSeconds": 20}]})");
    snapshot.hosts = {{"b.example", ""}};
    snapshot.authorities = {"/etc/ssl/ca.crt", ""};
    snapshot.directories = {{.name = "caches", .path = "/c", .problem = {}, .mode = 0700, .freeBytes = 1ull << 30}};
    snapshot.files = {{"/s/counters.json", ""}};
    snapshot.sessionFiles = {{"session.1", 60, 4096}};
    return snapshot;
}

TEST(Doctor, FindsNothingOnAHealthyDevice)
{
    const auto findings = findingsIn(healthy());
    EXPECT_EQ(statusOf(findings), 0) << platform::toJson(describe(findings));
    for (const char* topic : {"daemon", "bag", "clock", "certificates", "names", "directories", "disk", "stores",
                              "settings", "transfers", "activities", "sessions", "limits"})
        EXPECT_THAT(findings, testing::Contains(testing::Field(&Finding::topic, topic))) << topic;
}

TEST(Doctor, FindsEachThingThatIsBrokenAndSaysWhatToDo)
{
    const auto failed = [](const char* reason, std::int64_t code) {
        return [reason, code](Snapshot& s) {
            set(s.status, "bag.lastFetch.reason", reason);
            set(s.status, "bag.lastFetch.code", code);
        };
    };
    const auto dropped = [](const char* reason) {
        return [reason](Snapshot& s) {
            set(s.status, "feedback.recorded", 5);
            set(s.status, "feedback.dropped." + std::string(reason), 2);
        };
    };
    const auto upload = [](const char* task) {
        return [task](Snapshot& s) { set(s.waiting, "uploads", Value::Array{json(task)}); };
    };
    constexpr auto kFine = Severity::Fine, kWarning = Severity::Warning, kError = Severity::Error;
    const struct {
        std::function<void(Snapshot&)> breakIt;
        Severity severity;
        const char* topic;
        const char* text;
        const char* advice;
    } cases[]{
        {[](Snapshot& s) { s.connectProblem = "Connection refused", s.status = s.waiting = Value(); }, kError, "daemon",
         "no daemon answers at unix:path=/run/socket (Connection refused)", "systemctl --user start"},
        {[](Snapshot& s) { s.toolVersion = "1.3"; }, kWarning, "daemon", "tavrinctl is of version 1.3", "Restart it"},
        {[](Snapshot& s) { set(s.status, "flushingStopped", true); }, kWarning, "daemon", "stopped", "flush dump"},
        {[&](Snapshot& s) { failed("Couldn't connect: refused", -1004)(s), set(s.status, "bag.version", Value()); },
         kError, "bag", "there is no bag; last fetch 5 s ago: refused", "Is the service up"},
        {[&](Snapshot& s) { failed("statusCode 503", 2)(s), set(s.status, "bag.lastFetch.status", 503); }, kWarning,
         "bag", "the service answered 503", "TAVBagURL"},
        {failed("SSL: SSL certificate problem: self-signed certificate", -1200), kError, "certificates",
         "self-signed certificate", "update-ca-certificates"},
        {[](Snapshot& s) { set(s.status, "bag.enabled", false); }, kWarning, "bag", "disables search", "isEnabled"},
        {[](Snapshot& s) { s.bagProblems = {"searchURL: expected a URL"}; }, kWarning, "bag", "searchURL", "Correct"},
        {[](Snapshot& s) { s.authorities.problem = "No such file"; }, kError, "certificates", "/etc/ssl/ca.crt",
         "SSL_CERT_FILE"},
        {[](Snapshot& s) { s.hosts[0].problem = "Name or service not known"; }, kError, "names", "b.example", "getent"},
        {[](Snapshot& s) { set(s.status, "bag.lastFetch.at", 1700000995); }, kWarning, "clock", "16 min 45 s ahead of",
         "timedatectl"},
        {[](Snapshot& s) { set(s.status, "bag.lastFetch.at", 1600000000); }, kError, "clock", "behind", "timedatectl"},
        {[](Snapshot& s) { set(s.status, "bag.expiresIn", 90000); }, kWarning, "clock", "set back", "timedatectl"},
        {[](Snapshot& s) { s.directories[0].problem = "Permission denied"; }, kError, "directories",
         "/c (caches): Permission denied", "own it"},
        {[](Snapshot& s) { s.directories[0].mode = 0755; }, kWarning, "directories", "mode 0755", "chmod 700 /c"},
        {[](Snapshot& s) { s.directories[0].freeBytes = 100u << 20; }, kWarning, "disk", "100 MiB", "Make space"},
        {[](Snapshot& s) { s.directories[0].freeBytes = 0; }, kError, "disk", "0 MiB", "Make space"},
        {[](Snapshot& s) { s.files[0].problem = "not JSON"; }, kError, "stores", "/s/counters.json", "Restart"},
        {[](Snapshot& s) { s.files = {{"/settings.json", "not JSON", true}}; }, kError, "stores", "/settings.json",
         "Repair"},
        {[](Snapshot& s) { s.unknownSettings = {"the daemon knows no setting X"}; }, kWarning, "settings", "setting X",
         "defaults list"},
        {[](Snapshot& s) { s.profileProblems = {"country: there is no such member"}; }, kWarning, "settings",
         "device.json: country", "Correct it"},
        {upload(R"({"waitsFor": "time", "inSeconds": 65, "failures": 2, "problem": "refused", "note": {"events": 7}})"),
         kWarning, "transfers",
         "1 uploads waiting after a failure (refused), with 7 events; the next attempt is in 1 min", "tried again"},
        {upload(R"({"waitsFor": "unmetered network", "failures": 0})"), kFine, "transfers",
         "1 uploads waiting for unmetered network", ""},
        {[](Snapshot& s) {
             set(s.waiting, "activities",
                 Value::Array{
                     json(R"({"identifier": "ingest", "state": "waiting", "inSeconds": 5, "waitsFor": "power"})")});
         },
         kFine, "activities", "ingest is waiting, due in 5 s; put off: it waits for power", ""},
        {[](Snapshot& s) { s.sessionFiles = {{"session.1", 7200, 1}}; }, kWarning, "sessions", "the oldest 2 h",
         "dump"},
        {dropped("bufferFull"), kWarning, "limits", "2 events were dropped: too many records", "sends too many"},
        {dropped("endpointUnset"), kWarning, "limits", "no place to upload", "feedbackURL"},
        {[](Snapshot& s) { set(s.status, "feedback.recorded", 4); }, kError, "limits", "don't close", "report"},
    };
    for (const auto& each : cases) {
        Snapshot snapshot = healthy();
        each.breakIt(snapshot);
        const auto findings = findingsIn(snapshot);
        EXPECT_THAT(findings,
                    testing::Contains(testing::AllOf(testing::Field(&Finding::severity, each.severity),
                                                     testing::Field(&Finding::topic, each.topic),
                                                     testing::Field(&Finding::text, HasSubstr(each.text)),
                                                     testing::Field(&Finding::advice, HasSubstr(each.advice)))))
            << each.topic << ": " << each.text << "\n"
            << platform::toJson(describe(findings), platform::JsonStyle::Pretty);
        EXPECT_EQ(statusOf(findings), static_cast<int>(each.severity)) << each.text;
        if (each.severity == kFine) continue;
        for (const Finding& finding : findings)
            EXPECT_EQ(finding.severity == kFine, finding.advice.empty()) << finding.text;
    }
}

TEST(Top, TakesRatesAndLatenciesBetweenTwoSamples)
{
    const auto latency = [](std::size_t bucket, int count) {
        Value::Array counts(96, Value(0));
        counts[bucket] = count;
        return counts;
    };
    const auto sample = [&](double time, double uptime, int searches, int hits, Value::Array counts, int recorded) {
        return TopSample{.time = time,
                         .status = Dictionary{{"uptime", uptime}, {"feedback", Dictionary{{"recorded", recorded}}}},
                         .figures =
                             Dictionary{{"requests", Dictionary{{"query", Dictionary{{"count", searches},
                                                                                     {"failed", 1},
                                                                                     {"latency", std::move(counts)}}},
                                                                {"memory", Dictionary{{"count", hits}}}}}},
                         .memory = 2048,
                         .wakeUps = static_cast<std::uint64_t>(time)};
    };
    const TopSample before = sample(100, 50, 10, 30, latency(80, 10), 5);
    const Value figures = topFigures(before, sample(110, 60, 30, 90, latency(80, 10), 25));
    EXPECT_EQ(figures["requests"]["search"]["perSecond"], Value(2.0));
    EXPECT_EQ(figures["requests"]["search"]["total"], Value(30u));
    EXPECT_TRUE(figures["requests"]["search"]["p50_ms"].isNull()) << "the slow ones were before";
    EXPECT_EQ(figures["hitShare"], Value(0.75));
    EXPECT_EQ(figures["eventsPerSecond"], Value(2.0));
    EXPECT_EQ(figures["wakeUpsPerSecond"], Value(1.0));

    const Value slow = topFigures(before, sample(110, 60, 30, 90, latency(80, 30), 25));
    EXPECT_NEAR(slow["requests"]["search"]["p99_ms"].asDouble().value(), 1247, 1) << "2^20.25 µs";

    const Value restarted = topFigures(before, sample(110, 4, 8, 0, latency(40, 8), 25));
    EXPECT_EQ(restarted["requests"]["search"]["perSecond"], Value(2.0)) << "eight in its four seconds";
    EXPECT_TRUE(restarted["eventsPerSecond"].isNull());
    EXPECT_THAT(topLines(figures, before.status), testing::Contains(HasSubstr("75 % of searches")));
}

} // namespace
} // namespace tavrin::ctl
