#include "tools/tavrinctl/Findings.h"

#include <algorithm>
#include <cmath>
#include <ctime>
#include <map>

#include <fmt/format.h>
#include <fmt/ranges.h>

#include "platform/net/UrlSession.h"
#include "platform/values/Dictionary.h"
#include "tools/tavrinctl/Books.h"
#include "tools/tavrinctl/StatusText.h"
#include "tools/tavrinctl/Tool.h"

namespace tavrin::ctl {

using platform::Dictionary;
using platform::Value;

namespace {

constexpr double kClockWarning = 300, kClockError = 86400;               // seconds
constexpr double kLongestTrust = 14401;                                  // seconds; no fetch lets a bag live longer
constexpr std::uint64_t kLittleSpace = 200u << 20, kNoSpace = 16u << 20; // bytes
constexpr double kOldSession = 3600;                                     // seconds; passes run every ten minutes

constexpr const char* kRestart = "systemctl --user restart tavrind";

/// Why events were dropped, and what to do about it. Reasons that are not here are intended.
const std::map<std::string_view, std::pair<const char*, const char*>> kLimits{
    {"noContainer",
     {"sessions had no file",
      "Look at the disk and the directories above, and for clients that change their user agent."}},
    {"refusedAppend",
     {"session files were full or could not be written", "Raise TAVSessionSizeLimit, or look at the disk."}},
    {"fileTooBig",
     {"session files were larger than TAVSessionSizeLimit, which was lowered",
      "Run \"tavrinctl flush dump\" before you lower it."}},
    {"tooOld", {"session files were too old", "Nothing, if the device was off; TAVSessionMaxAge is the limit."}},
    {"unreadable", {"session files could not be read", "Look at the disk and the log."}},
    {"damagedTail", {"session files were damaged", "Look at the disk."}},
    {"noBody", {"uploads could not be written", "Make space in the temporary directory."}},
    {"noTask", {"uploads could not be stored", "10,000 uploads or 256 MiB wait: see \"transfers\"."}},
    {"endpointUnset",
     {"the bag named no place to upload to", "Set \"feedbackURL\" or \"crowdsourcingURL\" in the bag."}},
    {"bufferFull",
     {"too many records waited to be sent on their own",
      "The client sends too many: at most 1,000, or 8 MiB, wait for an upload."}},
};

class Doctor {
public:
    explicit Doctor(const Snapshot& snapshot) : _snapshot(snapshot), _status(snapshot.status) {}

    std::vector<Finding> examine()
    {
        daemon();
        if (_status.asDictionary()) {
            bag();
            clock();
        }
        certificates();
        names();
        places();
        stores();
        settings();
        if (_status.asDictionary()) {
            transfers();
            activities();
        }
        sessions();
        if (_status.asDictionary()) limits();
        return std::move(_findings);
    }

private:
    void find(Severity severity, const char* topic, std::string text, std::string advice = "")
    {
        _findings.push_back({severity, topic, std::move(text), std::move(advice)});
    }
    void fine(const char* topic, std::string text) { find(Severity::Fine, topic, std::move(text)); }
    /// Adds `text` unless the topic has a finding already.
    void fineUnlessFound(const char* topic, std::string text)
    {
        if (std::ranges::find(_findings, topic, &Finding::topic) == _findings.end()) fine(topic, std::move(text));
    }

    void daemon()
    {
        if (!_snapshot.connectProblem.empty())
            return find(Severity::Error, "daemon",
                        fmt::format("no daemon answers at {} ({})", _snapshot.address, _snapshot.connectProblem),
                        "Start it: systemctl --user start tavrind.socket, or run tavrind.");
        const std::string version = said(_status["version"]);
        if (!version.ends_with("/" + _snapshot.toolVersion))
            find(Severity::Warning, "daemon",
                 fmt::format("{} runs, but tavrinctl is of version {}", version, _snapshot.toolVersion),
                 fmt::format("Restart it: {}.", kRestart));
        else
            fine("daemon", fmt::format("{} answers at {}, up for {}", version, _snapshot.address,
                                       span(_status["uptime"].asDouble().value_or(0))));
        if (_status["flushingStopped"] == Value(true))
            find(Severity::Warning, "daemon", "uploads in the background are stopped",
                 "\"tavrinctl flush dump\" uploads everything and starts them again.");
    }

