#include "platform/run/WorkerPool.h"

#include <array>
#include <atomic>
#include <future>
#include <latch>
#include <mutex>
#include <sys/epoll.h>
#include <sys/socket.h>
#include <thread>
#include <unistd.h>
#include <vector>

#include <gtest/gtest.h>

#include "platform/base/FileHandle.h"
#include "platform/run/Queue.h"
#include "tests/support/ManualClock.h"

namespace platform {
namespace {

struct WorkerPoolTest : testing::Test {
    /// Runs the job on a worker, and returns when it has ended.
    void run(Executor::Job job, Priority priority = Priority::Default)
    {
        std::promise<void> done;
        pool.execute(priority, [&] {
            job();
            done.set_value();
        });
        done.get_future().wait();
    }
    /// Returns a job that notes its name and thread, and counts the latch down.
    Executor::Job note(std::string name, std::latch& done)
    {
        return [this, name = std::move(name), &done] {
            {
                std::lock_guard lock(mutex);
                notes.emplace_back(name, std::this_thread::get_id());
            }
            done.count_down();
        };
    }

    test::ManualClock clock;
    std::mutex mutex;
    std::vector<std::pair<std::string, std::thread::id>> notes;
    WorkerPool pool{2};
};

TEST_F(WorkerPoolTest, WhatAJobHandsOverLastRunsNextOnItsThread)
{
    std::latch done(2);
    std::thread::id here;
    run([&] {
        here = std::this_thread::get_id();
        pool.execute(Priority::Default, note("next", done));
        pool.execute(Priority::High, note("urgent", done)); // a reply overtakes
    });
    done.wait();
    EXPECT_EQ(notes, (decltype(notes){{"urgent", here}, {"next", here}}));
}

TEST_F(WorkerPoolTest, OtherThreadsRunWhatAJobHandsOverEarlierAndWhatItShares)
{
    const struct {
        const char* what;
        Priority first;
        bool another, shares;
    } cases[]{{"two jobs", Priority::Default, true, false},
              {"two urgent jobs", Priority::High, true, false},
              {"a job that goes on", Priority::Default, false, true},
              {"background work", Priority::Background, false, false}};
    for (const auto& c : cases) {
        SCOPED_TRACE(c.what);
        notes.clear();
        std::latch ran(1), done(1 + c.another);
        std::thread::id here;
        run([&] {
            here = std::this_thread::get_id();
            pool.execute(c.first, note("first", ran));
            if (c.another) pool.execute(c.first, [&] { done.count_down(); });
            if (c.shares) WorkerPool::shareKeptJobs();
            ran.wait(); // hangs if this thread should run it
        });
        done.count_down();
        done.wait();
        ASSERT_EQ(notes.size(), 1u);
        EXPECT_NE(notes[0].second, here);
    }
}

/// A source on a queue, and the other end of its socket.
struct SourceTest : WorkerPoolTest {
    SourceTest()
    {
        std::array<int, 2> ends{};
        EXPECT_EQ(socketpair(AF_UNIX, SOCK_STREAM | SOCK_NONBLOCK, 0, ends.data()), 0);
        in = FileHandle(ends[0]);
        out = FileHandle(ends[1]);
    }
    ~SourceTest() override
    {
        queue->sync([this] { source.reset(); });
    }
    void watch(std::uint32_t events, std::function<void(std::uint32_t)> ready)
    {
        queue->sync([&] {
            source = pool.watch(in.fd(), queue, std::move(ready));
            source->setEvents(events);
        });
    }
    void write(std::string_view bytes) const
    {
        ASSERT_EQ(send(out.fd(), bytes.data(), bytes.size(), 0), std::ssize(bytes));
    }
    void await(int count)
    {
        for (int now = calls; now < count; now = calls) calls.wait(now);
    }
    void call()
    {
        ++calls;
        calls.notify_all();
    }

    FileHandle in, out;
    std::atomic<int> calls = 0;
    std::shared_ptr<Queue> queue = Queue::make("test.queue", Queue::Kind::Serial, pool, clock);
    std::unique_ptr<WorkerPool::Source> source;
};

// Two endless chains: each job queues the next, so that other work might never get a turn.
TEST_F(SourceTest, JobsWithoutEndStarveNeitherOthersNorDescriptors)
{
    std::atomic<bool> goesOn = true;
    std::latch ended(2);
    std::function<void()> step = [&] {
        if (!goesOn) return ended.count_down();
        pool.execute(Priority::Default, [&] { step(); });
    };
    for (int i = 0; i < 2; ++i) pool.execute(Priority::Default, [&] { step(); });
    run([] {});
    watch(EPOLLIN | EPOLLET, [&](std::uint32_t) { call(); });
    write("x");
    await(1);
    goesOn = false;
    ended.wait();
}

TEST_F(SourceTest, TasksRunOnTheQueueAndReportUnreadBytesAgain)
{
    watch(EPOLLIN, [&](std::uint32_t events) {
        queue->assertOnQueue();
        EXPECT_EQ(events, EPOLLIN);
        char byte = 0;
        EXPECT_EQ(read(in.fd(), &byte, 1), 1);
        call();
    });
    write("abc");
    await(3);
    queue->sync([&] { source->setEvents(0); });
    write("d");
    run([] {});
    EXPECT_EQ(calls, 3) << "a paused source";
    queue->sync([&] { source->setEvents(EPOLLIN); });
    await(4);
}

TEST_F(SourceTest, OnlyChangesAreReportedIfAsked)
{
    watch(EPOLLIN | EPOLLET, [&](std::uint32_t) { call(); });
    write("a");
    await(1);
    write("b");
    await(2);
    out = FileHandle();
    await(3);
}

TEST_F(SourceTest, WhoDrainsTheQueueRunsTheTaskOfABusyOne)
{
    watch(EPOLLIN | EPOLLET, [&](std::uint32_t) { call(); });
    queue->sync([&] {
        write("a");
        run([] {}); // both workers are free, and one has seen the byte
        run([] {});
        EXPECT_EQ(calls, 0) << "never beside another task";
    });
    await(1);
}

// The descriptor wakes a thread at any moment, and the owner ends the source at any other.
TEST_F(SourceTest, NoHandlerRunsAfterTheEnd)
{
    char bytes[512];
    for (int round = 0; round < 300; ++round) {
        while (read(in.fd(), bytes, sizeof(bytes)) > 0) {} // of earlier rounds
        auto alive = std::make_shared<std::atomic<bool>>(true);
        watch(round % 2 ? EPOLLIN : EPOLLIN | EPOLLET, [&, alive](std::uint32_t) {
            EXPECT_TRUE(*alive);
            char byte = 0;
            EXPECT_EQ(read(in.fd(), &byte, 1), 1);
        });
        const std::jthread writer([&] { write("a"); });
        queue->sync([&] {
            *alive = false;
            source.reset();
        });
    }
}

TEST_F(SourceTest, AHandlerMayEndItsOwnSource)
{
    watch(EPOLLIN, [&](std::uint32_t) {
        source.reset();
        call();
    });
    write("a");
    await(1);
    EXPECT_TRUE(queue->sync([&] { return source == nullptr; }));
}

} // namespace
} // namespace platform
