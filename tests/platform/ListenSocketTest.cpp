#include "platform/ipc/ListenSocket.h"

#include <cstdlib>
#include <filesystem>
#include <unistd.h>

#include <gtest/gtest.h>

#include "tests/support/TemporaryDirectory.h"

namespace platform::ipc {
namespace {

TEST(ListenSocket, TakesOverFromTheDeadOnly)
{
    platform::test::TemporaryDirectory temporary;
    const std::filesystem::path directory = temporary.path.string() + "/a/b";
    const auto path = directory / "socket";
    const auto errorOf = [&] { return ListenSocket::bindExclusive(path).error().code; };
    {
        auto living = ListenSocket::bindExclusive(path);
        ASSERT_TRUE(living) << living.error().description();
        EXPECT_EQ(platform::test::modeOf(directory), 0700u);
        EXPECT_EQ(platform::test::modeOf(path), 0600u);
        EXPECT_EQ(errorOf(), EADDRINUSE);
        std::filesystem::remove(directory / "socket.lock"); // as with a socket of the service manager
        EXPECT_EQ(errorOf(), EADDRINUSE);
        std::filesystem::create_hard_link(path, directory / "endpoint-dead");
    }
    EXPECT_FALSE(std::filesystem::exists(path));
    std::filesystem::create_hard_link(directory / "endpoint-dead", path);
    {
        auto living = ListenSocket::bindUnguessable(directory, "endpoint-");
        sweepDeadSockets(directory, "endpoint-");
        EXPECT_TRUE(living && std::filesystem::exists(living->path()));
        EXPECT_FALSE(std::filesystem::exists(directory / "endpoint-dead"));
        EXPECT_TRUE(ListenSocket::bindExclusive(path)) << "replaces a dead one";
    }
    std::fclose(std::fopen(path.c_str(), "w"));
    EXPECT_EQ(errorOf(), EEXIST);
    std::filesystem::create_directory_symlink(directory, temporary.path.string() + "/link");
    EXPECT_FALSE(preparePrivateDirectory(temporary.path.string() + "/link"));
    EXPECT_EQ(busAddress("/run/a b%"), "unix:path=/run/a%20b%25");
}

TEST(ListenSocket, ComesFromTheServiceManagerWhereThereIsOne)
{
    testing::FLAGS_gtest_death_test_style = "threadsafe";
    const auto activated = [] {
        platform::test::TemporaryDirectory temporary;
        auto passed = std::move(*ListenSocket::bindExclusive(temporary.path.string() + "/managed"));
        dup2(passed.fd(), 3);
        setenv("LISTEN_PID", std::to_string(getpid()).c_str(), 1);
        setenv("LISTEN_FDS", "1", 1);
        auto taken = ListenSocket::fromServiceManager();
        const bool right = taken && taken->fd() == 3 && taken->path() == passed.path();
        taken.reset();
        std::exit(right && std::filesystem::exists(passed.path()) ? 0 : 1);
    };
    EXPECT_EXIT(activated(), testing::ExitedWithCode(0), "");
}

} // namespace
} // namespace platform::ipc