    void bag()
    {
        const Value& bag = _status["bag"];
        const std::string fetch = lastFetchText(bag);
        const bool failed = !bag["lastFetch"]["reason"].isNull();
        const std::string advice = failed ? bagAdvice() : "";
        if (bag["version"].isNull())
            return find(Severity::Error, "bag",
                        fmt::format("there is no bag{}", fetch.empty() ? "; no fetch has ended yet" : "; " + fetch),
                        advice);
        const double expiresIn = bag["expiresIn"].asDouble().value_or(0);
        if (failed)
            find(Severity::Warning, "bag", fetch, advice);
        else if (expiresIn <= 0)
            fine("bag", fmt::format("stale since {}; the next request fetches it", span(-expiresIn)));
        if (bag["enabled"] != Value(true))
            find(Severity::Warning, "bag", "it disables search",
                 "Set \"isEnabled\" in the bag, if that is not intended.");
        for (const std::string& problem : _snapshot.bagProblems)
            find(Severity::Warning, "bag", printable(problem), "Correct the bag; until then the default applies.");
        fineUnlessFound("bag", fmt::format("version {}, fresh for {}, from {}", said(bag["version"]), span(expiresIn),
                                           fetch.empty() ? "disk" : said(bag["lastFetch"]["url"])));
    }
    std::string bagAdvice()
    {
        std::string check = "Check the URL: tavrinctl defaults read TAVBagURL.";
        switch (_status["bag"]["lastFetch"]["code"].asInt().value_or(0)) {
        case platform::kUrlTlsFailed: return "See \"certificates\".";
        case platform::kUrlCannotFindHost: return "See \"names\". " + check;
        case platform::kUrlCannotConnect: return "Is the service up, and does a firewall let it through? " + check;
        default: return check;
        }
    }

    void clock()
    {
        const Value& bag = _status["bag"];
        constexpr const char* kAdvice = "Set the clock: timedatectl set-ntp true.";
        const std::string* date = bag["lastFetch"]["serverDate"].asString();
        const auto server = date ? httpDate(*date) : std::nullopt;
        if (server) {
            const double ahead = bag["lastFetch"]["at"].asDouble().value_or(0) - *server;
            if (std::abs(ahead) > kClockWarning)
                find(std::abs(ahead) > kClockError ? Severity::Error : Severity::Warning, "clock",
                     fmt::format("the device's clock is {} {} the service's", span(std::abs(ahead)),
                                 ahead > 0 ? "ahead of" : "behind"),
                     kAdvice);
        }
        if (bag["expiresIn"].asDouble().value_or(0) > kLongestTrust)
            find(Severity::Warning, "clock", "the clock was set back since the bag was fetched", kAdvice);
        fineUnlessFound("clock", server ? "agrees with the service's" : "not compared: the service sent no time yet");
    }

    void certificates()
    {
        if (!_snapshot.authorities.problem.empty())
            find(Severity::Error, "certificates",
                 fmt::format("{}: {}", _snapshot.authorities.path, _snapshot.authorities.problem),
                 "Install ca-certificates, or correct SSL_CERT_FILE in the daemon's environment.");
        if (_status["bag"]["lastFetch"]["code"] == Value(std::int64_t{platform::kUrlTlsFailed}))
            find(Severity::Error, "certificates", lastFetchText(_status["bag"]),
                 "Install the service's authority (update-ca-certificates), or name it in SSL_CERT_FILE of the daemon; "
                 "see \"clock\", too.");
        fineUnlessFound("certificates", "authorities from " + _snapshot.authorities.path);
    }

