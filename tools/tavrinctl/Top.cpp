#include "tools/tavrinctl/Top.h"

#include <algorithm>

#include <fmt/format.h>

#include "CoreTavrin/LatencyHistogram.h"
#include "platform/values/Dictionary.h"
#include "tools/tavrinctl/Books.h"
#include "tools/tavrinctl/Characters.h"
#include "tools/tavrinctl/StatusText.h"
#include "tools/tavrinctl/Tool.h"

namespace tavrin::ctl {

using platform::Dictionary;
using platform::Value;

namespace {

std::uint64_t countIn(const Value& value)
{
    return value.asUInt().value_or(0);
}

LatencyCounts countsIn(const Value& latency)
{
    LatencyCounts counts{};
    for (std::size_t i = 0; i < std::min(latency.count(), counts.size()); ++i) counts[i] = countIn(latency[i]);
    return counts;
}

/// A kind's name for people: "query" is a search, "zkw query" a zkw.
std::string kindName(const std::string& kind)
{
    if (kind == "query") return "search";
    const auto end = kind.rfind(" query");
    return end == std::string::npos ? kind : kind.substr(0, end);
}

Dictionary kindFigures(const Value& before, const Value& now, double seconds)
{
    const std::uint64_t count = countIn(now["count"]);
    LatencyCounts latency = countsIn(now["latency"]);
    const LatencyCounts earlier = countsIn(before["latency"]);
    for (std::size_t i = 0; i < latency.size(); ++i) latency[i] -= std::min(latency[i], earlier[i]);
    Dictionary figures{{"total", count}, {"failed", countIn(now["failed"])}};
    if (seconds > 0)
        figures.set("perSecond", static_cast<double>(count - std::min(count, countIn(before["count"]))) / seconds);
    for (const auto& [name, quantile] : {std::pair("p50_ms", 0.5), {"p99_ms", 0.99}})
        if (const auto milliseconds = latencyQuantile(latency, quantile)) figures.set(name, *milliseconds);
    return figures;
}

std::string figureText(const Value& value, const char* unit)
{
    const auto figure = value.asDouble();
    return figure ? fmt::format("{:.1f}{}", *figure, unit) : "–";
}

} // namespace

Value topFigures(const TopSample& before, const TopSample& now)
{
    // After a restart the counts are smaller: the earlier sample is of another process.
    const double uptime = now.status["uptime"].asDouble().value_or(0);
    const bool restarted = uptime < before.status["uptime"].asDouble().value_or(0);
    const TopSample nothing{.time = now.time - uptime, .status = {}, .figures = {}};
    const TopSample& from = restarted ? nothing : before;
    const double seconds = now.time - from.time;

    Dictionary requests;
    const auto since = [&](const char* kind) {
        const std::uint64_t count = countIn(now.figures["requests"][kind]["count"]);
        return static_cast<double>(count - std::min(count, countIn(from.figures["requests"][kind]["count"])));
    };
    if (const Dictionary* kinds = now.figures["requests"].asDictionary())
        for (const auto& [kind, figure] : *kinds)
            requests.set(kindName(kind), kindFigures(from.figures["requests"][kind], figure, seconds));

    Dictionary figures{
        {"requests", std::move(requests)}, {"memory_kib", now.memory}, {"books", now.status["feedback"]}};
    const auto share = [&](const char* name, const char* hits, const char* misses) {
        if (const double all = since(hits) + since(misses); all > 0) figures.set(name, since(hits) / all);
    };
    share("hitShare", "memory", "query");
    share("imageHitShare", "cached image", "image");
    if (seconds > 0) {
        const std::uint64_t events = countIn(now.status["feedback"]["recorded"]);
        const std::uint64_t earlier = countIn(from.status["feedback"]["recorded"]);
        if (!restarted) // the books go on after a restart, the wake-ups don't
            figures.set("eventsPerSecond", static_cast<double>(events - std::min(events, earlier)) / seconds);
        figures.set("wakeUpsPerSecond",
                    static_cast<double>(now.wakeUps - std::min(now.wakeUps, from.wakeUps)) / seconds);
    }
    return figures;
}

std::vector<std::string> topLines(const Value& figures, const Value& status)
{
    const std::string* version = status["version"].asString();
    std::vector<std::string> lines{
        fmt::format("{}, process {}, up for {}", version ? printable(*version) : "", status["pid"].asInt().value_or(0),
                    span(status["uptime"].asDouble().value_or(0))),
        fmt::format("{:.1f} MiB resident, {} wake-ups a second, {} events a second",
                    static_cast<double>(countIn(figures["memory_kib"])) / 1024,
                    figureText(figures["wakeUpsPerSecond"], ""), figureText(figures["eventsPerSecond"], "")),
        "",
        fmt::format("{} {:>8} {:>9} {:>8} {:>11} {:>11}", padded("requests", 16), "a second", "in all", "failed", "p50",
                    "p99")};
    if (const Dictionary* kinds = figures["requests"].asDictionary())
        for (const auto& [kind, figure] : *kinds)
            lines.push_back(fmt::format("{} {:>8} {:>9} {:>8} {:>11} {:>11}", padded("  " + kind, 16),
                                        figureText(figure["perSecond"], ""), countIn(figure["total"]),
                                        countIn(figure["failed"]), figureText(figure["p50_ms"], " ms"),
                                        figureText(figure["p99_ms"], " ms")));
    const auto percent = [](const Value& share) {
        const auto value = share.asDouble();
        return value ? fmt::format("{:.0f} %", *value * 100) : "–";
    };
    lines.emplace_back();
    lines.push_back(fmt::format("answered from memory: {} of searches, {} of images", percent(figures["hitShare"]),
                                percent(figures["imageHitShare"])));
    for (const std::string& line : bookLines(figures["books"])) lines.push_back(line);
    return lines;
}

} // namespace tavrin::ctl
