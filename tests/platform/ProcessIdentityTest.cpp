#include "platform/device/ProcessIdentity.h"

#include <unistd.h>

#include <gtest/gtest.h>

namespace platform {
namespace {

TEST(Process, ReadsTheApplicationFromItsSandboxOrUnit)
{
    EXPECT_EQ(flatpakName("[Application]\nname=org.example.App\nruntime=x\n"), "org.example.App");
    EXPECT_EQ(flatpakName("[Other]\nname=a\n[Application]\nruntime=x"), std::nullopt);
    EXPECT_EQ(flatpakName("name=early\n[Application]\nname=\nname=late"), "late");
    const std::pair<const char*, std::optional<std::string>> units[]{
        {"app-gnome-org.example.App-1234.scope", "org.example.App"},
        {"app-org.example.App-1234.scope", "org.example.App"},
        {"app-org.example.App@12ab.service", "org.example.App"},
        {"app-flatpak-org.example.My\\x2dApp-9.scope", "org.example.My-App"},
        {"session-2.scope", std::nullopt},
        {"app-.slice", std::nullopt},
        {"app-.service", std::nullopt}};
    for (const auto& [unit, id] : units) EXPECT_EQ(applicationOfUnit(unit), id) << unit;
}

TEST(Process, FindsExecutablesOfLivingProcessesOnly)
{
    const auto processes = makeProcessIdentity();
    EXPECT_TRUE(processes->executablePath(getpid())->ends_with("/platform_tests"));
    EXPECT_EQ(processes->executablePath(-1).error().code, ENOENT);
    EXPECT_EQ(processes->applicationId(-1), std::nullopt);
}

} // namespace
} // namespace platform
