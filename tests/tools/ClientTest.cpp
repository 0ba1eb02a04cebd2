#include <fstream>
#include <map>
#include <regex>
#include <sys/mman.h>
#include <thread>
#include <unistd.h>

#include <gmock/gmock.h>

#include "CoreTavrin/TAVBag.h"
#include "CoreTavrin/TAVClient.h"
#include "CoreTavrin/TAVError.h"
#include "CoreTavrin/TAVProtocols.h"
#include "CoreTavrin/TAVReply.h"
#include "CoreTavrin/TAVRequest.h"
#include "CoreTavrin/TAVSessionConfiguration.h"
#include "platform/ipc/BusTransport.h"
#include "platform/run/RunLoop.h"
#include "platform/run/WorkerPool.h"
#include "platform/values/Dictionary.h"
#include "searchrecords/ZRRecords.h"
#include "searchrecords/ZRViewFeedback.h"
#include "tests/support/ManualClock.h"
#include "tests/support/TemporaryDirectory.h"
#include "tools/tavrinctl/FeedbackRecords.h"

namespace tavrin::test {
namespace {

using namespace std::chrono_literals;
using platform::Dictionary;
using platform::Value;

std::shared_ptr<const TAVBag> someBag()
{
    return std::make_shared<const TAVBag>(Value::dictionaryOf({{"version", "7"}}), "Example/1");
}

/// Answers every operation of the daemon with what it was asked, so that both directions are seen. On the connection's
/// queue; `closing` says what an invalid configuration does.
struct EchoDaemon final : TAVDaemonXPC, TAVDiagnosticsXPC, TAVEndpointXPC {
    std::shared_ptr<TAVClientXPC> client;
    std::weak_ptr<platform::ipc::Connection> connection;
    std::string endpoint;
    std::unique_ptr<platform::ipc::Listener> flusher;
    std::vector<RequestReply> held;
    std::mutex mutex;
    std::vector<std::string> events;

    void configure(std::shared_ptr<TAVSessionConfiguration> configuration, platform::Reply<std::string> reply) override
    {
        if (!configuration->identifier) {
            reply.abandon();
            return connection.lock()->invalidate();
        }
        reply(endpoint);
        client->bagDidLoad(someBag(), makeTAVError(TAVErrorBagFetch, *configuration->userAgent));
    }
    void bag(BagReply reply) override { reply(someBag(), std::nullopt); }
    void request(std::shared_ptr<TAVRequest> request, RequestReply reply) override
    {
        if (request->queryString == "hold") return held.push_back(std::move(reply));
        if (request->queryString == "fail") return reply(request->queryId, nullptr, makeTAVError(500, "no URL"));
        if (request->queryString == "silence") return reply.abandon();
        for (RequestReply& earlier : std::exchange(held, {})) earlier(-1, nullptr, std::nullopt);
        auto echoed = std::make_shared<TAVReply>();
        echoed->rawResponse = platform::Bytes(std::string(request->className()) + ":" + request->queryString);
        reply(request->queryId, std::move(echoed), std::nullopt);
    }
    void reportEvent(const std::string& event, std::int64_t queryId, std::shared_ptr<ZRFeedback> feedback,
                     std::shared_ptr<void>) override
    {
        std::lock_guard lock(mutex);
        events.push_back(event + " " + std::to_string(queryId) + " " + std::string(feedback->className()));
    }
    void feedback(const std::string&, platform::Reply<Value::Array, OptionalError> reply) override
    {
        std::lock_guard lock(mutex);
        Value::Array all;
        for (const std::string& event : events) all.push_back(Value::dictionaryOf({{"event", event}}));
        reply(std::move(all), std::nullopt);
    }
    void listenToFlusher(platform::Reply<std::string> reply) override
    {
        reply(flusher ? flusher->endpoint() : "unix:path=/flusher");
    }
    void listSessions(platform::Reply<Value::Array> reply) override
    {
        reply({Value::dictionaryOf({{"identifier", "com.example"}, {"agent", "Example/1"}})});
    }
    void fileHandleAndAttributesForResource(const std::string& resource, ResourceReply reply) override
    {
        if (resource.empty()) return reply({}, {}, makeTAVError(TAVErrorNotFound, "no such resource"));
        platform::FileHandle file(memfd_create("resource", MFD_CLOEXEC));
        EXPECT_EQ(write(file.fd(), resource.data(), resource.size()), static_cast<ssize_t>(resource.size()));
        reply(std::move(file), Value::dictionaryOf({{"version", 3}}), std::nullopt);
    }
    void request(std::shared_ptr<TAVRequest> request, std::shared_ptr<TAVSessionConfiguration> configuration,
                 RequestReply reply) override
    {
        auto echoed = std::make_shared<TAVReply>();
        echoed->geoSessionEntityString = *configuration->identifier;
        reply(request->queryId, std::move(echoed), std::nullopt);
    }
    void loadImages(Value::Array images, std::uint64_t timeout, platform::Reply<Value> reply) override
    {
        Dictionary loaded;
        for (const Value& image : images)
            loaded.set(*image["id"].asString(), platform::Bytes(std::string("\0pixels", 7) + std::to_string(timeout)));
        reply(std::move(loaded));
    }
    Value status() override { return Value::dictionaryOf({{"pid", 1}}); }
    std::string statistics() override { return "# EOF\n"; }
};

/// The daemon's listeners on real sockets, with an `EchoDaemon` behind them.
struct ClientTest : testing::Test {
    ClientTest()
    {
        platform::failOnReplyMisuse();
        transport = platform::ipc::makeBusTransport(loop, pool, clock, temporary / "service");
        endpoint = transport->anonymous(endpointInterface(), "test.endpoint");
        daemon->endpoint = endpoint->endpoint();
        endpoint->setAcceptor([this](auto connection) {
            connection->exportObject(endpointHandler(daemon));
            connection->resume();
            connections.push_back(std::move(connection));
        });
        endpoint->resume();
        listener = std::move(*transport->listen(daemonInterface(), "test.connection"));
        listener->setAcceptor([this](auto connection) {
            daemon->client = makeClientProxy(connection);
            daemon->connection = connection;
            connection->exportObject(daemonHandler(daemon, daemon));
            connection->resume();
            connections.push_back(std::move(connection));
        });
        listener->resume();
        thread = std::thread([this] { loop.run(); });
        client = TAVClient::connect(listener->endpoint()).value();
    }
    ~ClientTest() override
    {
        client.reset();
        loop.stop();
        thread.join();
        for (RequestReply& reply : daemon->held) reply.abandon();
        connections.clear();
        daemon->flusher.reset();
        listener.reset();
        endpoint.reset();
        transport.reset();
    }

