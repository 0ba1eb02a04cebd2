#include "platform/device/MemoryPressure.h"

#include <fcntl.h>
#include <sys/socket.h>

#include <gtest/gtest.h>

#include "platform/device/MemoryPressurePsi.h"
#include "platform/run/RunLoop.h"
#include "tests/support/TemporaryDirectory.h"

namespace platform {
namespace {

using test::runUntil;

/// A socket in the kernel's place: out-of-band data shows as what a trigger that fires does.
struct MemoryPressureTest : testing::Test {
    Result<FileHandle> open()
    {
        ++opened;
        int ends[2]{-1, -1};
        EXPECT_EQ(socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends), 0);
        kernel = FileHandle(ends[0]);
        trigger = ends[1];
        return FileHandle(trigger);
    }
    bool released() const { return fcntl(trigger, F_GETFD) < 0; }

    int opened = 0;
    FileHandle kernel;
    int trigger = -1;
    RunLoop loop;
    std::unique_ptr<MemoryPressure> pressure = makeMemoryPressure(loop, [this] { return open(); });
};

TEST_F(MemoryPressureTest, IsWatchedOnlyWhileSomeoneAsks)
{
    loop.runOnce({});
    EXPECT_EQ(opened, 0);
    int first = 0;
    int second = 0;
    auto one = pressure->watch([&] { ++first; });
    decltype(one) two;
    two = pressure->watch([&] {
        ++second;
        two.reset(); // as a cache does that has nothing left to give up
    });
    ASSERT_TRUE(runUntil(loop, [&] { return opened > 0; }));
    if (send(kernel.fd(), "!", 1, MSG_OOB) != 1) GTEST_SKIP() << "no out-of-band data on this kernel's sockets";
    ASSERT_TRUE(runUntil(loop, [&] { return first > 0 && second > 0; }));
    EXPECT_EQ(second, 1);
    EXPECT_FALSE(released());
    one.reset();
    EXPECT_TRUE(runUntil(loop, [&] { return released(); }));

    one = pressure->watch([&] { ++first; });
    EXPECT_TRUE(runUntil(loop, [&] { return opened == 2; })) << "once for both, and once more";
    pressure.reset();
    one.reset();
}

TEST_F(MemoryPressureTest, ATriggerThatEndsIsLetGo)
{
    const auto watch = pressure->watch([] { FAIL(); });
    ASSERT_TRUE(runUntil(loop, [&] { return opened > 0; }));
    shutdown(kernel.fd(), SHUT_RDWR);
    EXPECT_TRUE(runUntil(loop, [&] { return released(); })) << "else the loop spins on it";
}

TEST(MemoryPressure, AbsenceIsAnError)
{
    const test::TemporaryDirectory directory;
    EXPECT_FALSE(openPressureTrigger(directory / "missing"));
    RunLoop loop;
    const auto pressure = makeMemoryPressure(loop, [&] { return openPressureTrigger(directory / "missing"); });
    const auto watch = pressure->watch([] { FAIL(); });
    loop.runOnce({});
}

} // namespace
} // namespace platform
