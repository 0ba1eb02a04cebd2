// tavrin-fleet: simulates many devices with the daemon's own policies, and reports what a service sees of them.

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <optional>
#include <sys/resource.h>
#include <unistd.h>

#include <CLI/CLI.hpp>
#include <fmt/format.h>

#include "platform/base/Log.h"
#include "platform/files/Files.h"
#include "tools/fleet/Report.h"
#include "tools/fleet/SimulatedDevice.h"
#include "tools/shared/CommandLine.h"

namespace tavrin::fleet {

namespace {

constexpr std::size_t kLargestCorpus = 16 << 20;
constexpr std::size_t kVisits = 2000; ///< different ones

struct Options {
    std::uint64_t devices = 100'000;
    int days = 7;
    std::string scenario = "week";
    std::uint64_t seed = 1;
    std::string zones = "world";
    int binSeconds = 60;
    std::string corpus = TAVRIN_CORPUS;
    std::string csv;
    Assumptions assumptions;
};

[[noreturn]] void fail(const std::string& what)
{
    fmt::print(stderr, "tavrin-fleet: {}\n", what);
    std::exit(tools::kFailed);
}

double processorSeconds()
{
    rusage usage{};
    getrusage(RUSAGE_SELF, &usage);
    const auto seconds = [](const timeval& time) {
        return static_cast<double>(time.tv_sec) + static_cast<double>(time.tv_usec) * 1e-6;
    };
    return seconds(usage.ru_utime) + seconds(usage.ru_stime);
}

double peakMemory()
{
    rusage usage{};
    getrusage(RUSAGE_SELF, &usage);
    return static_cast<double>(usage.ru_maxrss) * 1024;
}

int run(const Options& options)
{
    platform::Log::threshold = platform::LogLevel::Fault;
    const auto bytes = platform::makeSystemFiles()->read(tools::resolved(options.corpus), kLargestCorpus);
    if (!bytes) fail(fmt::format("{}: {}; name the corpus with --corpus", options.corpus, bytes.error().reason()));
    const auto corpus = replay::parseCorpus(bytes->view());
    if (!corpus) fail(fmt::format("{}: {}", options.corpus, corpus.error().reason()));
    if (corpus->empty()) fail(options.corpus + ": the corpus has no queries");

    const Typing typing(*corpus, options.assumptions, kVisits);
    const World world(options.assumptions, typing, *zonesNamed(options.zones), options.days);
    const Scenario week = *scenarioNamed("week", options.days, 0);
    const Scenario scenario = *scenarioNamed(options.scenario, options.days, busiestHour(world.zones, world.curve));
    const bool compares = scenario.incident.begin > Duration::zero();
    const auto bin = std::chrono::seconds(options.binSeconds);
    Traffic traffic(world.end, bin);
    std::optional<Traffic> usual;
    if (compares) usual.emplace(world.end, bin);

    const bool showsProgress = isatty(STDERR_FILENO) == 1;
    const double before = processorSeconds();
    for (std::uint64_t device = 0; device < options.devices; ++device) {
        const std::uint64_t seed = mixed(options.seed * 0x9e3779b97f4a7c15 + device);
        SimulatedDevice(world, scenario, seed, traffic).run();
        if (usual) SimulatedDevice(world, week, seed, *usual).run();
        if (showsProgress && device % 1000 == 999)
            fmt::print(stderr, "\r{} of {} devices ", device + 1, options.devices);
    }
    if (showsProgress) fmt::print(stderr, "\n");

    const auto simulatedDays = static_cast<std::uint64_t>(options.days + 1) * (usual ? 2 : 1);
    const Run done{.devices = options.devices,
                   .days = options.days,
                   .processorSeconds = processorSeconds() - before,
                   .peakMemory = peakMemory(),
                   .deviceDays = options.devices * simulatedDays};
    const Traffic* compared = usual ? &*usual : nullptr;
    std::string problem = tools::writeTo(stdout, reportText(done, scenario, traffic, compared));
    if (!options.csv.empty()) {
        std::FILE* file = std::fopen(options.csv.c_str(), "w");
        if (!file) fail(fmt::format("{}: {}", options.csv, std::strerror(errno)));
        problem += tools::writeTo(file, csv(traffic, compared));
        if (std::fclose(file) != 0) problem += std::strerror(errno);
    }
    if (!problem.empty()) fail(problem);
    return EXIT_SUCCESS;
}

std::string scenarioHelp()
{
    std::string text = "\nScenarios:\n";
    for (const ScenarioName& scenario : scenarioNames())
        text += fmt::format("  {:<20}{}\n", scenario.name, scenario.help);
    return text;
}

} // namespace
} // namespace tavrin::fleet

int main(int argc, char** argv)
{
    using namespace tavrin::fleet;
    namespace tools = tavrin::tools;
    Options options;
    CLI::App app("Simulates a fleet of devices with the daemon's own policies, and reports the requests that a service "
                 "receives. The result depends on the options alone.");
    app.set_version_flag("--version", "tavrin-fleet " TAVRIND_VERSION);
    tools::useReadableHelp(app);
    tools::takesWholeNumber(app.add_option("-n,--devices", options.devices, "Devices")->capture_default_str(), "COUNT",
                            1, 1e8);
    tools::takesWholeNumber(
        app.add_option("--days", options.days, "Measured days, after one that isn't")->capture_default_str(), "DAYS", 2,
        60);
    std::vector<std::string> names;
    for (const ScenarioName& scenario : scenarioNames()) names.emplace_back(scenario.name);
    app.add_option("-s,--scenario", options.scenario, "What happens; see below")
        ->capture_default_str()
        ->type_name("NAME")
        ->check([names](const std::string& name) {
            if (std::ranges::find(names, name) != names.end()) return std::string();
            return fmt::format("no scenario \"{}\"{}", name, tools::didYouMean(name, names));
        });
    tools::takesWholeNumber(
        app.add_option("--seed", options.seed, "Another seed makes another fleet")->capture_default_str(), "NUMBER", 0,
        1e15);
    app.add_option("--zones", options.zones, "Time zones of the devices: world or one")
        ->capture_default_str()
        ->type_name("NAME")
        ->check([](const std::string& name) {
            return zonesNamed(name) ? std::string() : fmt::format("no zones \"{}\"; there are world and one", name);
        });
    tools::takesWholeNumber(
        app.add_option("--bin", options.binSeconds, "Width of the bins in which requests are counted, in seconds")
            ->capture_default_str(),
        "SECONDS", 1, 3600);
    app.add_option("--csv", options.csv, "Write the requests of each kind in each bin to this file")->type_name("FILE");
    app.add_option("--corpus", options.corpus, "What users type, in the form of tools/replay/corpus.txt")
        ->type_name("FILE");
    for (const Assumption& assumption : assumptions())
        tools::takesNumber(app.add_option("--" + std::string(assumption.option), options.assumptions.*assumption.value,
                                          std::string(assumption.help))
                               ->capture_default_str()
                               ->group("Assumptions"),
                           "NUMBER", assumption.low, assumption.high);
    app.footer(scenarioHelp());
    try {
        app.parse(argc, argv);
    } catch (const CLI::ParseError& error) {
        return tools::endOfParsing(app, error, "tavrin-fleet");
    }
    return run(options);
}