    TAVSearchRequest search(std::string query, std::int64_t queryId)
    {
        TAVSearchRequest request;
        request.queryString = std::move(query);
        request.queryId = queryId;
        return request;
    }

    const platform::test::TemporaryDirectory temporary;
    platform::RunLoop loop;
    platform::WorkerPool pool{2};
    platform::test::ManualClock clock;
    std::shared_ptr<EchoDaemon> daemon = std::make_shared<EchoDaemon>();
    std::unique_ptr<platform::ipc::Transport> transport;
    std::unique_ptr<platform::ipc::Listener> listener, endpoint;
    std::vector<std::shared_ptr<platform::ipc::Connection>> connections;
    std::thread thread;
    std::unique_ptr<TAVClient> client;
};

TEST_F(ClientTest, EveryOperationCrossesBothWays)
{
    std::optional<TAVBagAnswer> pushed;
    client->onBagDidLoad([&](TAVBagAnswer answer) { pushed = std::move(answer); });
    EXPECT_EQ(client->configure({"com.example", "Example/1"}).value(), daemon->endpoint);
    ASSERT_TRUE(client->wait([&] { return pushed.has_value(); }, 30s));
    EXPECT_EQ(pushed->bag->version(), "7");
    EXPECT_EQ(pushed->error, makeTAVError(TAVErrorBagFetch, "Example/1"));

    EXPECT_EQ(client->bag()->bag->rawBag()["version"], Value("7"));
    const auto answer = client->request(search("grüße", 5)).value();
    EXPECT_EQ(answer.queryId, 5);
    EXPECT_EQ(answer.reply->rawResponse->view(), "TAVSearchRequest:grüße");
    EXPECT_FALSE(answer.error);
    EXPECT_EQ(client->request(search("fail", 6))->error->reason(), "no URL");

    client->reportEvent("seen", 5, ZRSearchViewAppearFeedback());
    EXPECT_EQ(client->feedback().value(),
              Value::Array{Value::dictionaryOf({{"event", "seen 5 ZRSearchViewAppearFeedback"}})});
    EXPECT_EQ(client->listenToFlusher().value(), "unix:path=/flusher");
    EXPECT_EQ(client->sessions()->front()["agent"], Value("Example/1"));
    EXPECT_EQ(client->status().value()["pid"], Value(1));
    EXPECT_EQ(client->statistics().value(), "# EOF\n");

    const auto resource = client->resource("TAVQIFeatures").value();
    char content[32] = {};
    EXPECT_EQ(pread(resource.file.fd(), content, sizeof(content), 0), 13) << "a descriptor of one's own";
    EXPECT_STREQ(content, "TAVQIFeatures");
    EXPECT_EQ(resource.attributes["version"], Value(3));
    const auto missing = client->resource("").value();
    EXPECT_FALSE(missing.file);
    EXPECT_EQ(missing.error->code, TAVErrorNotFound);

    auto view = TAVEndpointClient::connect(daemon->endpoint).value();
    EXPECT_EQ(view->request(TAVMoreResultsRequest(), {"com.example", "Example/1"})->reply->geoSessionEntityString,
              "com.example");
    EXPECT_EQ(view->loadImages({Dictionary{{"id", "a"}}, Dictionary{{"id", "b"}}}, 3ms).value(),
              (std::map<std::string, platform::Bytes>{{"a", platform::Bytes(std::string("\0pixels3000000", 14))},
                                                      {"b", platform::Bytes(std::string("\0pixels3000000", 14))}}));
    EXPECT_EQ(view->loadImages({Dictionary{{"id", "a"}}}, 2min)->at("a").view().substr(7), "60000000000")
        << "a minute at most";
    EXPECT_EQ(view->loadImages({Dictionary{{"id", "a"}}}, -1s)->at("a").view().substr(7), "0");
}

TEST_F(ClientTest, RequestsAreOutstandingSideBySide)
{
    std::vector<std::int64_t> answered;
    const auto note = [&](platform::Result<TAVAnswer> answer) { answered.push_back(answer->queryId); };
    client->send(search("hold", 1), note);
    client->send(search("weather", 2), note);
    ASSERT_TRUE(client->wait([&] { return answered.size() == 2; }, 30s));
    EXPECT_EQ(answered, (std::vector<std::int64_t>{-1, 2}));
}

TEST_F(ClientTest, ARefusedConfigurationClosesTheConnection)
{
    const auto endpoint = client->configure({});
    ASSERT_FALSE(endpoint);
    EXPECT_FALSE(client->connected());
    EXPECT_EQ(endpoint.error().domain, TAVClientErrorDomain);
    EXPECT_FALSE(client->bag()) << "a call on a closed connection fails, and doesn't wait";
}

TEST_F(ClientTest, SilenceEndsInATimeOut)
{
    client->setTimeout(20ms);
    const auto answer = client->request(search("silence", 1));
    ASSERT_FALSE(answer);
    EXPECT_THAT(answer.error().reason(), testing::HasSubstr("no answer to Request within 0.02 s"));
}

/// A bridge that tells its tool of the intent, in all three ways.
struct EchoBridge final : TAVFlusherXPC {
    std::shared_ptr<TAVFlusherListener> tool;
    void initiateConnectionWithIntent(std::uint64_t intent) override
    {
        tool->flushedData(platform::Bytes("body"));
        tool->receivedFeedbackDescription("intent " + std::to_string(intent));
        tool->workDone();
    }
};

struct Notes final : TAVFlusherListener {
    std::vector<std::string> all;
    void flushedData(const platform::Bytes& body) override { all.emplace_back(body.view()); }
    void receivedFeedbackDescription(const std::string& description) override { all.push_back(description); }
    void workDone() override { all.emplace_back("done"); }
};

TEST_F(ClientTest, TheBridgeAnswersAndTellsItsTool)
{
    auto bridge = std::make_shared<EchoBridge>();
    daemon->flusher = transport->anonymous(flusherInterface(), "test.flusher");
    daemon->flusher->setAcceptor([&](auto connection) {
        bridge->tool = makeFlusherListenerProxy(connection);
        connection->exportObject(flusherHandler(bridge));
        connection->resume();
        connections.push_back(std::move(connection));
    });
    daemon->flusher->resume();

    Notes notes;
    const auto tool = TAVFlusherClient::connect(client->listenToFlusher().value(), notes).value();
    ASSERT_TRUE(tool->initiateConnection(FlusherIntent::Dump));
    ASSERT_TRUE(tool->wait([&] { return notes.all.size() == 3; }, 30s));
    EXPECT_EQ(notes.all, (std::vector<std::string>{"body", "intent 3", "done"}));
}

TEST_F(ClientTest, AReportedEventIsTakenOrRefused)
{
    std::vector<bool> taken;
    const auto note = [&](const platform::Result<void>& result) { taken.push_back(result.has_value()); };
    ZRErrorFeedback large;
    large.error = platform::Error::withReason("D", 1, std::string(9u << 20, 'x')); // more than a message may have
    client->reportEvent("seen", 1, ZRSearchViewAppearFeedback(), note);
    client->reportEvent("failed", 1, large, note);
    ASSERT_TRUE(client->wait([&] { return taken.size() == 2; }, 30s));
    EXPECT_THAT(taken, testing::UnorderedElementsAre(true, false));
    EXPECT_TRUE(client->status()) << "the connection lives on";
}

/// The members that an introspection text describes, a line each.
std::vector<std::string> membersIn(std::string_view introspection)
{
    const std::regex tag(R"re(<(interface|method|signal|arg|annotation) name="([^"]+)"(?: type="([^"]+)")?)re"
                         R"re((?: direction="([^"]+)")?(?: value="([^"]+)")?)re");
    std::vector<std::string> members;
    std::string interface, in, out, inNames, outNames, name, suffix;
    const auto finish = [&] {
        if (!name.empty())
            members.push_back(interface + "." + name + "(" + in + inNames + ")" + out + outNames + suffix);
        in = out = inNames = outNames = name = suffix = "";
    };
    for (std::cregex_iterator found(introspection.begin(), introspection.end(), tag), end; found != end; ++found) {
        const std::string kind = (*found)[1];
        if (kind == "arg") {
            ((*found)[4] == "out" ? out : in) += (*found)[3];
            ((*found)[4] == "out" ? outNames : inNames) += " " + std::string((*found)[2]);
        } else if (kind == "annotation") {
            suffix = " " + std::string((*found)[2]) + " " + std::string((*found)[5]);
        } else {
            finish();
            (kind == "interface" ? interface : name) = (*found)[2];
        }
    }
    finish();
    return members;
}

std::vector<std::string> membersOf(const platform::ipc::Interface& interface)
{
    std::vector<std::string> members;
    const auto add = [&](std::string_view home, const std::vector<platform::ipc::Member>& all) {
        for (const auto& member : all) {
            const auto names = [](std::string_view list) { return list.empty() ? "" : " " + std::string(list); };
            members.push_back(std::string(member.interface.empty() ? home : member.interface) + "." +
                              std::string(member.name) + "(" + std::string(member.in) + names(member.inNames) + ")" +
                              std::string(member.out) + names(member.outNames) +
                              (member.noReply ? " org.freedesktop.DBus.Method.NoReply true" : ""));
        }
    };
    add(interface.name, interface.methods);
    add(interface.listenerName, interface.signals);
    return members;
}

TEST(Introspection, DescribesEveryMemberAsItIsServed)
{
    for (const platform::ipc::Interface* interface : {&daemonInterface(), &endpointInterface(), &flusherInterface()})
        EXPECT_THAT(membersIn(interface->introspection), testing::UnorderedElementsAreArray(membersOf(*interface)));
}

TEST(Records, EveryEventAndItsFieldsAreDocumented)
{
    std::ifstream file(SOURCE_DIR "/docs/ipc/records.md");
    std::map<std::string, std::string> rows;
    const std::regex row("\\| `(\\w+)` \\|.*");
    for (std::string line; std::getline(file, line);)
        if (std::smatch found; std::regex_match(line, found, row)) rows[found[1]] = line;
    for (const auto& [name, fields] : ctl::reportableRecords()) {
        std::string documented = rows[name];
        for (std::smatch base; std::regex_search(documented, base, std::regex("those of `(\\w+)`"));)
            documented = base.prefix().str() + base.suffix().str() + rows[base[1]];
        for (const Value& field : *fields.asArray())
            EXPECT_TRUE(*field.asString() == "timestamp" || documented.contains("`" + *field.asString() + "`"))
                << name << "." << *field.asString();
        EXPECT_FALSE(documented.empty()) << name;
    }
}

TEST(Client, WithoutADaemonSaysWhereItLooked)
{
    const auto client = TAVClient::connect("unix:path=/nowhere/socket");
    ASSERT_FALSE(client);
    EXPECT_THAT(client.error().reason(), testing::HasSubstr("/nowhere/socket"));
}

} // namespace
} // namespace tavrin::test
