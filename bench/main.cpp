// tavrin-bench: figures of the daemon, each beside what it is compared with, as ratios within one run.
// docs/performance.md has a run, and says how it was made.

#include <cstdio>
#include <cstring>
#include <string_view>

#include <fmt/format.h>

#include "bench/Support.h"

int main(int argc, char** argv)
{
    using namespace tavrin::bench;
    static constexpr struct {
        std::string_view name;
        std::vector<Row> (*run)();
    } kBenchmarks[] = {{"ipc", ipc},       {"search", search},   {"start", startUp},
                       {"memory", memory}, {"waiters", waiters}, {"idle", idle},     {"tree", cacheTree}};

    const auto wanted = [&](std::string_view name) {
        for (int i = 1; i < argc; ++i)
            if (name == argv[i]) return true;
        return argc == 1;
    };
    bool met = true;
    std::vector<Row> rows;
    for (const auto& benchmark : kBenchmarks) {
        if (!wanted(benchmark.name)) continue;
        for (Row& row : benchmark.run()) rows.push_back(std::move(row));
    }
    if (rows.empty()) {
        std::fputs("usage: tavrin-bench [ipc] [search] [start] [memory] [waiters] [idle] [tree]\n", stderr);
        return 2;
    }
    std::puts("| What | Ours | Beside | Figure | At most |\n|---|---|---|---|---|");
    for (const Row& row : rows) {
        const bool ok = row.figure <= row.limit;
        met = met && ok;
        std::puts(fmt::format("| {} | {} | {} | {:.2f} {}{} | {:g} {} |", row.what, row.ours,
                              row.beside.empty() ? "–" : row.beside, row.figure, row.unit, ok ? "" : " **missed**",
                              row.limit, row.unit)
                      .c_str());
    }
    return met ? 0 : 1;
}
