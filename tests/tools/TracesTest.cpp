#include "CoreTavrin/Traces.h"

#include <fstream>

#include <fmt/format.h>
#include <gmock/gmock.h>

#include "CoreTavrin/TAVSettings.h"
#include "platform/files/Files.h"
#include "tests/support/TemporaryDirectory.h"

namespace tavrin::test {
namespace {

namespace fs = std::filesystem;

constexpr const char* kMarker = "MARKER-of-a-user";

/// A home in which everything that the daemon and others keep has the marker, in its contents or in its name.
struct TracesTest : testing::Test {
    TracesTest()
    {
        for (const char* file : {"session.3", "bag.plist", "TAVQIFeatures", "http/index.db", "http/1.body"})
            write(directories.caches / service / file);
        for (const char* file : {"counters.json", "feedback-books.json", "activities.json", "privacy/ledger",
                                 "privacy/reports.json", "transfers/session/transfers.db", "transfers/session/1.body"})
            write(directories.state / service / file);
        for (const char* file : {"knowledge/app-activities.db", "data-detectors/2.source"})
            write(directories.data / service / file);
        write(directories.temporary / "flusher_ABCDEF");
        write(directories.temporary / "background-transfers-6F9619FF-8B86-D011-B42D-00C04FC964FF" / "1.body");
        write(directories.config / "com.quorvane.tavrind.json.corrupt");
        std::string settings = "{\"TAVBagURL\": \"https://kept.example\"";
        for (const KnownSetting& setting : knownSettings())
            if (setting.isDaemons)
                settings += fmt::format(", \"{}\": \"{}\"", setting.key.substr(0, setting.key.find("…")), kMarker);
        settings += "}";
        write(directories.config / "com.quorvane.tavrind.json", settings);
        write(directories.config / "com.quorvane.lookup.shared.json", "{\"LookupSuggestionsDisabled\": true}");
    }
    static void write(const fs::path& path, const std::string& contents = kMarker)
    {
        fs::create_directories(path.parent_path());
        std::ofstream(path) << contents;
    }
    /// The files with the marker.
    [[nodiscard]] std::vector<std::string> marked() const
    {
        std::vector<std::string> found;
        for (const auto& file : fs::recursive_directory_iterator(temporary / "")) {
            if (!file.is_regular_file()) continue;
            std::ifstream stream(file.path());
            const std::string contents(std::istreambuf_iterator<char>(stream), {});
            if (contents.contains(kMarker)) found.push_back(file.path().string());
        }
        return found;
    }

    const platform::test::TemporaryDirectory temporary;
    const char* service = "com.quorvane.tavrind";
    const platform::Directories directories{.caches = temporary / "caches",
                                            .config = temporary / "config",
                                            .state = temporary / "state",
                                            .data = temporary / "data",
                                            .temporary = temporary / "tmp"};
};

TEST_F(TracesTest, NothingOfAUserIsLeft)
{
    ASSERT_GE(marked().size(), 16u);
    const fs::path& shared = directories.temporary;
    const std::vector<fs::path> kept{directories.config / service / "device.json", shared / "flusher",
                                     shared / "flusher_notes", shared / "flusher_ABCDE1" / "file",
                                     shared / "background-transfers-of-mine" / "file"};
    for (const fs::path& path : kept) write(path, "{}");
    const auto isKept = [](const fs::path& path) { return fs::exists(path); };
    EXPECT_THAT(removeTraces(directories, false), testing::IsEmpty());
    EXPECT_THAT(marked(), testing::IsEmpty());
    EXPECT_THAT(kept, testing::Each(testing::ResultOf(isKept, true))) << "they are others'";
    std::ifstream settings(directories.config / "com.quorvane.tavrind.json");
    EXPECT_THAT(std::string(std::istreambuf_iterator<char>(settings), {}), testing::HasSubstr("https://kept.example"));

    EXPECT_THAT(removeTraces(directories, true), testing::IsEmpty());
    EXPECT_FALSE(fs::exists(directories.config / "com.quorvane.tavrind.json"));
    EXPECT_FALSE(fs::exists(directories.config / "com.quorvane.lookup.shared.json"));
    EXPECT_THAT(kept, testing::Each(testing::ResultOf(isKept, true)));
    EXPECT_THAT(removeTraces(directories, true), testing::IsEmpty()) << "with nothing there";
}

TEST_F(TracesTest, WhatStaysIsReportedAndNoLinkIsFollowed)
{
    const fs::path elsewhere = temporary / "elsewhere";
    write(elsewhere / "file", "theirs");
    fs::create_directory_symlink(elsewhere, directories.caches / service / "link");
    fs::remove_all(directories.state / service);
    fs::create_directory_symlink(elsewhere, directories.state / service);
    write(directories.config / "com.quorvane.lookup.shared.json", "{");
    EXPECT_THAT(removeTraces(directories, false),
                testing::ElementsAre(testing::HasSubstr("was a symbolic link"), testing::HasSubstr("lookup.shared")));
    EXPECT_TRUE(fs::exists(elsewhere / "file"));
    EXPECT_FALSE(fs::exists(fs::symlink_status(directories.state / service)));
}

} // namespace
} // namespace tavrin::test
