// tavrin-bench: figures of the daemon, each beside what it is compared with, as ratios within one run.
// docs/performance.md has a run, and says how it was made.

#include <algorithm>
#include <cmath>
#include <cstdio>
#include <span>
#include <string_view>

#include <fmt/format.h>

#include "bench/Support.h"

int main(int argc, char** argv)
{
    using namespace tavrin::bench;
    static constexpr struct {
        std::string_view name;
        std::vector<Row> (*run)();
        bool onRequestOnly = false;
    } kBenchmarks[] = {{"ipc", ipc},
                       {"search", search},
                       {"images", images},
                       {"hit", hit},
                       {"typing", typing},
                       {"start", startUp},
                       {"memory", memory},
                       {"waiters", waiters},
                       {"idle", idle},
                       {"tree", cacheTree},
                       {"http", httpCache},
                       {"signature", signature},
                       {"filter", lookupFilter},
                       {"append", append},
                       {"archive", archive},
                       {"flush", flush},
                       {"sizes", flushGrowth},
                       {"events", events},
                       {"growth", growth},
                       {"million", millionEvents, true}};

    const std::span arguments(argv + 1, argv + argc);
    const auto wanted = [&](const auto& benchmark) {
        if (arguments.empty()) return !benchmark.onRequestOnly;
        return std::ranges::any_of(arguments, [&](const char* name) { return benchmark.name == name; });
    };
    bool met = true;
    std::vector<Row> rows;
    for (const auto& benchmark : kBenchmarks) {
        if (!wanted(benchmark)) continue;
        for (Row& row : benchmark.run()) rows.push_back(std::move(row));
    }
    if (rows.empty()) {
        std::fputs("usage: tavrin-bench [NAME…], of", stderr);
        for (const auto& benchmark : kBenchmarks) std::fprintf(stderr, " %s", benchmark.name.data());
        std::fputs("\nwithout names: all but million\n", stderr);
        return 2;
    }
    std::puts("| What | Ours | Beside | Figure | At most |\n|---|---|---|---|---|");
    for (const Row& row : rows) {
        const bool ok = row.figure <= row.limit;
        met = met && ok;
        std::puts(fmt::format("| {} | {} | {} | {:.2f} {}{} | {} |", row.what, row.ours,
                              row.beside.empty() ? "–" : row.beside, row.figure, row.unit, ok ? "" : " **missed**",
                              std::isfinite(row.limit) ? fmt::format("{:g} {}", row.limit, row.unit) : "–")
                      .c_str());
    }
    return met ? 0 : 1;
}
