#include <array>
#include <fstream>
#include <map>
#include <regex>
#include <thread>

#include <fmt/format.h>
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
#include "tests/support/Workers.h"
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
        if (request->queryString == "fail") return reply(request->queryId, nullptr, makeTAVError(500, "no URL"));
        if (request->queryString == "silence") return reply.abandon();
        auto echoed = std::make_shared<TAVReply>();
        echoed->rawResponse = platform::Bytes(std::string(request->className()) + ":" + request->queryString);
        reply(request->queryId, std::move(echoed), std::nullopt);
    }
    void reportEvent(const std::string&, std::int64_t, std::shared_ptr<ZRFeedback>, std::shared_ptr<void>) override {}
    void feedback(const std::string&, platform::Reply<Value::Array, OptionalError> reply) override
    {
        reply({}, std::nullopt);
    }
    void listenToFlusher(platform::Reply<std::string> reply) override { reply(""); }
    void listSessions(platform::Reply<Value::Array> reply) override { reply({}); }
    void fileHandleAndAttributesForResource(const std::string& resource, ResourceReply reply) override
    {
        reply({}, {}, makeTAVError(TAVErrorNotFound, resource));
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
        for (const Value& image : images) loaded.set(*image["id"].asString(), platform::Bytes(std::to_string(timeout)));
        reply(std::move(loaded));
    }
    Value status() override { return Dictionary(); }
    std::string statistics() override { return ""; }
    Value figures() override { return Dictionary(); }
    void waiting(platform::Reply<Value> reply) override { reply({}); }
    void previewUploads(platform::Reply<Value::Array> reply) override { reply({}); }
    void previewRequest(std::shared_ptr<TAVRequest>, platform::Reply<Value, OptionalError> reply) override
    {
        reply({}, makeTAVError(500, "no URL"));
    }
    void wipe(bool settings, platform::Reply<> reply) override
    {
        if (settings) connection.lock()->invalidate();
        reply();
    }
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
        connections.clear();
        listener.reset();
        endpoint.reset();
        transport.reset();
        platform::test::settle(pool, 2);
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

TEST_F(ClientTest, AnswersErrorsAndPushesArrive)
{
    std::optional<TAVBagAnswer> pushed;
    client->onBagDidLoad([&](TAVBagAnswer answer) { pushed = std::move(answer); });
    EXPECT_EQ(client->configure({"com.example", "Example/1"}).value(), daemon->endpoint);
    ASSERT_TRUE(client->wait([&] { return pushed.has_value(); }, 30s));
    EXPECT_EQ(pushed->error, makeTAVError(TAVErrorBagFetch, "Example/1"));
    EXPECT_EQ(client->bag()->bag->version(), "7");
    EXPECT_EQ(client->request(search("grüße", 5))->reply->rawResponse->view(), "TAVSearchRequest:grüße");
    EXPECT_EQ(client->request(search("fail", 6))->error->reason(), "no URL");
    EXPECT_EQ(client->resource("TAVQIFeatures")->error, makeTAVError(TAVErrorNotFound, "TAVQIFeatures"));

    auto view = TAVEndpointClient::connect(daemon->endpoint).value();
    EXPECT_EQ(view->request(TAVMoreResultsRequest(), {"com.example", "Example/1"})->reply->geoSessionEntityString,
              "com.example");
    for (const auto& [limit, sent] : {std::pair(3ms, "3000000"), {2min, "60000000000"}, {-1s, "0"}})
        EXPECT_EQ(view->loadImages({Dictionary{{"id", "a"}}}, limit)->at("a").view(), sent) << "a minute at most";
}