    void names()
    {
        std::vector<std::string> resolved;
        for (const Snapshot::Host& host : _snapshot.hosts) {
            if (host.problem.empty())
                resolved.push_back(host.name);
            else
                find(Severity::Error, "names", fmt::format("{}: {}", printable(host.name), host.problem),
                     "Check the network and /etc/resolv.conf: getent hosts " + printable(host.name) + ".");
        }
        fineUnlessFound("names", resolved.empty() ? "nothing to resolve yet"
                                                  : fmt::format("resolved {}", fmt::join(resolved, ", ")));
    }

    void places()
    {
        std::uint64_t least = UINT64_MAX;
        for (const Snapshot::Directory& each : _snapshot.directories) {
            if (!each.problem.empty())
                find(Severity::Error, "directories", fmt::format("{} ({}): {}", each.path, each.name, each.problem),
                     "The daemon must own it and be able to write to it.");
            else if (each.mustBePrivate && (each.mode & 077) != 0)
                find(Severity::Warning, "directories",
                     fmt::format("{} ({}) has mode {:04o}: others can look into it", each.path, each.name, each.mode),
                     fmt::format("chmod 700 {}", each.path));
            if (!each.freeBytes) continue;
            least = std::min(least, *each.freeBytes);
            if (*each.freeBytes < kLittleSpace)
                find(*each.freeBytes < kNoSpace ? Severity::Error : Severity::Warning, "disk",
                     fmt::format("{} MiB are free for {} ({})", *each.freeBytes >> 20, each.path, each.name),
                     "Make space: what can't be written is lost.");
        }
        fineUnlessFound("directories", fmt::format("{} are in order", _snapshot.directories.size()));
        if (least != UINT64_MAX) fineUnlessFound("disk", fmt::format("at least {} MiB are free", least >> 20));
    }

    void stores()
    {
        for (const Snapshot::File& file : _snapshot.files)
            if (!file.problem.empty())
                find(Severity::Error, "stores", fmt::format("{}: {}", file.path, printable(file.problem)),
                     file.isUsers ? "Repair or remove it; until then the daemon ignores it."
                                  : "Restart the daemon, which replaces it; if it is damaged again, check the disk.");
        fineUnlessFound("stores", fmt::format("{} files are readable", _snapshot.files.size()));
    }

    void settings()
    {
        for (const std::string& note : _snapshot.unknownSettings)
            find(Severity::Warning, "settings", printable(note), "tavrinctl defaults list");
        for (const std::string& problem : _snapshot.profileProblems)
            find(Severity::Warning, "settings", "device.json: " + printable(problem),
                 "Correct it; until then it counts as missing.");
        fineUnlessFound("settings", "the daemon knows all that are set");
    }

    void transfers()
    {
        // Those that wait for the same are one finding.
        struct Group {
            std::size_t count = 0;
            std::uint64_t events = 0;
            double soonest = 1e18;
            bool failed = false;
        };
        std::map<std::string, Group> groups;
        for (const char* kind : {"uploads", "downloads"})
            for (std::size_t i = 0; i < _snapshot.waiting[kind].count(); ++i) {
                const Value& task = _snapshot.waiting[kind][i];
                const std::string problem = said(task["problem"]);
                Group& group = groups[fmt::format("{} {}", kind, waitText(said(task["waitsFor"]), problem))];
                ++group.count;
                group.events += task["note"]["events"].asUInt().value_or(0);
                group.soonest = std::min(group.soonest, task["inSeconds"].asDouble().value_or(0));
                group.failed = group.failed || task["failures"].asUInt().value_or(0) > 0;
            }
        for (const auto& [what, group] : groups) {
            std::string text = fmt::format("{} {}", group.count, what);
            if (group.events > 0) text += fmt::format(", with {} events", group.events);
            if (group.soonest > 0) text += fmt::format("; the next attempt is in {}", span(group.soonest));
            if (group.failed)
                find(Severity::Warning, "transfers", std::move(text),
                     "Nothing, if the service is down: they are tried again for a week, downloads for a day.");
            else
                fine("transfers", std::move(text));
        }
        fineUnlessFound("transfers", "nothing waits");
    }
    static std::string waitText(const std::string& waitsFor, const std::string& problem)
    {
        std::string text = waitsFor == "transfer" ? "in progress" : "waiting for " + waitsFor;
        if (waitsFor == "time") text = "waiting after a failure";
        if (waitsFor == "turn") text = "waiting for their turn";
        if (!problem.empty()) text += " (" + problem + ")";
        return text;
    }

