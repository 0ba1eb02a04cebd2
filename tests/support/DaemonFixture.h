#pragma once

#include <gtest/gtest.h>

#include "CoreTavrin/TAVProtocols.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Record.h"
#include "tavrind/ClientSessionManager.h"
#include "tavrind/FeedbackTypes.h"
#include "tavrind/Startup.h"
#include "tavrind/TavrinFeedback.h"
#include "tests/support/TestDevice.h"

namespace tavrin::test {

using platform::Dictionary;
using platform::Value;
using platform::test::FakeCall;
using platform::test::FakeConnection;

/// Keeps what the daemon records, in order.
class RecordingSessionManager final : public ClientSessionManager {
public:
    explicit RecordingSessionManager(Assembly& assembly)
        : ClientSessionManager(assembly, assembly.guidController, "test")
    {}
    void addTavrinFeedback(std::shared_ptr<TavrinFeedback> feedback, std::shared_ptr<void>) override
    {
        records.push_back(std::move(feedback));
    }

    /// The classes of the records so far, taken out.
    std::vector<std::string> takeClasses()
    {
        std::vector<std::string> classes;
        for (const auto& record : records) classes.emplace_back(record->feedback()->className());
        records.clear();
        return classes;
    }
    template <class T> std::shared_ptr<T> last() const
    {
        return records.empty() ? nullptr : std::dynamic_pointer_cast<T>(records.back()->feedback());
    }

    std::vector<std::shared_ptr<TavrinFeedback>> records;
};

/// The whole daemon on a device of twins: the test is the clients, the service and the clock.
struct DaemonTest : testing::Test {
    ~DaemonTest() override
    {
        device.files.fault = {}; // it may refer to what the test had
        settle();
    }

    /// Lets everything under way end.
    void settle()
    {
        const auto endLoads = [this] {
            do device.drain();
            while (device.loader.cancelAll());
        };
        endLoads();
        device.ipc.endAll();
        endLoads(); // what is recorded of a client's end may ask for a fresh bag
    }

    void start()
    {
        settle();
        daemon.reset();
        device.drain();
        device.loader.sessions.clear();
        daemon = startUp(device.device).value();
        if (recordFeedback) {
            session = std::make_shared<RecordingSessionManager>(assembly());
            assembly().clientSessionManager = session;
        }
        device.drain();
    }

    /// Starts without a bag on disk, so that the first one must be fetched.
    void startWithoutBag()
    {
        device.files.files.clear();
        start();
    }

    Assembly& assembly() { return daemon->assembly; }

    /// Requests of the foreground session, in order; the first is the bag's.
    std::vector<std::shared_ptr<platform::test::FakeUrlLoader::Task>>& tasks()
    {
        return device.loader.sessions.at(0)->tasks;
    }
    auto lastTask() { return tasks().back(); }
    void respond(std::string body, int status = 200, platform::HttpHeaders headers = {})
    {
        lastTask()->respond(status, std::move(body), std::move(headers));
        device.drain();
    }
    /// Answers the bag request that is under way.
    void deliverBag(std::string body = kBag) { respond(std::move(body)); }

    std::shared_ptr<FakeConnection> connect(pid_t pid = 77)
    {
        auto connection = device.ipc.connect("com.quorvane.TAVDaemonXPC", {.pid = pid, .uid = 0});
        device.drain();
        return connection;
    }
    /// A client that has configured.
    std::shared_ptr<FakeConnection> client(std::string identifier = "com.quorvane.vistrel",
                                           std::string agent = "Vistrel/4", pid_t pid = 77)
    {
        auto connection = connect(pid);
        configure(*connection, std::move(identifier), std::move(agent));
        return connection;
    }
    std::shared_ptr<FakeCall> configure(FakeConnection& connection, std::string identifier, std::string agent)
    {
        auto call = connection.call("Configure", {Value::dictionaryOf({{"class", "TAVSessionConfiguration"},
                                                                       {"identifier", std::move(identifier)},
                                                                       {"userAgent", std::move(agent)}})});
        device.drain();
        return call;
    }
    std::shared_ptr<FakeCall> request(FakeConnection& connection, std::string className, std::int64_t queryId,
                                      Dictionary fields = {})
    {
        fields.set("class", std::move(className));
        fields.set("queryId", queryId);
        if (!fields.contains("scale")) fields.set("scale", 2.0);
        if (!fields.contains("keyboardInputMode")) fields.set("keyboardInputMode", "de");
        auto call = connection.call("Request", {std::move(fields)});
        device.drain();
        return call;
    }
    std::shared_ptr<FakeCall> search(FakeConnection& connection, std::int64_t queryId, std::string query,
                                     Dictionary fields = {})
    {
        fields.set("queryString", std::move(query));
        return request(connection, "TAVSearchRequest", queryId, std::move(fields));
    }
    std::int64_t counter(std::string_view name)
    {
        return device.counters.value("com.quorvane.tavrind." + std::string(name));
    }

    static constexpr const char* kBag =
        R"({"version": "9", "searchURL": "https://s.example/search", "warmURL": "https://s.example/warm",
        "flightURL": "https://s.example/flight", "minimumQueryLength": 2, "clients": {"news": {"isEnabled": false}}})";

    platform::test::TestDevice device;
    std::unique_ptr<Daemon> daemon;
    bool recordFeedback = true; ///< in `session`, in place of real sessions
    std::shared_ptr<RecordingSessionManager> session;
};

/// An answer that has neither record nor error.
inline bool isEmptyAnswer(FakeCall& call)
{
    return call.answered() && call.argument(1).count() == 0 && call.argument(2).count() == 0;
}

/// The "reason" of a request's error.
inline std::string reasonOf(FakeCall& call)
{
    const std::string* reason = call.argument(2)["userInfo"]["reason"].asString();
    return reason ? *reason : "";
}

} // namespace tavrin::test