TEST_F(ClientTest, PreviewsAndWipesFailWithTheDaemonsReason)
{
    EXPECT_EQ(client->previewRequest(search("weather", 1)).error(), makeTAVError(500, "no URL"));
    EXPECT_FALSE(client->wipe(false)) << "the daemon goes on";
    EXPECT_TRUE(client->wipe(true)) << "the daemon ends the connection";
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

/// By the name of a member: types and names of its arguments, in and out, and whether it has no reply.
using Members = std::map<std::string, std::array<std::string, 5>>;

Members membersIn(const std::string& introspection)
{
    const std::regex tag(R"re(<(\w+) name="([^"]+)"(?: type="([^"]+)")?(?: direction="(\w+)")?)re");
    Members members;
    std::string interface, name;
    for (std::sregex_iterator found(introspection.begin(), introspection.end(), tag), end; found != end; ++found) {
        const std::string kind = (*found)[1];
        if (kind == "arg") {
            const std::size_t way = (*found)[4] == "out" ? 2 : 0;
            members[name].at(way) += (*found)[3];
            members[name].at(way + 1) += (members[name].at(way + 1).empty() ? "" : " ") + std::string((*found)[2]);
        } else if (kind == "annotation") {
            members[name][4] = (*found)[2];
        } else if (kind == "interface") {
            interface = (*found)[2];
        } else {
            name = interface + "." + (*found)[2].str();
            members[name];
        }
    }
    return members;
}

Members membersOf(const platform::ipc::Interface& interface)
{
    Members members;
    const auto add = [&](std::string_view home, const std::vector<platform::ipc::Member>& all) {
        for (const auto& each : all)
            members[fmt::format("{}.{}", each.interface.empty() ? home : each.interface, each.name)] = {
                std::string(each.in), std::string(each.inNames), std::string(each.out), std::string(each.outNames),
                each.noReply ? "org.freedesktop.DBus.Method.NoReply" : ""};
    };
    add(interface.name, interface.methods);
    add(interface.listenerName, interface.signals);
    return members;
}

TEST(Introspection, DescribesEveryMemberAsItIsServed)
{
    for (const platform::ipc::Interface* interface : {&daemonInterface(), &endpointInterface(), &flusherInterface()})
        EXPECT_EQ(membersIn(std::string(interface->introspection)), membersOf(*interface));
}

/// Returns a type of the document in words, as a pattern: "av of `ZRText`" is "array of .*ZRText.*".
std::string typeInWords(const std::string& documented)
{
    static const std::map<std::string, std::string> kWords{
        {"b", "boolean"}, {"x", "integer"},   {"t", "integer"},   {"d", "number"},
        {"s", "text"},    {"v", "any value"}, {"error", "error"}, {"a record", "any record"}};
    if (documented.starts_with("av of ")) return "array of " + typeInWords(documented.substr(6));
    if (documented.starts_with("`")) return ".*" + documented.substr(1, documented.size() - 2) + ".*";
    const auto word = kWords.find(documented);
    return word == kWords.end() ? "no type" : word->second;
}

TEST(Records, EveryFieldIsDocumentedWithItsType)
{
    std::ifstream file(SOURCE_DIR "/docs/ipc/records.md");
    std::map<std::string, std::string> rows;
    const std::regex row("\\| `(\\w+)` \\|.*");
    for (std::string line; std::getline(file, line);)
        if (std::smatch found; std::regex_match(line, found, row)) rows[found[1]] = line;
    const auto [events, parts] = ctl::reportableRecords();
    for (const auto* records : {&events, &parts})
        for (const auto& [name, fields] : *records) {
            std::string documented = rows[name];
            for (std::smatch base; std::regex_search(documented, base, std::regex("those of `(\\w+)`"));)
                documented = base.prefix().str() + base.suffix().str() + rows[base[1]];
            EXPECT_FALSE(documented.empty()) << name;
            for (const auto& [field, type] : *fields.asDictionary()) {
                std::smatch found;
                std::regex_search(documented, found, std::regex("`" + field + "` \\(([^:)]+)"));
                EXPECT_TRUE(field == "timestamp" ||
                            std::regex_match(*type.asString(), std::regex(typeInWords(found.str(1)))))
                    << name << "." << field << ": " << *type.asString() << ", documented as " << found.str(1);
            }
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