    void activities()
    {
        for (std::size_t i = 0; i < _snapshot.waiting["activities"].count(); ++i) {
            const Value& activity = _snapshot.waiting["activities"][i];
            std::string text = fmt::format("{} is {}", said(activity["identifier"]), said(activity["state"]));
            if (const auto inSeconds = activity["inSeconds"].asDouble())
                text += *inSeconds > 0 ? fmt::format(", due in {}", span(*inSeconds)) : ", due now";
            if (const std::string why = said(activity["waitsFor"]); !why.empty())
                text += fmt::format("; put off: {}", why == "itself" ? "it asked for it" : "it waits for " + why);
            fine("activities", std::move(text));
        }
        fineUnlessFound("activities", "none");
    }

    void sessions()
    {
        double oldest = 0;
        std::uint64_t bytes = 0;
        for (const Snapshot::SessionFile& file : _snapshot.sessionFiles) {
            oldest = std::max(oldest, file.age);
            bytes += file.bytes;
        }
        const std::string text = fmt::format("{} session files, {} KiB, the oldest {} old",
                                             _snapshot.sessionFiles.size(), bytes >> 10, span(oldest));
        if (oldest > kOldSession)
            find(Severity::Warning, "sessions", text,
                 "They should have been uploaded. \"tavrinctl flush dump\" uploads them now; is the timer unit "
                 "enabled?");
        else
            fine("sessions", _snapshot.sessionFiles.empty() ? "no session file waits" : text);
    }

    void limits()
    {
        const Value& books = _status["feedback"];
        if (const Dictionary* dropped = books["dropped"].asDictionary())
            for (const auto& [reason, events] : *dropped) {
                const auto limit = kLimits.find(reason);
                if (limit == kLimits.end() || events.asInt().value_or(0) == 0) continue;
                find(Severity::Warning, "limits",
                     fmt::format("{} events were dropped: {}", *events.asInt(), limit->second.first),
                     limit->second.second);
            }
        if (books.asDictionary())
            if (const std::vector<std::string> lines = bookLines(books); lines.back() != "the books close")
                find(Severity::Error, "limits", lines.back(), "This is a fault of the daemon: please report it.");
        fineUnlessFound("limits", "no event was lost to a limit");
    }

    const Snapshot& _snapshot;
    const Value& _status;
    std::vector<Finding> _findings;
};

} // namespace

std::vector<Finding> findingsIn(const Snapshot& snapshot)
{
    return Doctor(snapshot).examine();
}

int statusOf(const std::vector<Finding>& findings)
{
    int status = 0;
    for (const Finding& finding : findings) status = std::max(status, static_cast<int>(finding.severity));
    return status;
}

Value describe(const std::vector<Finding>& findings)
{
    constexpr std::string_view kSeverities[]{"fine", "warning", "error"};
    Value::Array list;
    for (const Finding& finding : findings)
        list.push_back(Value::dictionaryOf({{"topic", finding.topic},
                                            {"severity", kSeverities[static_cast<std::size_t>(finding.severity)]},
                                            {"text", finding.text},
                                            {"advice", finding.advice}}));
    return Value::dictionaryOf({{"status", statusOf(findings)}, {"findings", std::move(list)}});
}

std::optional<double> httpDate(const std::string& text)
{
    std::tm time{};
    const char* end = strptime(text.c_str(), "%a, %d %b %Y %H:%M:%S GMT", &time);
    if (!end || *end) return std::nullopt;
    return static_cast<double>(timegm(&time));
}

} // namespace tavrin::ctl
