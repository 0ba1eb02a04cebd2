#pragma once

#include <algorithm>
#include <cstdlib>
#include <map>
#include <string>
#include <vector>

#include <fmt/format.h>
#include <gtest/gtest.h>

#include "tests/power/RecordedDisk.h"

namespace platform::test {

/// A moment at which the power goes, or the process is killed.
struct Cut {
    std::size_t calls; ///< that were made before
    bool isKill;       ///< the device goes on: nothing is lost
    std::string name;  ///< for messages
};

/// Which cuts to try. Few become all if the environment has POWER_CUTS, the number of choices by chance.
enum class Cuts {
    All, ///< between any two calls, with each kind of luck, by chance twice; without each of the last three unsynced
         ///< changes of a directory, and with it alone
    Few, ///< before each sync and change of a directory; nothing survives, everything, all names, all but one of the
         ///< last two changes
};

/// Cuts the power in a finished life. Calls `look`, which starts the stores on what is left, once for each disk that
/// differs, and `judge` with every cut and what was found there. Ends with the first failure. Prints how many there
/// were.
template <class Look, class Judge> void afterEachCut(const RecordedDisk& disk, Cuts which, Look look, Judge judge)
{
    using Luck = RecordedDisk::Luck;
    using Kind = Luck::Kind;
    const char* asked = std::getenv("POWER_CUTS");
    const bool all = which == Cuts::All || asked;
    const unsigned seeds = asked ? static_cast<unsigned>(std::strtoul(asked, nullptr, 10)) : all ? 2 : 0;
    std::map<std::size_t, decltype(look())> found; // by the disk's hash
    std::size_t moments = 0;
    for (std::size_t calls = 0; calls <= disk.calls(); ++calls) {
        if (!all && disk.changesContents(calls)) continue;
        ++moments;
        std::vector<Luck> lucks{{Kind::Nothing, 0}, {Kind::Everything, 0}, {Kind::Names, 0}};
        if (all) lucks.insert(lucks.end(), {{Kind::NamesAndSizes, 0}, {Kind::Contents, 0}});
        for (unsigned change = 0; change < std::min<std::size_t>(disk.atStake(calls), all ? 3 : 2); ++change) {
            lucks.push_back({Kind::AllBut, change});
            if (all) lucks.push_back({Kind::Only, change});
        }
        for (unsigned seed = 0; seed < seeds; ++seed) lucks.push_back({Kind::Chance, seed});
        for (const Luck& luck : lucks) {
            const RecordedDisk::Image image = disk.after(calls, luck);
            std::size_t hash = image.size();
            for (const auto& [name, contents] : image)
                for (const std::string* text : {&name, contents ? &*contents : &name})
                    hash = hash * 1'000'003 + std::hash<std::string>()(*text);
            auto known = found.find(hash);
            if (known == found.end()) {
                disk.put(image);
                known = found.emplace(hash, look()).first;
            }
            judge(Cut{calls, luck.kind == Kind::Everything,
                      fmt::format("cut before call {} ({}), luck {} {}", calls, disk.describe(calls),
                                  static_cast<int>(luck.kind), luck.number)},
                  known->second);
            if (testing::Test::HasFailure()) return;
        }
    }
    fmt::print("{} moments, {} different disks\n", moments, found.size());
}

} // namespace platform::test
