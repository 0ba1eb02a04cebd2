#include "platform/device/InstalledApplications.h"

#include <gtest/gtest.h>

#include "platform/files/Files.h"
#include "platform/run/RunLoop.h"
#include "tests/support/ByHand.h"
#include "tests/support/TemporaryDirectory.h"

namespace platform {
namespace {

namespace fs = std::filesystem;
using test::writeFile;

constexpr const char* kEntry = "[Desktop Entry]\nType=Application\nName=App\nVersion=1.5\nExec=app\n";

TEST(DesktopEntry, TellsWhetherItIsAnApplicationThatCanBeStarted)
{
    const std::pair<const char*, bool> cases[]{
        {kEntry, true},
        {"# made by hand\r\n[Desktop Entry]\r\nType = Application\r\nHidden=false\r\n", true},
        {"[Desktop Entry]\nType=Application\nNoDisplay=true\n", true},
        {"[Desktop Entry]\nType=Application\nTryExec=there\n", true},
        {"[Desktop Entry]\nType=Application\nTryExec=gone\n", false},
        {"[Desktop Entry]\nType=Application\nHidden=true\n", false},
        {"[Desktop Entry]\nType=Link\nURL=https://a.example\n", false},
        {"[Desktop Entry]\nName=x\n[Desktop Action new]\nType=Application\n", false},
        {"Type=Application\n", false},
        {"[Desktop Entry]\n#Type=Application\n", false},
        {"", false},
        {"[Desktop Entry]\n=\n\0=\nType", false},
    };
    for (const auto& [text, installed] : cases)
        EXPECT_EQ(isInstalledApplication(text, [](const std::string& program) { return program == "there"; }),
                  installed)
            << text;
}

TEST(AppMetadata, TheFirstReleaseHasTheVersion)
{
    const std::pair<std::string, std::optional<std::string>> cases[]{
        {R"(<?xml version="1.0"?><component><id>a</id><releases><release date="2026-01-01" version="2.1"/>
            <release version="2.0"/></releases></component>)",
         "2.1"},
        {R"(<component><releases><release version="1 &amp; more"><broken)", "1 & more"},
        {R"(<component><releases><release/><release version=""/><release version="3"/></releases></component>)", "3"},
        {"<component/>", {}},
        {"", {}},
        {"not xml", {}},
        {R"(<!DOCTYPE c [<!ENTITY v SYSTEM "file:///etc/passwd">]><c>&v;<release version="1"/></c>)", "1"},
        {R"(<component><release version="&undefined;"/></component>)", {}},
    };
    for (const auto& [text, version] : cases) EXPECT_EQ(firstReleaseVersion(text), version) << text;

    std::string bomb = "<!DOCTYPE c [<!ENTITY e0 \"aaaaaaaaaaaaaaaa\">";
    for (int i = 1; i < 30; ++i) {
        const std::string inner = fmt::format("&e{};", i - 1);
        bomb += fmt::format("<!ENTITY e{} \"{}{}{}{}\">", i, inner, inner, inner, inner);
    }
    EXPECT_FALSE(firstReleaseVersion(bomb + "]><c>&e29;<release version=\"1\"/></c>"));
}

struct InstalledApplicationsTest : testing::Test, test::ByHand {
    std::unique_ptr<InstalledApplications> make()
    {
        return makeInstalledApplications(*files, {home.path, system.path, missing}, loop, executor, clock);
    }
    static void add(const test::TemporaryDirectory& directory, const fs::path& path, std::string_view contents)
    {
        fs::create_directories((directory.path / path).parent_path());
        writeFile(directory.path / path, contents);
    }

