#include "platform/run/QueueOrder.h"

#include <gtest/gtest.h>

#include "platform/base/Mutex.h"
#include "platform/run/Queue.h"
#include "platform/run/RunLoop.h"
#include "tests/support/ByHand.h"

namespace platform {
namespace {

struct Queues : test::ByHand {
    std::shared_ptr<Queue> make(const char* label, Rank rank = Rank::None)
    {
        return Queue::make(label, Queue::Kind::Serial, executor, clock, rank);
    }
    std::shared_ptr<Queue> a = make("order.a"), b = make("order.b"), c = make("order.c");
    std::shared_ptr<Queue> root = make("order.root", Rank::Root);
    std::shared_ptr<Queue> one = make("order.one", Rank{1}), two = make("order.two", Rank{2});
};

void nothing() {}

void nest(const std::shared_ptr<Queue>& outer, const std::shared_ptr<Queue>& inner)
{
    outer->sync([&] { inner->sync(nothing); });
}

// Each rule, broken; and how the message shows the way there.
constexpr struct {
    const char* name;
    void (*breakRule)(Queues& queues);
    const char* message;
} kViolations[] = {
    {"up", [](Queues& q) { nest(q.two, q.one); },
     "queue order.one: sync up the ranks, from rank 2 to rank 1.*way: order.two > order.one"},
    {"along",
     [](Queues& q) {
         const auto other = q.make("order.other", Rank{1});
         q.root->async([&] { nest(q.one, other); });
         q.executor.drain();
     },
     "queue order.other: sync up the ranks, from rank 1 to rank 1.*way: order.root > order.one > order.other"},
    {"root", [](Queues& q) { q.root->sync(nothing); }, "queue order.root: sync on a root.*way: no queue > order.root"},
    {"mutex",
     [](Queues& q) {
         Mutex mutex;
         MutexLock lock(mutex);
         q.one->sync(nothing);
     },
     "queue order.one: sync under a mutex"},
    {"reader",
     [](Queues& q) {
         SharedMutex mutex;
         SharedMutexLock lock(mutex);
         q.one->sync(nothing);
     },
     "queue order.one: sync under a mutex"},
    {"run loop",
     [](Queues& q) {
         RunLoop loop;
         loop.execute(Priority::Default, [&] { q.one->sync(nothing); });
         loop.runOnce({});
     },
     "queue order.one: sync on a thread that may not wait"},
    {"circle",
     [](Queues& q) {
         nest(q.a, q.b);
         nest(q.b, q.c);
         nest(q.c, q.a);
     },
     "queue order.a: sync closes a circle.*way: order.c > order.a.*way: order.a > order.b.*way: order.b > order.c"},
    {"circle of one label", [](Queues& q) { nest(q.a, q.make("order.a")); }, "queue order.a: sync closes a circle"},
    {"suspension inside a sync",
     [](Queues& q) {
         Event happened;
         happened.signal();
         q.b->async([&] { q.b->suspendUntil(happened, {}, nothing); });
         nest(q.a, q.b); // runs the task that comes first
     },
     "queue order.b: suspendUntil inside a sync.*way: order.a > order.b"},
    {"suspension of what others wait for",
     [](Queues& q) { q.one->sync([&] { q.one->suspendUntil(Event(), {}, nothing); }); },
     "queue order.one: suspendUntil on no root"},
};

TEST(QueueOrderTest, EachViolationAborts)
{
    for (const auto& violation : kViolations) {
        SCOPED_TRACE(violation.name);
        Queues queues;
        EXPECT_DEATH(violation.breakRule(queues), violation.message);
    }
}

TEST(QueueOrderTest, WhatKeepsToTheOrderRuns)
{
    Queues queues;
    int ran = 0;
    Event happened;
    queues.root->async([&] {
        nest(queues.one, queues.two);
        queues.two->sync([&] { queues.one->async([&] { ++ran; }); }); // nobody waits
        queues.root->suspendUntil(happened, {}, [&] { ++ran; });
    });
    queues.executor.drain();
    happened.signal();
    queues.executor.drain();
    EXPECT_EQ(ran, 2);

    nest(queues.a, queues.b);
    nest(queues.a, queues.c);
    nest(queues.b, queues.c);

    Mutex mutex;
    {
        MutexLock lock(mutex);
        const QueueOrder::ForbidSync thread;
    }
    queues.one->sync([&] { ++ran; });
    EXPECT_EQ(ran, 3);
}

} // namespace
} // namespace platform
