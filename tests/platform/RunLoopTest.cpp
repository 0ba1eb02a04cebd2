#include "platform/run/RunLoop.h"

#include <csignal>
#include <sys/epoll.h>
#include <thread>
#include <unistd.h>

#include <gtest/gtest.h>

#include "platform/base/FileHandle.h"
#include "platform/run/Clock.h"
#include "platform/run/SystemClock.h"
#include "tests/support/TemporaryDirectory.h"

namespace platform {
namespace {

using namespace std::chrono_literals;
using test::runUntil;

struct RunLoopTest : testing::Test {
    auto note(int i)
    {
        return [this, i] { order.push_back(i); };
    }
    RunLoop loop;
    std::vector<int> order;
};

TEST_F(RunLoopTest, JobsRunInOrderAndThoseTheyAddComeLater)
{
    loop.execute(Priority::Background, [&] {
        order.push_back(1);
        loop.execute(Priority::High, note(3));
    });
    loop.execute(Priority::High, note(2));
    loop.runOnce(0s);
    EXPECT_EQ(order, (std::vector{1, 2})) << "a job that adds itself must not starve descriptors";
    loop.runOnce(0s);
    EXPECT_EQ(order, (std::vector{1, 2, 3}));
}

TEST_F(RunLoopTest, OtherThreadsWakeAndStopIt)
{
    const auto here = std::this_thread::get_id();
    int sum = 0; // unguarded: the loop's thread is the guard
    bool elsewhere = false;
    {
        std::vector<std::jthread> threads;
        for (int t = 0; t < 3; ++t) {
            threads.emplace_back([&] {
                for (int i = 0; i < 500; ++i) {
                    loop.execute(Priority::Default, [&] {
                        elsewhere |= std::this_thread::get_id() != here;
                        if (++sum == 1500) loop.stop();
                    });
                }
            });
        }
        loop.run();
    }
    EXPECT_EQ(sum, 1500);
    EXPECT_FALSE(elsewhere);
}

TEST_F(RunLoopTest, WatchesFollowTheirDescriptorUntilTheyGo)
{
    int ends[2];
    ASSERT_EQ(pipe(ends), 0);
    const FileHandle in(ends[0]), out(ends[1]);
    int seen = 0;
    auto watch = loop.watch(in.fd(), EPOLLIN, [&](std::uint32_t events) { seen += (events & EPOLLIN) != 0; });
    loop.runOnce(0s);
    EXPECT_EQ(seen, 0);
    ASSERT_EQ(write(out.fd(), "x", 1), 1);
    loop.runOnce(1s);
    loop.runOnce(1s);
    EXPECT_EQ(seen, 2) << "level-triggered: unread bytes are told again";
    watch->setEvents(0);
    loop.runOnce(0s);
    EXPECT_EQ(seen, 2);
    watch->setEvents(EPOLLIN);
    loop.runOnce(1s);
    EXPECT_EQ(seen, 3);
    watch.reset();
    loop.runOnce(0s);
    EXPECT_EQ(seen, 3);
}

TEST_F(RunLoopTest, SignalsBecomeCalls)
{
    sigset_t before;
    pthread_sigmask(SIG_SETMASK, nullptr, &before);
    RunLoop::blockSignals();
    {
        RunLoop signalled;
        signalled.onSignal(SIGTERM, note(1));
        signalled.onSignal(SIGINT, note(2));
        raise(SIGINT);
        EXPECT_TRUE(runUntil(signalled, [&] { return order == std::vector{2}; }));
        raise(SIGTERM);
        EXPECT_TRUE(runUntil(signalled, [&] { return order == (std::vector{2, 1}); }));
    }
    pthread_sigmask(SIG_SETMASK, &before, nullptr);
}

struct SystemClockTest : RunLoopTest {
    std::unique_ptr<Clock> clock = makeSystemClock(loop);
};

TEST_F(SystemClockTest, TimersFireInOrderOfTimeAndNeverEarly)
{
    // Far apart: they are set one after the other, on a machine that may be busy.
    const std::uint64_t start = clock->hostTicks();
    std::uint64_t fired = 0;
    clock->after(Duration::max(), note(99));
    clock->after(200ms, [&] {
        fired = clock->hostTicks();
        order.push_back(4);
    });
    clock->after(100ms, note(3));
    clock->after(0ms, note(1));
    clock->after(Duration::min(), note(2));
    EXPECT_TRUE(order.empty()) << "only the loop fires them";
    EXPECT_TRUE(runUntil(loop, [&] { return order.size() >= 4; }));
    EXPECT_EQ(order, (std::vector{1, 2, 3, 4}));
    EXPECT_GE(fired - start, 200'000'000u);
}

TEST_F(SystemClockTest, CancelledTimersNeverFire)
{
    auto held = std::make_shared<int>();
    const auto first = clock->after(1ms, [held, this] { order.push_back(1); });
    const auto second = clock->after(2ms, note(2));
    EXPECT_TRUE(clock->cancel(first)) << "the one that the descriptor is set to";
    EXPECT_EQ(held.use_count(), 1) << "and what it held is let go";
    EXPECT_FALSE(clock->cancel(first));
    EXPECT_FALSE(clock->cancel(0));
    EXPECT_FALSE(clock->cancel(12345));
    EXPECT_TRUE(runUntil(loop, [&] { return !order.empty(); }));
    EXPECT_EQ(order, std::vector{2});
    EXPECT_FALSE(clock->cancel(second)) << "it has fired";
}

TEST_F(SystemClockTest, ATimerMaySetAndCancelOthers)
{
    Clock::TimerId victim = 0;
    clock->after(0ms, [&] {
        order.push_back(1);
        EXPECT_TRUE(clock->cancel(victim));
        clock->after(0ms, note(2));
    });
    victim = clock->after(1h, note(3));
    EXPECT_TRUE(runUntil(loop, [&] { return order.size() == 2; }));
    EXPECT_EQ(order, (std::vector{1, 2}));
}

TEST_F(SystemClockTest, TimersSetOnOtherThreadsWakeTheLoop)
{
    std::jthread other([&] { clock->after(1ms, [&] { loop.stop(); }); });
    loop.run(); // returns, or the test hangs
}

} // namespace
} // namespace platform