    test::TemporaryDirectory home, system;
    fs::path missing = home / "no/such/directory";
    std::unique_ptr<FileSystem> files = makeSystemFiles();
    RunLoop loop;
};

TEST_F(InstalledApplicationsTest, TheFirstDirectoryWinsAndBrokenEntriesAreLeftOut)
{
    add(system, "applications/org.example.Mail.desktop", kEntry);
    add(system, "metainfo/org.example.Mail.metainfo.xml", R"(<c><release version="4.2"/></c>)");
    add(system, "applications/old.desktop", kEntry);
    add(system, "appdata/old.appdata.xml", R"(<c><release version="0.9"/></c>)");
    add(system, "applications/kde/konsole.desktop", kEntry);
    add(system, "applications/a/b/c/d/too-deep.desktop", kEntry);
    add(system, "applications/removed.desktop", kEntry);
    add(home, "applications/removed.desktop", "[Desktop Entry]\nType=Application\nHidden=true\n");
    add(system, "applications/huge.desktop", kEntry + std::string(2 << 20, '#'));
    add(system, "applications/readme.txt", kEntry);
    fs::create_directories(system / "applications/folder.desktop");
    add(system, "elsewhere/linked", kEntry);
    fs::create_symlink(system / "elsewhere/linked", system / "applications/linked.desktop");
    fs::create_symlink(system / "gone", system / "applications/dangling.desktop");
    fs::create_symlink("loop.desktop", system / "applications/loop.desktop");

    EXPECT_EQ(make()->applications(),
              (std::vector<InstalledApplication>{
                  {"kde-konsole", "0"}, {"linked", "0"}, {"old", "0.9"}, {"org.example.Mail", "4.2"}}));
}

TEST_F(InstalledApplicationsTest, EveryFolderIsLookedThroughOnce)
{
    add(system, "applications/kde/konsole.desktop", kEntry);
    add(system, "elsewhere/linked.desktop", kEntry);
    for (int i = 0; i < 60; ++i) fs::create_directory_symlink(".", system / fmt::format("applications/self{}", i));
    fs::create_directory_symlink("kde", system / "applications/again");
    fs::create_directory_symlink("..", system / "applications/kde/up");
    fs::create_directory_symlink("../elsewhere", system / "applications/other");
    EXPECT_EQ(make()->applications(), (std::vector<InstalledApplication>{{"kde-konsole", "0"}, {"other-linked", "0"}}));
}

TEST_F(InstalledApplicationsTest, ChangesAreToldOnceTheyHaveSettledAlsoInFoldersThatCome)
{
    int told = 0;
    const auto applications = make();
    const auto turn = [&] {
        for (int i = 0; i < 5; ++i) {
            loop.runOnce(Duration::zero());
            executor.drain();
        }
    };
    applications->onChange([&] { ++told; });
    turn();
    add(home, "applications/zero.desktop", kEntry);
    clock.advance(std::chrono::seconds(2), [] {});
    for (int i = 0; i < 5; ++i) loop.runOnce(Duration::zero());
    EXPECT_EQ(told, 0) << "it is the worker that looks";
    turn();
    EXPECT_EQ(told, 1) << "what came before the watches";

    const auto settle = [&] {
        EXPECT_TRUE(test::runUntil(loop, [&] { return clock.pendingTimers() > 0; }));
        turn(); // the same change, seen in other folders
        const int before = told;
        clock.advance(std::chrono::milliseconds(1999), [] {});
        turn();
        EXPECT_EQ(told, before);
        clock.advance(std::chrono::milliseconds(1), [] {});
        turn();
        EXPECT_EQ(told, before + 1);
        EXPECT_EQ(clock.pendingTimers(), 0u);
    };
    add(home, "applications/one.desktop", kEntry);
    settle();
    fs::create_directories(home / "applications/wine");
    settle();
    add(home, "applications/wine/two.desktop", kEntry);
    settle();
    fs::rename(home / "applications", home / "away");
    settle();
    EXPECT_TRUE(applications->applications().empty());
    add(home, "unrelated", "");
    turn();
    EXPECT_EQ(clock.pendingTimers(), 0u);
}

} // namespace
} // namespace platform
