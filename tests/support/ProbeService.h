#pragma once

#include <algorithm>
#include <condition_variable>
#include <functional>
#include <future>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>
#include <sys/mman.h>
#include <thread>
#include <unistd.h>
#include <utility>
#include <vector>

#include <gtest/gtest.h>

#include "platform/ipc/BusClient.h"
#include "platform/ipc/BusTransport.h"
#include "platform/ipc/Ipc.h"
#include "platform/run/RunLoop.h"
#include "platform/run/WorkerPool.h"
#include "platform/values/Dictionary.h"
#include "tests/support/ManualClock.h"
#include "tests/support/TemporaryDirectory.h"
#include "tests/support/Workers.h"

namespace platform::ipc::test {

using platform::test::ManualClock;
using platform::test::TemporaryDirectory;

inline constexpr Duration kLong = std::chrono::seconds(60); // only a failing test waits this long
inline constexpr const char* kObjectPath = "/com/example/probe";
inline constexpr std::string_view kEveryType = "sxtuibdaya{sv}aa{sv}as";

inline const Interface& probe()
{
    static const Interface interface{
        .path = kObjectPath,
        .name = "com.example.Probe",
        .methods = {{"Echo", kEveryType, kEveryType},
                    {"Take", "a{sv}", "a{sv}"},
                    {"Note", "s", "", true},
                    {"Open", "s", "ah"},
                    {"Hold", "", "s"},
                    {"Batch", "", "ay"},
                    {"Give", "t", "ay"},
                    {"Bye", "t", "ay"},
                    {"Fail", "", "s"},
                    {"Misfit", "", "s"},
                    {"Count", "", "u", false, "com.example.Extra"}},
        .listenerName = "com.example.Listener",
        .signals = {{"Told", "sa{sv}", ""}},
        .introspection = "<node><interface name=\"com.example.Probe\"><method name=\"Hold\"/></interface></node>",
    };
    return interface;
}

inline const Member& method(std::string_view name)
{
    return *std::ranges::find(probe().methods, name, &Member::name);
}

/// A service with a probe object on every connection, its loop on a thread.
class Service {
public:
    explicit Service(Limits limits = {}) : _limits(limits)
    {
        failOnReplyMisuse();
        transport = makeBusTransport(loop, pool, clock, directory(), limits);
        listener = std::move(*transport->listen(probe(), "com.example.probe"));
        serve(*listener);
        _thread = std::thread([this] { loop.run(); });
    }
    ~Service()
    {
        loop.stop();
        _thread.join();
        for (Responder& reply : held) reply.abandon();
        connections.clear();
        listener.reset();
        transport.reset();
        platform::test::settle(pool, kWorkers);
    }

    std::string directory() const { return (_directory / "service").string(); }

    void serve(Listener& on)
    {
        on.setAcceptor([this](const std::shared_ptr<Connection>& connection) {
            connection->exportObject(
                [this, weak = std::weak_ptr(connection)](auto member, Message arguments, Responder reply) {
                    if (auto living = weak.lock())
                        handle(*living, member, std::move(arguments), std::move(reply));
                    else
                        reply.abandon();
                });
            connection->setInvalidationHandler([this] { note("<invalidated>"); });
            connection->setPushErrorHandler([this](const std::string&) {
                if (onPushError) onPushError();
            });
            connection->resume();
            std::lock_guard lock(mutex);
            connections.push_back(connection);
            changed.notify_all();
        });
        on.resume();
    }

    /// Waits until `holds` does, which is called under the mutex.
    void await(const std::function<bool()>& holds)
    {
        std::unique_lock lock(mutex);
        ASSERT_TRUE(changed.wait_for(lock, kLong, holds));
    }
    /// Waits until the loop and the workers have run what they were given so far.
    void settle()
    {
        std::promise<void> done;
        loop.execute(Priority::Default, [&] { done.set_value(); });
        done.get_future().wait();
        platform::test::settle(pool, kWorkers);
    }
    void pass(Duration time)
    {
        clock.advance(time, [this] { settle(); });
    }
    std::unique_ptr<Client> connect(Listener& to)
    {
        return std::move(*Client::connect(to.endpoint(), kObjectPath, kLong));
    }
    std::unique_ptr<Client> connect() { return connect(*listener); }

    RunLoop loop;
    ManualClock clock;
    std::mutex mutex;
    std::condition_variable changed;
    std::vector<std::shared_ptr<Connection>> connections;
    std::vector<std::string> notes;
    std::vector<Responder> held;
    std::size_t mostHeld = 0;
    std::function<void()> beforeGiving;
    std::function<void()> onPushError;
    WorkerPool pool{kWorkers};
    std::unique_ptr<Transport> transport;
    std::unique_ptr<Listener> listener;

private:
    static constexpr unsigned kWorkers = 2;

    void note(std::string text)
    {
        std::lock_guard lock(mutex);
        notes.push_back(std::move(text));
        changed.notify_all();
    }

    void handle(Connection& connection, std::string_view member, Message arguments, Responder reply)
    {
        connection.queue()->assertOnQueue();
        if (member == "Echo" || member == "Take") return reply(std::move(arguments));
        if (member == "Fail") return reply(std::unexpected(CallError{.message = "scale: not a number \xff"}));
        if (member == "Misfit") return reply(Message{{1.5}, {}});
        if (member == "Count") return reply(Message{{7}, {}});
        if (member == "Open") {
            Message opened{{Value(Value::Array{0})}, {}};
            opened.handles.emplace_back(memfd_create("handle", MFD_CLOEXEC));
            const std::string& content = *arguments.args[0].asString();
            EXPECT_EQ(write(opened.handles[0].fd(), content.data(), content.size()), std::ssize(content));
            return reply(std::move(opened));
        }
        if (member == "Note") {
            note(*arguments.args[0].asString());
            return reply(Message{});
        }
        if (member == "Give" || member == "Bye") {
            if (beforeGiving) beforeGiving();
            reply(Message{{Bytes(std::string(*arguments.args[0].asUInt(), 'x'))}, {}});
            if (member == "Bye") connection.invalidate();
            return;
        }
        std::lock_guard lock(mutex);
        held.push_back(std::move(reply));
        mostHeld = std::max(mostHeld, held.size());
        if (member == "Batch" && held.size() == _limits.callsInFlight)
            for (Responder& owed : std::exchange(held, {})) owed(Message{{Bytes(std::string(1000, 'x'))}, {}});
        changed.notify_all();
    }

    const Limits _limits;
    TemporaryDirectory _directory;
    std::thread _thread;
};

inline CallResult call(Client& client, const Member& member, Message arguments = {},
                       std::string_view interface = probe().name)
{
    std::optional<CallResult> got;
    client.call(interface, member, std::move(arguments), [&](CallResult result) { got = std::move(result); });
    if (client.wait([&] { return got.has_value(); }, kLong)) return std::move(*got);
    return std::unexpected(CallError{"test.Gone", "the connection ended"});
}

} // namespace platform::ipc::test
