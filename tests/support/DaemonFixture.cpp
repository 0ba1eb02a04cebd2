#include "tests/support/DaemonFixture.h"

#include "tavrind/TavrinBagController.h"

namespace tavrin::test {

Strings RecordingSessionManager::takeClasses()
{
    Strings classes;
    for (const auto& record : std::exchange(records, {})) classes.emplace_back(record->feedback()->className());
    return classes;
}

DaemonTest::~DaemonTest()
{
    device.files.fault = {}; // it may refer to what the test had
    settle();
}

void DaemonTest::settle()
{
    const auto endLoads = [this] {
        do device.drain();
        while (device.loader.cancelAll());
    };
    endLoads();
    device.ipc.endAll();
    endLoads(); // what is recorded of a client's end may ask for a fresh bag
}

void DaemonTest::start()
{
    settle();
    daemon.reset();
    device.drain();
    device.loader.sessions.clear();
    daemon = startUp(device.device).value();
    if (recordFeedback)
        assembly().clientSessionManager = session = std::make_shared<RecordingSessionManager>(assembly());
    device.drain();
}

void DaemonTest::startWithoutBag()
{
    device.files.files.clear();
    start();
}

void DaemonTest::answer(Task& task, std::string body, int status, platform::HttpHeaders headers)
{
    task.respond(status, std::move(body), std::move(headers));
    device.drain();
}

void DaemonTest::deliverBag(const std::string& body)
{
    for (const auto& task : std::vector(tasks()))
        if (task->originalRequest().url.path() == "/bag") answer(*task, body);
}

void DaemonTest::expireBag()
{
    device.clock.setWall(device.clock.wallNow() + 14400s);
    (void)assembly().bagController->currentBag();
    device.drain();
}

std::shared_ptr<FakeConnection> DaemonTest::connect(pid_t pid)
{
    auto connection = device.ipc.connect("com.quorvane.TAVDaemonXPC", {.pid = pid, .uid = 0});
    device.drain();
    return connection;
}

std::shared_ptr<FakeConnection> DaemonTest::client(std::string identifier, std::string agent, pid_t pid)
{
    auto connection = connect(pid);
    configure(*connection, std::move(identifier), std::move(agent));
    return connection;
}

std::shared_ptr<FakeCall> DaemonTest::configure(FakeConnection& connection, std::string identifier, std::string agent,
                                                Dictionary fields)
{
    fields.set("class", "TAVSessionConfiguration");
    fields.set("identifier", std::move(identifier));
    fields.set("userAgent", std::move(agent));
    return call(connection, "Configure", {std::move(fields)});
}

std::shared_ptr<FakeCall> DaemonTest::call(FakeConnection& connection, std::string_view member, std::vector<Value> args)
{
    auto made = connection.call(member, std::move(args));
    device.drain();
    return made;
}

void DaemonTest::end(FakeConnection& connection)
{
    connection.end();
    device.drain();
}

std::shared_ptr<FakeCall> DaemonTest::report(FakeConnection& connection, std::string className, Dictionary fields,
                                             std::int64_t queryId)
{
    fields.set("class", std::move(className));
    return call(connection, "ReportEvent", {"event", queryId, std::move(fields)});
}

std::shared_ptr<FakeCall> DaemonTest::request(FakeConnection& connection, std::string className, std::int64_t queryId,
                                              Dictionary fields)
{
    fields.set("class", std::move(className));
    fields.set("queryId", queryId);
    if (!fields.contains("scale")) fields.set("scale", 2.0);
    if (!fields.contains("keyboardInputMode")) fields.set("keyboardInputMode", "de");
    return call(connection, "Request", {std::move(fields)});
}

std::shared_ptr<FakeCall> DaemonTest::search(FakeConnection& connection, std::int64_t queryId, std::string query,
                                             Dictionary fields)
{
    fields.set("queryString", std::move(query));
    return request(connection, "TAVSearchRequest", queryId, std::move(fields));
}

void DaemonTest::failOn(std::string operation, int error, std::string part)
{
    device.files.fault = [=](std::string_view op, const std::filesystem::path& path) {
        return op == operation && path.string().contains(part) ? error : 0;
    };
}

bool isEmptyAnswer(FakeCall& call)
{
    return call.answered() && call.argument(1).count() == 0 && call.argument(2).count() == 0;
}

std::string reasonOf(FakeCall& call)
{
    const std::string* reason = call.argument(2)["userInfo"]["reason"].asString();
    return reason ? *reason : "";
}

} // namespace tavrin::test
