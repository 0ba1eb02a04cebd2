#include "tools/fleet/Report.h"

#include <algorithm>
#include <cmath>
#include <numeric>

#include <fmt/format.h>

namespace tavrin::fleet {

using namespace std::chrono_literals;

namespace {

std::size_t binsIn(const Traffic& traffic, Duration span)
{
    return static_cast<std::size_t>(span / traffic.bin());
}

/// Returns the highest bin of [begin, end), in requests.
double highest(const Traffic& traffic, std::size_t begin, std::size_t end, std::optional<Kind> kind)
{
    double peak = 0;
    for (std::size_t bin = begin; bin < std::min(end, traffic.size()); ++bin)
        peak = std::max(peak, traffic.requests(bin, kind));
    return peak;
}

double share(double part, double whole)
{
    return whole > 0 ? 100 * part / whole : 0;
}

double over(double value, double divisor)
{
    return divisor > 0 ? value / divisor : 0;
}

std::string hours(Duration span)
{
    const auto minutes = std::chrono::duration_cast<std::chrono::minutes>(span).count();
    return fmt::format("{}:{:02}", minutes / 60, minutes % 60);
}

/// Returns the mean requests a second of [begin, end).
double meanRate(const Traffic& traffic, std::size_t begin, std::size_t end, std::optional<Kind> kind)
{
    double sum = 0;
    for (std::size_t bin = begin; bin < end; ++bin) sum += traffic.requests(bin, kind);
    return over(sum, static_cast<double>(end - begin) * platform::toSeconds(traffic.bin()));
}

} // namespace

Peak peakOf(const Traffic& traffic, const Traffic& usual, const Window& incident, std::optional<Kind> kind)
{
    constexpr std::size_t kSmoothed = 5;
    const std::size_t begin = binsIn(traffic, incident.begin);
    const std::size_t end = binsIn(traffic, incident.end);
    const std::size_t day = binsIn(traffic, 24h);
    Peak peak{.mean = meanRate(usual, begin - day, begin, kind)};
    const double mean = peak.mean * platform::toSeconds(traffic.bin()); // of a bin
    peak.usual = over(highest(usual, begin - day, begin, kind), mean);
    peak.during = over(highest(traffic, begin, end, kind), mean);
    peak.after = over(highest(traffic, end, end + day, kind), mean);
    double excess = 0; // of the last five bins
    double expected = 0;
    for (std::size_t bin = end; bin < traffic.size(); ++bin) {
        const auto differenceIn = [&](std::size_t of) { return traffic.requests(of, kind) - usual.requests(of, kind); };
        excess += differenceIn(bin);
        expected += usual.requests(bin, kind);
        if (bin >= end + kSmoothed) {
            excess -= differenceIn(bin - kSmoothed);
            expected -= usual.requests(bin - kSmoothed, kind);
        }
        const double chance = 5 * std::sqrt(2 * expected); // a difference that chance makes
        if (std::abs(excess) > std::max(0.1 * kSmoothed * mean, chance))
            peak.untilNormal = traffic.bin() * (bin + 1 - end);
    }
    return peak;
}

std::string reportText(const Run& run, const Scenario& scenario, const Traffic& traffic, const Traffic* usual)
{
    const double deviceDays = static_cast<double>(run.devices) * run.days;
    const std::size_t begin = binsIn(traffic, kWarmUp);
    std::string text = fmt::format("{} devices, {} days, scenario {}\n\n", run.devices, run.days, scenario.name);

    text += fmt::format("{:<10}{:>14}{:>14}{:>12}{:>14}{:>16}\n", "requests", "a device-day", "a second", "peak/mean",
                        "bytes up/day", "bytes down/day");
    double up = 0, down = 0;
    const auto line = [&](std::string_view name, std::optional<Kind> kind, double bytesUp, double bytesDown) {
        const double mean = meanRate(traffic, begin, traffic.size(), kind);
        const double peak = highest(traffic, begin, traffic.size(), kind) / platform::toSeconds(traffic.bin());
        text += fmt::format("{:<10}{:>14.2f}{:>14.1f}{:>12.2f}{:>14.0f}{:>16.0f}\n", name,
                            mean * 86400 / static_cast<double>(run.devices), mean, over(peak, mean),
                            bytesUp / deviceDays, bytesDown / deviceDays);
    };
    for (std::size_t i = 0; i < kKinds.size(); ++i) {
        const Traffic::Total& total = traffic.total(static_cast<Kind>(i));
        line(kKinds[i], static_cast<Kind>(i), total.up, total.down);
        up += total.up;
        down += total.down;
    }
    line("all", {}, up, down);

    const auto number = [](std::uint64_t count) { return static_cast<double>(count); };
    text += fmt::format("\nvisits a device-day {:.2f}, queries {:.2f}, keys that ask for a search {:.1f}\n",
                        number(traffic.visits) / deviceDays, number(traffic.queries) / deviceDays,
                        number(traffic.keys) / deviceDays);
    text += fmt::format("the query cache answers {:.1f} % of the keys; the HTTP cache has {:.1f} % of the images; "
                        "{:.1f} % of the resources are confirmed, not sent\n",
                        share(number(traffic.hits), number(traffic.keys)),
                        share(number(traffic.keptImages), number(traffic.images)),
                        share(number(traffic.confirmed), number(traffic.total(Kind::Resource).requests)));
    text += fmt::format("sessions {}: sent {}, lost {}, expired {}, waiting {}\n", traffic.sessions, traffic.sent,
                        traffic.lost, traffic.expired, traffic.waiting);

    if (usual) {
        text += fmt::format("\n{:<10}{:>14}{:>14}{:>14}{:>14}{:>16}\n", "incident", "mean a second", "usual peak",
                            "peak during", "peak after", "normal after");
        for (std::size_t i = 0; i <= kKinds.size(); ++i) {
            const auto kind = i < kKinds.size() ? std::optional(static_cast<Kind>(i)) : std::nullopt;
            const Peak peak = peakOf(traffic, *usual, scenario.incident, kind);
            text += fmt::format("{:<10}{:>14.1f}{:>14.2f}{:>14.2f}{:>14.2f}{:>16}\n", kind ? kKinds[i] : "all",
                                peak.mean, peak.usual, peak.during, peak.after, hours(peak.untilNormal));
        }
        text += "Peaks are multiples of the mean of the day before; normal after: hours and minutes.\n";
    }
    text +=
        fmt::format("\nsimulated in {:.1f} s of CPU time, {:.2f} µs a device-day, {:.0f} MB\n", run.processorSeconds,
                    1e6 * over(run.processorSeconds, number(run.deviceDays)), run.peakMemory / 1e6);
    return text;
}

std::string csv(const Traffic& traffic, const Traffic* usual)
{
    const double seconds = platform::toSeconds(traffic.bin());
    std::string text = "hours";
    for (const std::string_view kind : kKinds) text += fmt::format(",{}", kind);
    text += ",refused,all,usual\n";
    const std::size_t begin = binsIn(traffic, kWarmUp);
    for (std::size_t bin = begin; bin < traffic.size(); ++bin) {
        text += fmt::format("{:.4f}", static_cast<double>(bin - begin) * seconds / 3600);
        for (const std::uint32_t count : traffic.answered(bin)) text += fmt::format(",{:.4g}", count / seconds);
        const auto& refused = traffic.refused(bin);
        text +=
            fmt::format(",{:.4g},{:.4g},{:.4g}\n", std::accumulate(refused.begin(), refused.end(), 0.0) / seconds,
                        traffic.requests(bin, {}) / seconds, (usual ? *usual : traffic).requests(bin, {}) / seconds);
    }
    return text;
}

} // namespace tavrin::fleet
