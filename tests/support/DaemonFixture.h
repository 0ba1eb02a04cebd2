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

using namespace std::chrono_literals;
using platform::Dictionary;
using platform::Value;
using platform::test::FakeCall;
using platform::test::FakeConnection;
using platform::test::LogCapture;
using Strings = std::vector<std::string>;
using Task = platform::test::FakeUrlLoader::Task;

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
    Strings takeClasses();
    template <class T> std::shared_ptr<T> last() const
    {
        return records.empty() ? nullptr : std::dynamic_pointer_cast<T>(records.back()->feedback());
    }

    std::vector<std::shared_ptr<TavrinFeedback>> records;
};

/// The whole daemon on a device of twins: the test is the clients, the service and the clock.
struct DaemonTest : testing::Test {
    /// On the twin's files, or in a directory of another file system.
    explicit DaemonTest(platform::FileSystem* disk = nullptr, std::filesystem::path root = "/")
        : device(disk, std::move(root))
    {}
    ~DaemonTest() override;

    /// Lets everything under way end.
    void settle();
    void start();
    /// Starts without a bag on disk, so that the first one must be fetched.
    void startWithoutBag();

    Assembly& assembly() { return daemon->assembly; }

    /// Requests of the foreground session, in order; the first is the bag's.
    auto& tasks() { return device.loader.sessions.at(0)->tasks; }
    auto lastTask() { return tasks().back(); }
    void respond(std::string body, int status = 200, platform::HttpHeaders headers = {})
    {
        answer(*lastTask(), std::move(body), status, std::move(headers));
    }
    void answer(Task& task, std::string body, int status = 200, platform::HttpHeaders headers = {});
    /// Answers each bag request that is under way with `body`.
    void deliverBag(const std::string& body = kBag);
    /// Makes the bag stale and asks for it: the daemon then fetches a new one.
    void expireBag();

    std::shared_ptr<FakeConnection> connect(pid_t pid = 77);
    /// A client that has configured.
    std::shared_ptr<FakeConnection> client(std::string identifier = "com.quorvane.vistrel",
                                           std::string agent = "Vistrel/4", pid_t pid = 77);
    std::shared_ptr<FakeCall> configure(FakeConnection& connection, std::string identifier, std::string agent,
                                        Dictionary fields = {});
    std::shared_ptr<FakeCall> call(FakeConnection& connection, std::string_view member, std::vector<Value> args = {});
    void end(FakeConnection& connection);
    std::shared_ptr<FakeCall> report(FakeConnection& connection, std::string className, Dictionary fields = {},
                                     std::int64_t queryId = 1);
    std::shared_ptr<FakeCall> request(FakeConnection& connection, std::string className, std::int64_t queryId,
                                      Dictionary fields = {});
    std::shared_ptr<FakeCall> search(FakeConnection& connection, std::int64_t queryId, std::string query,
                                     Dictionary fields = {});
    std::int64_t counter(const std::string& name) { return device.counters.value("com.quorvane.tavrind." + name); }
    /// From now on, `operation` fails with `error` on files whose path contains `part`.
    void failOn(std::string operation, int error, std::string part = "");

    static constexpr const char* kBag =
        R"({"version": "9", "searchURL": "https://s.example/search", "warmURL": "https://s.example/warm",
        "flightURL": "https://s.example/flight", "minimumQueryLength": 2, "clients": {"news": {"isEnabled": false}}})";

    platform::test::TestDevice device;
    std::unique_ptr<Daemon> daemon;
    bool recordFeedback = true; ///< in `session`, in place of real sessions
    std::shared_ptr<RecordingSessionManager> session;
};

/// An answer that has neither record nor error.
bool isEmptyAnswer(FakeCall& call);

std::string reasonOf(FakeCall& call);

} // namespace tavrin::test
