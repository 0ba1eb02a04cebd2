#include "tools/devserver/Certificate.h"

#include <fstream>
#include <sstream>
#include <stdlib.h>
#include <sys/stat.h>

#include <gtest/gtest.h>

namespace devserver {
namespace {

using namespace std::chrono_literals;

std::string contents(const std::filesystem::path& path)
{
    std::ifstream file(path);
    std::ostringstream text;
    text << file.rdbuf();
    return text.str();
}

unsigned mode(const std::filesystem::path& path)
{
    struct stat info{};
    return stat(path.c_str(), &info) == 0 ? info.st_mode & 0777 : 0;
}

class CertificateTest : public testing::Test {
protected:
    CertificateTest()
    {
        std::string name = (std::filesystem::temp_directory_path() / "devserver_XXXXXX").string();
        directory = std::filesystem::path(mkdtemp(name.data())) / "certificate";
    }
    ~CertificateTest() override { std::filesystem::remove_all(directory.parent_path()); }

    CertificateFiles provide(platform::Date now, const std::string& address = "127.0.0.1")
    {
        const auto files = provideCertificate(directory, address, now, 240h);
        EXPECT_TRUE(files) << files.error();
        return files.value_or(CertificateFiles{});
    }

    std::filesystem::path directory;
    const platform::Date now = std::chrono::sys_days(std::chrono::year(2024) / 5 / 1);
};

TEST_F(CertificateTest, IsKeptWhileItIsValidForAnotherDay)
{
    const CertificateFiles files = provide(now);
    EXPECT_TRUE(files.made);
    EXPECT_EQ(mode(directory), 0700u);
    EXPECT_EQ(mode(files.certificate), 0600u);
    EXPECT_EQ(mode(files.key), 0600u);
    const std::string first = contents(files.certificate);
    EXPECT_FALSE(provide(now + 215h).made);
    EXPECT_EQ(contents(files.certificate), first);
    EXPECT_TRUE(provide(now + 217h).made) << "23 hours are left";
    EXPECT_NE(contents(files.certificate), first);
    EXPECT_TRUE(provide(now).made) << "not valid yet, by a clock that was set back";
}

TEST_F(CertificateTest, IsMadeAnewWhereItCannotServe)
{
    const CertificateFiles files = provide(now);
    EXPECT_TRUE(provide(now, "192.0.2.9").made) << "another address";
    EXPECT_FALSE(provide(now, "192.0.2.9").made);
    EXPECT_FALSE(provide(now, "::1").made) << "always covered";
    EXPECT_TRUE(provide(now, "dev.example").made);
    std::filesystem::remove(files.key);
    EXPECT_TRUE(provide(now).made) << "no key";
    std::ofstream(files.certificate) << "no certificate";
    EXPECT_TRUE(provide(now).made) << "damaged";
    const std::string other = contents(files.key);
    std::filesystem::remove(files.certificate);
    provide(now);
    std::ofstream(files.key) << other;
    EXPECT_TRUE(provide(now).made) << "the key of another certificate";
}

TEST_F(CertificateTest, AnUnusableDirectoryIsAnErrorThatNamesIt)
{
    std::ofstream(directory) << "a file";
    const auto files = provideCertificate(directory, "127.0.0.1", now);
    ASSERT_FALSE(files);
    EXPECT_NE(files.error().find(directory.string()), std::string::npos) << files.error();
}

} // namespace
} // namespace devserver
