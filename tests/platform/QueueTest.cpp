#include "platform/run/Queue.h"

#include <atomic>
#include <future>
#include <latch>
#include <thread>

#include <gtest/gtest.h>

#include "platform/run/WorkerPool.h"
#include "tests/support/ByHand.h"

namespace platform {
namespace {

using namespace std::chrono_literals;

struct QueueTest : testing::Test, test::ByHand {
    std::vector<int> order;
    std::shared_ptr<Queue> serial() { return makeQueue("test.serial"); }
    std::shared_ptr<Queue> concurrent() { return makeQueue("test.concurrent", Queue::Kind::Concurrent); }
    auto note(int i)
    {
        return [this, i] { order.push_back(i); };
    }
};

TEST_F(QueueTest, SyncRunsWhatWasQueuedBeforeItAndNoMore)
{
    auto queue = serial();
    queue->async(note(1));
    queue->async([this, queue] {
        order.push_back(2);
        queue->async(note(4));
    });
    EXPECT_EQ(queue->sync([this] { return order.push_back(3), 7; }), 7);
    EXPECT_EQ(order, (std::vector{1, 2, 3})) << "the executor never ran";
    executor.drain();
    EXPECT_EQ(order, (std::vector{1, 2, 3, 4}));
}

TEST_F(QueueTest, KnowsWhereItIs)
{
    auto outer = serial();
    auto inner = Queue::make("test.inner", Queue::Kind::Serial, executor, clock);
    EXPECT_EQ(Queue::current(), nullptr);
    outer->sync([&] {
        inner->sync([&] {
            EXPECT_EQ(Queue::current(), inner);
            EXPECT_TRUE(outer->isCurrent());
        });
        EXPECT_FALSE(inner->isCurrent());
    });
    EXPECT_DEATH(outer->sync([&] { inner->sync([&] { outer->sync([] {}); }); }), "queue test.serial: sync from a task");
    EXPECT_DEATH(concurrent()->sync([] { Queue::current()->sync([] {}); }), "queue test.concurrent");
    EXPECT_DEATH(outer->assertOnQueue(), "not on the queue");
}

TEST_F(QueueTest, SuspensionHoldsBackWhatIsBehindIt)
{
    for (const bool byEvent : {true, false}) {
        order.clear();
        auto queue = serial();
        Event event;
        queue->async([&] {
            queue->suspendUntil(event, 1s, note(2));
            order.push_back(1);
        });
        queue->async(note(3));
        executor.drain();
        EXPECT_EQ(order, std::vector{1});
        if (byEvent) event.signal();
        advance(byEvent ? 0s : 1s);
        EXPECT_EQ(order, (std::vector{1, 2, 3}));
        EXPECT_EQ(clock.pendingTimers(), 0u);
        event.signal();
        executor.drain();
        EXPECT_EQ(order.size(), 3u) << "an event that comes late resumes nothing twice";
    }
}

TEST_F(QueueTest, SuspensionsOfOneTaskEndTogetherAndInOrder)
{
    for (const int before : {0, 1, 2}) { // which event is signalled before the task begins
        order.clear();
        auto queue = serial();
        Event first;
        Event second;
        if (before > 0) (before == 1 ? first : second).signal();
        queue->async([&] {
            queue->suspendUntil(first, 2s, note(1));
            queue->suspendUntil(second, 1s, note(2));
        });
        queue->async(note(3));
        executor.drain();
        (before == 1 ? first : second).signal();
        executor.drain();
        EXPECT_TRUE(order.empty()) << "the one may go on, but not without the other";
        (before == 1 ? second : first).signal();
        executor.drain();
        EXPECT_EQ(order, (std::vector{1, 2, 3})) << before;
    }
}

TEST_F(QueueTest, SuspensionMayFollowSuspension)
{
    auto queue = serial();
    Event never;
    Event happened;
    happened.signal();
    queue->async([&] {
        queue->suspendUntil(happened, 1s, [&] {
            order.push_back(1);
            queue->suspendUntil(never, 1s, note(2));
        });
    });
    queue->async(note(3));
    advance(999ms);
    EXPECT_EQ(order, std::vector{1});
    advance(1ms);
    EXPECT_EQ(order, (std::vector{1, 2, 3}));
}

TEST_F(QueueTest, OneEventWakesEveryWaiter)
{
    Event event;
    std::vector<std::shared_ptr<Queue>> queues;
    for (int i = 0; i < 500; ++i) {
        queues.push_back(serial());
        queues.back()->async([&, i] { queues[i]->suspendUntil(event, 1s, note(i)); });
    }
    executor.drain();
    EXPECT_TRUE(order.empty());
    event.signal();
    executor.drain();
    EXPECT_EQ(order.size(), 500u);
    EXPECT_EQ(clock.pendingTimers(), 0u);
}

TEST_F(QueueTest, BarriersKeepTheirPlaceAmongSharedTasks)
{
    auto queue = concurrent();
    queue->async(note(1));
    queue->barrierAsync(note(2));
    queue->async(note(3));
    queue->barrierSync(note(4));
    executor.drain();
    EXPECT_EQ(order, (std::vector{1, 2, 3, 4}));
}

TEST_F(QueueTest, DelayedTasksComeInOrderOfTime)
{
    auto queue = serial();
    queue->after(2s, note(2));
    queue->after(1s, note(1));
    queue->after(-1s, note(0));
    advance(0s);
    EXPECT_EQ(order, std::vector{0});
    advance(10s);
    EXPECT_EQ(order, (std::vector{0, 1, 2}));
}

// With real threads: the exclusion that everything else relies on.
struct QueueThreads : testing::Test {
    test::ManualClock clock;
    static void onThreads(int count, const std::function<void(int)>& run)
    {
        std::vector<std::jthread> threads;
        for (int t = 0; t < count; ++t) threads.emplace_back(run, t);
    }
};

TEST_F(QueueThreads, SerialTasksNeverOverlapAndKeepTheirOrder)
{
    WorkerPool pool(3);
    auto queue = Queue::make("test.serial", Queue::Kind::Serial, pool, clock);
    constexpr int kThreads = 4;
    constexpr int kEach = 3000;
    int value = 0; // unguarded: the queue is the guard
    std::vector<int> last(kThreads, -1);
    std::atomic<int> disorder = 0;
    onThreads(kThreads, [&](int t) {
        for (int i = 0; i < kEach; ++i) {
            auto task = [&, t, i] {
                ++value;
                if (last[t] >= i) ++disorder;
                last[t] = i;
            };
            if (i % 3 == 0)
                queue->sync(task);
            else
                queue->async(task);
        }
    });
    queue->sync([] {});
    EXPECT_EQ(value, kThreads * kEach);
    EXPECT_EQ(disorder, 0);
}

TEST_F(QueueThreads, WritersExcludeReaders)
{
    WorkerPool pool(3);
    auto queue = Queue::make("test.concurrent", Queue::Kind::Concurrent, pool, clock);
    std::pair<int, int> value{0, 0};
    std::atomic<int> torn = 0;
    onThreads(4, [&](int t) {
        const auto read = [&] { torn += value.first != value.second; };
        const auto write = [&] {
            ++value.first;
            ++value.second;
        };
        for (int i = 0; i < 2000; ++i) {
            if (i % 7 == t)
                queue->barrierSync(write);
            else if (i % 7 == t + 1)
                queue->barrierAsync(write);
            else if (i % 2)
                queue->sync(read);
            else
                queue->async(read);
        }
    });
    queue->barrierSync([] {});
    EXPECT_EQ(torn, 0);
    EXPECT_EQ(value.first, value.second);
}

// A sync caller never needs a free worker: here the only one is busy until the caller is done.
TEST_F(QueueThreads, SyncDoesNotDependOnAFreeWorker)
{
    std::latch release(1); // outlives the worker that waits for it
    WorkerPool pool(1);
    pool.execute(Priority::Default, [&] { release.wait(); });
    auto queue = Queue::make("test.serial", Queue::Kind::Serial, pool, clock);
    int seen = 0;
    queue->async([&] { seen = 1; });
    EXPECT_EQ(queue->sync([&] { return seen; }), 1);

    Event event;
    queue->async([&] { queue->suspendUntil(event, 1s, [&] { seen = 2; }); });
    auto waiting = std::async(std::launch::async, [&] { return queue->sync([&] { return seen; }); });
    event.signal();
    EXPECT_EQ(waiting.get(), 2);
    release.count_down();
}

} // namespace
} // namespace platform
