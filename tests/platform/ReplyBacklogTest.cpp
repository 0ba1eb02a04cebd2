#include "platform/ipc/ReplyBacklog.h"

#include <latch>
#include <sys/mman.h>

#include <gmock/gmock.h>

#include "tests/support/ByHand.h"
#include "tests/support/ProbeService.h"

namespace platform::ipc {
namespace {

using namespace platform::ipc::test;
using testing::ElementsAre;
using testing::IsEmpty;

TEST(ReplyBacklog, HoldsHandlersBackUntilThereIsRoom)
{
    platform::test::ByHand hand;
    ReplyBacklog backlog(100);
    std::vector<std::string> ran;
    const auto call = [&](const std::shared_ptr<Queue>& queue, const char* name, std::size_t answer) {
        queue->async([&, name, answer] {
            backlog.runWithRoom([&, name, answer] {
                ran.emplace_back(name);
                backlog.add(answer);
            });
        });
    };
    const auto newRuns = [&] {
        hand.drain();
        return std::exchange(ran, {});
    };
    std::vector<std::shared_ptr<Queue>> queues;
    for (int i = 0; i < 4; ++i) queues.push_back(hand.makeQueue("test"));

    call(queues[0], "first", 60);
    call(queues[0], "second", 60);
    call(queues[1], "no reply yet", 0);
    call(queues[1], "later", 0);
    call(queues[2], "large", 1000);
    call(queues[3], "last", 0);
    EXPECT_THAT(newRuns(), ElementsAre("first", "second")) << "120 bytes wait";
    backlog.remove(10);
    EXPECT_THAT(newRuns(), IsEmpty());
    backlog.remove(50);
    EXPECT_THAT(newRuns(), ElementsAre("no reply yet", "later", "large")) << "one wakes the next while there is room";
    backlog.remove(1000);
    EXPECT_THAT(newRuns(), ElementsAre("last"));
}

TEST(ReplyBacklog, NoHandlerIsCalledWhileLargeRepliesAreUnsent)
{
    Service service({.unsentBytes = 1000});
    auto client = service.connect();
    service.await([&] { return service.connections.size() == 1; });
    const auto connection = service.connections[0];
    // While a push fails, the connection can't write a reply. The first push fails until both calls have been sent. The
    // handler of the first call makes the second push, which fails until the other workers are idle.
    std::promise<void> written;
    service.onPushError = [&, calls = 0]() mutable {
        if (calls++ == 0) return written.get_future().wait();
        const auto idle = std::make_shared<std::latch>(1);
        service.pool.execute(Priority::Default, [idle] { idle->count_down(); });
        WorkerPool::shareKeptJobs();
        idle->wait();
        std::lock_guard lock(service.mutex);
        EXPECT_THAT(service.notes, IsEmpty());
    };
    service.beforeGiving = [&] { connection->push("Unknown", {}); };
    connection->push("Unknown", {});
    int answered = 0;
    const auto count = [&](const CallResult& result) { answered += result.has_value(); };
    client->call(probe().name, method("Give"), {{1000}, {}}, count);
    client->call(probe().name, method("Note"), {{"second"}, {}}, count);
    written.set_value();
    EXPECT_TRUE(client->wait([&] { return answered == 2; }, kLong));
}

TEST(ReplyBacklog, CountsWhatAMessageHolds)
{
    Message message{
        {Value::Array{std::string(1000, 'x'), Value::dictionaryOf({{"key", Bytes(std::string(2000, 'y'))}})}}, {}};
    EXPECT_NEAR(static_cast<double>(memoryOf(message)), 3000, 300);
    for (int i = 0; i < 10; ++i) message.handles.emplace_back(memfd_create("handle", MFD_CLOEXEC));
    EXPECT_GT(memoryOf(message), 100'000u) << "a descriptor is worth more than its bytes";
}

} // namespace
} // namespace platform::ipc
