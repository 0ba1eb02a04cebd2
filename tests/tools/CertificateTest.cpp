#include "tools/shared/Certificate.h"

#include <gtest/gtest.h>

#include "tests/support/TemporaryDirectory.h"

namespace tavrin::tools {
namespace {

using namespace std::chrono_literals;
using platform::test::modeOf;
using platform::test::writeFile;

TEST(Certificate, IsKeptWhileItCanServeForAnotherDay)
{
    const platform::test::TemporaryDirectory temporary;
    const std::filesystem::path directory = temporary / "certificate";
    const platform::Date now = std::chrono::sys_days(std::chrono::year(2024) / 5 / 1);
    CertificateFiles files;
    const auto isMade = [&](platform::Date at, const std::string& address = "127.0.0.1") {
        files = provideCertificate(directory, address, at, 240h).value();
        return files.made;
    };
    EXPECT_TRUE(isMade(now));
    EXPECT_EQ(modeOf(directory), 0700u);
    EXPECT_EQ(modeOf(files.key), 0600u);
    EXPECT_FALSE(isMade(now + 215h));
    EXPECT_TRUE(isMade(now + 217h)) << "23 hours are left";
    EXPECT_TRUE(isMade(now)) << "not valid yet, by a clock that was set back";
    EXPECT_TRUE(isMade(now, "192.0.2.9")) << "another address";
    EXPECT_FALSE(isMade(now, "::1")) << "always covered";
    EXPECT_TRUE(isMade(now, "dev.example"));
    writeFile(files.certificate, "no certificate");
    EXPECT_TRUE(isMade(now));
    std::filesystem::rename(files.key, temporary / "other");
    EXPECT_TRUE(isMade(now)) << "no key";
    std::filesystem::rename(temporary / "other", files.key);
    EXPECT_TRUE(isMade(now)) << "the key of another certificate";
}

} // namespace
} // namespace tavrin::tools
