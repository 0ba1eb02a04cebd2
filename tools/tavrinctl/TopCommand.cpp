// tavrinctl top: live figures of the daemon, on the terminal or as JSON.

#include <chrono>
#include <deque>
#include <filesystem>
#include <fstream>
#include <unistd.h>

#include <CLI/CLI.hpp>
#include <fmt/format.h>

#include "platform/values/Dictionary.h"
#include "platform/values/Json.h"
#include "tools/shared/CommandLine.h"
#include "tools/tavrinctl/Characters.h"
#include "tools/tavrinctl/Commands.h"
#include "tools/tavrinctl/Terminal.h"
#include "tools/tavrinctl/Top.h"

namespace tavrin::ctl {

using platform::Value;

namespace {

constexpr double kWindow = 60; // seconds over which rates and latencies are taken

/// Returns the number after "NAME:" in a file of /proc; 0 if there is none.
std::uint64_t procNumber(const std::filesystem::path& file, const std::string& name)
{
    std::ifstream lines(file);
    for (std::string line; std::getline(lines, line);)
        if (line.starts_with(name + ":")) return std::strtoull(line.c_str() + name.size() + 1, nullptr, 10);
    return 0;
}

TopSample takeSample(TAVClient& client)
{
    TopSample sample;
    sample.time = std::chrono::duration<double>(std::chrono::steady_clock::now().time_since_epoch()).count();
    sample.status = valueOf(client.status());
    sample.figures = valueOf(client.figures());
    const auto process = std::filesystem::path("/proc") / std::to_string(sample.status["pid"].asInt().value_or(0));
    sample.memory = procNumber(process / "status", "VmRSS");
    std::error_code ignored;
    for (const auto& thread : std::filesystem::directory_iterator(process / "task", ignored))
        sample.wakeUps += procNumber(thread.path() / "status", "voluntary_ctxt_switches");
    return sample;
}

struct TopOptions {
    double interval = 1; // seconds
    std::uint64_t count = 0;
};

void top(const Options& options, const TopOptions& mine)
{
    const auto client = connect(options);
    const bool onScreen = !options.json && isatty(STDIN_FILENO) == 1 && isatty(STDOUT_FILENO) == 1;
    std::unique_ptr<Terminal> terminal;
    if (onScreen)
        terminal = std::make_unique<Terminal>();
    else
        endOnSignal();

    std::deque<TopSample> samples{takeSample(*client)};
    bool ended = false;
    const auto readKeys = [&] {
        const Terminal::Input input = terminal->read();
        ended =
            ended || input.ended || input.signal != 0 || input.keys.find_first_of("qQ\x03\x04") != std::string::npos;
        return ended;
    };
    for (std::uint64_t shown = 0; mine.count == 0 || shown < mine.count; ++shown) {
        client->wait([&] { return terminal && readKeys(); }, platform::durationFromSeconds(mine.interval),
                     terminal ? terminal->descriptor() : -1);
        if (ended) return;
        samples.push_back(takeSample(*client));
        while (samples.size() > 2 && samples.back().time - samples.front().time > kWindow) samples.pop_front();
        const Value figures = topFigures(samples.front(), samples.back());
        if (options.json) {
            printLine(platform::toJson(figures));
            continue;
        }
        std::vector<std::string> lines = topLines(figures, samples.back().status);
        if (!terminal) {
            for (const std::string& line : lines) printLine(line);
            continue;
        }
        lines.emplace_back();
        lines.emplace_back("Rates and latencies are of the last minute. q ends.");
        ScreenFrame frame;
        const ScreenSize size = terminal->size();
        for (int row = 0; row < size.rows; ++row)
            frame.lines.push_back({static_cast<std::size_t>(row) < lines.size()
                                       ? clipped(lines[static_cast<std::size_t>(row)], size.columns)
                                       : ""});
        terminal->show(drawn(frame, colours()));
    }
}

} // namespace

void addTopCommand(CLI::App& app, Command& chosen)
{
    auto options = std::make_shared<TopOptions>();
    CLI::App* command = app.add_subcommand("top", "Show live figures: requests, latencies, hits, events, memory");
    tools::takesNumber(command->add_option("--interval", options->interval, "Time between two looks, in seconds")
                           ->capture_default_str(),
                       "SECONDS", 0.1, 3600);
    tools::takesWholeNumber(
        command->add_option("--count", options->count, "End after this many; 0 never ends")->capture_default_str(),
        "COUNT", 0, 1e15);
    command->footer(
        "With --json each line is one look. Without a terminal the figures are printed one below the other.");
    command->callback([&chosen, options] { chosen = [options](const Options& common) { top(common, *options); }; });
}

} // namespace tavrin::ctl
