#include "platform/ipc/Ipc.h"

#include <filesystem>
#include <fstream>
#include <future>
#include <poll.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/un.h>
#include <thread>
#include <unistd.h>

#include <gmock/gmock.h>
#include <systemd/sd-bus.h>

#include "platform/base/Log.h"
#include "platform/ipc/BusClient.h"
#include "platform/ipc/BusInput.h"
#include "platform/ipc/BusMessage.h"
#include "platform/ipc/ListenSocket.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Json.h"
#include "tests/support/FullDisk.h"
#include "tests/support/ProbeService.h"

namespace platform::ipc {
namespace {

using namespace std::chrono_literals;
using namespace platform::ipc::test;
using testing::HasSubstr;

constexpr std::size_t kBeyondSocketBuffers = 20 << 20; // a client's sd-bus asks for 8 MiB

/// A client of another make.
struct ForeignBus {
    explicit ForeignBus(const Service& service, bool messageBus = false)
    {
        sd_bus_new(&bus);
        sd_bus_set_address(bus, service.listener->endpoint().c_str());
        sd_bus_negotiate_fds(bus, true);
        sd_bus_set_bus_client(bus, messageBus);
        EXPECT_GE(sd_bus_start(bus), 0);
    }
    ~ForeignBus() { sd_bus_close_unref(bus); }
    ForeignBus(const ForeignBus&) = delete;
    ForeignBus& operator=(const ForeignBus&) = delete;

    /// The answer, or the error's text.
    std::expected<BusMessage, std::string> callAt(const char* path, const char* interface, const char* member,
                                                  const char* types, auto... values) const
    {
        sd_bus_error error = SD_BUS_ERROR_NULL;
        sd_bus_message* reply = nullptr;
        sd_bus_call_method(bus, "com.example.x", path, interface, member, &error, &reply, types, values...);
        std::string text = error.message ? error.message : "";
        sd_bus_error_free(&error);
        if (!reply) return std::unexpected(std::move(text));
        return BusMessage(reply);
    }
    auto call(auto... arguments) const { return callAt(kObjectPath, arguments...); }

    sd_bus* bus = nullptr;
};

/// A connected socket that speaks no D-Bus.
FileHandle newSocket()
{
    FileHandle socket(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
    const timeval patience{60, 0}; // only a failing test waits this long
    setsockopt(socket.fd(), SOL_SOCKET, SO_RCVTIMEO, &patience, sizeof(patience));
    return socket;
}
void connectTo(const Service& service, const FileHandle& socket)
{
    sockaddr_un address{AF_UNIX, {}};
    std::strcpy(address.sun_path, (service.directory() + "/socket").c_str());
    EXPECT_EQ(connect(socket.fd(), reinterpret_cast<sockaddr*>(&address), sizeof(address)), 0) << strerror(errno);
}
FileHandle rawConnection(const Service& service)
{
    FileHandle socket = newSocket();
    connectTo(service, socket);
    return socket;
}

/// One that is past the authentication.
FileHandle authenticatedConnection(const Service& service)
{
    FileHandle socket = rawConnection(service);
    std::string hex;
    for (const char digit : std::to_string(geteuid())) hex += "3" + std::string(1, digit);
    const std::string hello = std::string(1, '\0') + "AUTH EXTERNAL " + hex + "\r\nBEGIN\r\n";
    EXPECT_EQ(write(socket.fd(), hello.data(), hello.size()), std::ssize(hello));
    char answer[64];
    EXPECT_GT(read(socket.fd(), answer, sizeof(answer)), 2);
    return socket;
}

/// The fixed header of a call.
std::string headerOf(std::uint32_t body, std::uint32_t fields)
{
    const std::uint32_t numbers[] = {body, 1, fields};
    return std::string("l\1\0\1", 4) + std::string(reinterpret_cast<const char*>(numbers), sizeof(numbers));
}

void writeTo(const FileHandle& socket, std::string_view bytes)
{
    ASSERT_EQ(send(socket.fd(), bytes.data(), bytes.size(), MSG_NOSIGNAL), std::ssize(bytes)) << strerror(errno);
}

bool readsUntilEnd(int fd)
{
    char buffer[256];
    ssize_t got = 1;
    while (got > 0) got = read(fd, buffer, sizeof(buffer));
    return got == 0 || errno == ECONNRESET;
}

TEST(Ipc, EveryTypeSurvivesTheRoundTrip)
{
    Service service;
    auto client = service.connect();
    Value nested = Dictionary{{"leaf", "x"}};
    for (int depth = 0; depth < 32; ++depth) nested = Value::dictionaryOf({{"inner", nested}});
    const Value values = Dictionary{{"bool", true},
                                    {"int", -5},
                                    {"max", UINT64_MAX},
                                    {"double", 0.1},
                                    {"text", "gr\u00fc\u00df"},
                                    {"bytes", Bytes(std::string("\0\xff", 2))},
                                    {"list", Value::Array{1, "two", Dictionary(), nullptr}},
                                    {"nested", nested},
                                    {"date", dateFromSecondsSince1970(1.5)},
                                    {"nothing", nullptr}};
    Message sent;
    sent.args = {"a\xffz",
                 INT64_MIN,
                 UINT64_MAX,
                 UINT32_MAX,
                 INT32_MIN,
                 true,
                 1e300,
                 Bytes(std::string(1 << 20, '\0')),
                 values,
                 Value::Array{values, Dictionary()},
                 Value::Array{"p", ""}};
    Value::Array expected = sent.args;
    Value travelled = values;
    travelled.mutableDictionary().set("date", 1.5);
    travelled.mutableDictionary().remove("nothing");
    travelled.mutableDictionary().set("list", Value::Array{1, "two", Dictionary(), Dictionary()});
    expected[0] = "a\ufffdz";
    expected[8] = travelled;
    expected[9] = Value::Array{travelled, Dictionary()};

    auto got = call(*client, method("Echo"), std::move(sent));
    ASSERT_TRUE(got) << got.error().message;
    EXPECT_EQ(Value(got->args), Value(expected)) << toJson(got->args) << "\n" << toJson(expected);

    auto opened = call(*client, method("Open"), {{"through"}, {}});
    ASSERT_EQ(opened->handles.size(), 1u);
    char contents[8] = {};
    EXPECT_EQ(pread(opened->handles[0].fd(), contents, 7, 0), 7);
    EXPECT_STREQ(contents, "through");
}

TEST(Ipc, BadCallsAreAnsweredWithAnErrorThatNamesTheFaultAndTheConnectionLivesOn)
{
    Service service({.messageSize = 1 << 20});
    auto client = service.connect();
    Value deep = "leaf";
    for (int depth = 0; depth < 40; ++depth) deep = Value::Array{deep};
    for (int depth = 0; depth < 40; ++depth) deep = Value::dictionaryOf({{"k", deep}});
    const struct {
        Member member;
        Value::Array args;
        std::string name, text;
        std::string_view interface = probe().name;
    } cases[] = {
        {{"Take", "s", "s"}, {"text"}, SD_BUS_ERROR_INVALID_ARGS, "takes \"a{sv}\", not \"s\""},
        {{"Nothing", "", ""}, {}, SD_BUS_ERROR_UNKNOWN_METHOD, "Nothing"},
        {{"Hold", "", "s"}, {}, SD_BUS_ERROR_UNKNOWN_INTERFACE, "com.example.Other", "com.example.Other"},
        {{"Count", "", "u"}, {}, SD_BUS_ERROR_UNKNOWN_METHOD, "Count"}, // of another interface
        {method("Take"),
         {Dictionary{{"many", Value::Array(100000, true)}}},
         SD_BUS_ERROR_LIMITS_EXCEEDED,
         "\"many\": the arguments take more than 2097152 bytes"},
        {method("Take"), {deep}, SD_BUS_ERROR_INVALID_ARGS, "nested too deeply"},
        {method("Fail"), {}, SD_BUS_ERROR_INVALID_ARGS, "scale: not a number \ufffd"},
        {method("Misfit"), {}, SD_BUS_ERROR_FAILED, "not of type \"s\""},
    };
    for (const auto& bad : cases) {
        auto got = call(*client, bad.member, {bad.args, {}}, bad.interface);
        ASSERT_FALSE(got) << bad.text;
        EXPECT_EQ(got.error().name, bad.name) << got.error().message;
        EXPECT_THAT(got.error().message, HasSubstr(bad.text));
    }
    EXPECT_TRUE(call(*client, method("Take"), {{Dictionary()}, {}}));
    EXPECT_EQ((*call(*client, method("Count"))).args[0], Value(7));
}

TEST(Ipc, VariantsThatNoValueHoldsAreRefusedByField)
{
    Service service;
    const ForeignBus foreign(service);
    const auto answer = [&](auto... contents) {
        const auto reply = foreign.call("com.example.Probe", "Take", "a{sv}", 1, "field", contents...);
        return reply ? std::string(sd_bus_message_get_signature(reply->get(), true)) : reply.error();
    };
    EXPECT_THAT(answer("(ii)", 1, 2), HasSubstr("argument 1: \"field\": values of type 'r'"));
    EXPECT_THAT(answer("a{us}", 1, 2, "x"), HasSubstr("\"field\": a dictionary's keys"));
    EXPECT_EQ(answer("a{ss}", 1, "k", "x"), "a{sv}");             // what other languages send
    EXPECT_THAT(answer("h", STDERR_FILENO), HasSubstr("onnect")); // it is gone
}

TEST(Ipc, FloodWithoutReadingIsHeldBackAndThenAnswered)
{
    constexpr unsigned kCalls = 10'000;
    Service service({.callsInFlight = 16, .queuedBytes = 1 << 20});
    auto client = service.connect();
    auto other = service.connect();
    unsigned answered = 0;
    for (unsigned i = 0; i < kCalls; ++i)
        client->call(probe().name, method("Batch"), {},
                     [&](const CallResult& result) { answered += result.has_value(); });
    EXPECT_TRUE(call(*other, method("Count")));
    EXPECT_TRUE(client->wait([&] { return answered == kCalls; }, kLong)) << answered;
    EXPECT_EQ(service.mostHeld, 16u);
}

TEST(Ipc, DeafPeerIsDroppedAndOthersGoOn)
{
    Service service({.queuedBytes = 1 << 20});
    auto deaf = service.connect();
    auto other = service.connect();
    service.await([&] { return service.connections.size() == 2; });
    for (int i = 0; i < 3; ++i)
        service.connections[0]->push("Told", {{std::string(kBeyondSocketBuffers, 'x'), Dictionary()}, {}});
    service.await([&] { return service.notes == std::vector<std::string>{"<invalidated>"}; });
    EXPECT_TRUE(call(*other, method("Count")));
    EXPECT_FALSE(deaf->wait([] { return false; }, kLong));
    EXPECT_FALSE(deaf->connected());
}

TEST(Ipc, WaitingCallsOfADeafPeerAreDroppedWithIt)
{
    Service service({.queuedBytes = 1 << 20});
    std::promise<void> gate, given, ended;
    service.beforeGiving = [&] {
        given.set_value();
        gate.get_future().wait();
    };
    service.onPushError = [&, told = false]() mutable {
        if (!std::exchange(told, true)) ended.set_value();
    };
    auto deaf = service.connect();
    deaf->call(probe().name, method("Give"), {{1}, {}}, {});
    deaf->call(probe().name, method("Note"), {{"dropped"}, {}}, {});
    given.get_future().wait();
    service.await([&] { return service.connections.size() == 1; });
    for (int i = 0; i < 3; ++i)
        service.connections[0]->push("Told", {{std::string(kBeyondSocketBuffers, 'x'), Dictionary()}, {}});
    service.connections[0]->push("Told", {{"", Dictionary()}, {}});
    ended.get_future().wait();
    gate.set_value();
    service.await([&] { return service.notes == std::vector<std::string>{"<invalidated>"}; });
}

TEST(Ipc, WhatWaitsForAllPeersIsBoundedInSum)
{
    Service service({.unreadBytes = kBeyondSocketBuffers * 3 / 2});
    auto deaf = service.connect();
    auto deafer = service.connect();
    service.await([&] { return service.connections.size() == 2; });
    for (const unsigned peer : {0, 1})
        service.connections[peer]->push("Told", {{std::string(kBeyondSocketBuffers + peer, 'x'), Dictionary()}, {}});
    service.await([&] { return service.notes == std::vector<std::string>{"<invalidated>"}; });
    bool heard = false;
    deaf->onSignal([&](auto, auto, const Message&) { heard = true; });
    EXPECT_TRUE(deaf->wait([&] { return heard; }, kLong)) << "the one with the most is dropped";
}

TEST(Ipc, WhatAPeerSaidBeforeItVanishedStillArrivesAheadOfTheEnd)
{
    Service service({.callsInFlight = 2});
    auto client = service.connect();
    client->call(probe().name, method("Hold"), {}, [](const CallResult&) {});
    client->call(probe().name, method("Hold"), {}, [](const CallResult&) {});
    for (const char* text : {"a", "b", "c"}) client->call(probe().name, method("Note"), {{text}, {}}, {});
    service.await([&] { return service.held.size() == 2; });
    client.reset();
    service.await([&] { return service.notes == std::vector<std::string>{"a", "b", "c", "<invalidated>"}; });
    for (Responder& reply : std::exchange(service.held, {})) reply(Message{{"too late"}, {}});
    EXPECT_TRUE(call(*service.connect(), method("Count")));
}

TEST(Ipc, WhatAPeerSaidArrivesThoughAWriteToItFails)
{
    Service service;
    std::promise<void> entered, gate;
    service.onPushError = [&] {
        entered.set_value();
        gate.get_future().wait();
    };
    auto client = service.connect();
    service.await([&] { return service.connections.size() == 1; });
    service.connections[0]->push("Nothing", {}); // no such signal: its failure holds the transport
    entered.get_future().wait();
    service.connections[0]->push("Told", {{"too late", Dictionary()}, {}});
    for (const char* text : {"a", "b"}) client->call(probe().name, method("Note"), {{text}, {}}, {});
    client.reset();
    gate.set_value();
    service.await([&] { return service.notes == std::vector<std::string>{"a", "b", "<invalidated>"}; });
}

TEST(Ipc, WhatAPeerSaidBeforeItVanishedIsReadWithinTheLimits)
{
    Service service({.callsInFlight = 2, .bytes = 300u << 10});
    std::promise<void> gate;
    service.beforeGiving = [open = gate.get_future().share()] { open.wait(); };
    const auto note = [] { return Message{{std::string(30u << 10, 'x')}, {}}; }; // counts three times
    auto client = service.connect();
    client->call(probe().name, method("Give"), {{1}, {}}, {});
    for (int i = 0; i < 5; ++i) client->call(probe().name, method("Note"), note(), {});
    client.reset();
    auto other = service.connect();
    for (int i = 0; i < 3; ++i) EXPECT_TRUE(call(*other, method("Count")));
    EXPECT_TRUE(call(*other, method("Note"), note())) << "there is room for it";
    gate.set_value();
    service.await([&] { return service.notes.size() == 7 && service.notes.back() == "<invalidated>"; });
}

TEST(Ipc, InvalidationWritesTheLastAnswerAndDeliversNothingMore)
{
    Service service({.unreadBytes = 2 * kBeyondSocketBuffers});
    auto client = service.connect();
    client->call(probe().name, method("Bye"), {{4 << 20}, {}}, [&](const CallResult& got) {
        ASSERT_TRUE(got) << got.error().message;
        EXPECT_EQ(got->args[0].asBytes()->size(), 4u << 20);
    });
    client->call(probe().name, method("Note"), {{"after"}, {}}, {});
    EXPECT_FALSE(client->wait([] { return false; }, kLong));
    EXPECT_FALSE(client->connected());
    service.await([&] { return service.notes == std::vector<std::string>{"<invalidated>"}; });

    // One that doesn't read is waited for, but not for ever.
    auto deaf = service.connect();
    service.await([&] { return service.connections.size() == 2; });
    service.connections[1]->push("Told", {{std::string(kBeyondSocketBuffers, 'x'), Dictionary()}, {}});
    service.connections[1]->invalidate();
    service.settle();
    EXPECT_EQ(service.clock.pendingTimers(), 1u);
    service.pass(31s);
    unsigned heard = 0;
    deaf->onSignal([&](auto, auto, const Message&) { ++heard; });
    EXPECT_FALSE(deaf->wait([] { return false; }, kLong));
    EXPECT_EQ(heard, 0u);
}

TEST(Ipc, PeersThatDoNotSpeakTheProtocolAreDropped)
{
    Service service;
    for (const std::string& bytes : {std::string("GET / HTTP/1.1\r\n\r\n"), std::string(5000, 'A')}) {
        const FileHandle garbage = rawConnection(service);
        writeTo(garbage, bytes);
        EXPECT_TRUE(readsUntilEnd(garbage.fd()));
    }
    const FileHandle silent = rawConnection(service);
    service.await([&] { return service.connections.size() == 3; });
    service.settle();
    service.pass(31s);
    EXPECT_TRUE(readsUntilEnd(silent.fd()));

    EXPECT_TRUE(call(*service.connect(), method("Count")));
    EXPECT_EQ(service.clock.pendingTimers(), 0u) << "an idle connection would wake the service";
}

TEST(Ipc, WhatIsNoMessageOrTooLargeByItsHeaderEndsTheConnection)
{
    Service service({.messageSize = 1 << 20});
    const std::string cases[] = {
        headerOf(1 << 20, 0),
        headerOf(0, 1 << 20),
        headerOf(UINT32_MAX, UINT32_MAX),
        std::string(kFixedHeader, 'x'),
        std::string("l\1\0\2", 4) + headerOf(0, 0).substr(4),               // another version of the protocol
        headerOf(0, 8) + std::string(8, '\xff'),                            // header fields of no type
        headerOf(0, 16) + std::string("\1\1o\0\2\0\0\0/a\0\0\0\0\0\0", 16), // a call without a member
    };
    for (const std::string& bytes : cases) {
        const FileHandle peer = authenticatedConnection(service);
        writeTo(peer, bytes);
        EXPECT_TRUE(readsUntilEnd(peer.fd())) << bytes;
    }
    EXPECT_TRUE(call(*service.connect(), method("Count")));
}

TEST(Ipc, UnfinishedMessagesAreBoundedInSumAndInTime)
{
    constexpr unsigned kBody = 900 << 10; // with what its values may take, of which there is room for one
    Service service({.messageSize = 1 << 20, .bytes = 4 << 20});
    const FileHandle first = authenticatedConnection(service);
    FileHandle second = authenticatedConnection(service);
    // Whether the service takes all of a body but its last byte.
    const auto sends = [&](const FileHandle& socket, int milliseconds) {
        writeTo(socket, headerOf(kBody, 0));
        for (std::size_t sent = 0; sent < kBody - 1;) {
            const std::string part(std::min<std::size_t>(kBody - 1 - sent, 64 << 10), '\0');
            pollfd writable{socket.fd(), POLLOUT, 0};
            for (int settled = 0; settled < 3 && poll(&writable, 1, milliseconds) == 0; ++settled) service.settle();
            const ssize_t got = send(socket.fd(), part.data(), part.size(), MSG_DONTWAIT | MSG_NOSIGNAL);
            if (got < 0) return false;
            sent += got;
        }
        return true;
    };
    EXPECT_TRUE(sends(first, 20000));
    EXPECT_FALSE(sends(second, 0)) << "stays in the socket";
    auto other = service.connect();
    EXPECT_TRUE(call(*other, method("Take"), {{Dictionary{{"small", 1}}}, {}})) << "small ones pass";

    service.pass(29s);
    EXPECT_TRUE(call(*other, method("Count")));
    service.pass(2s);
    EXPECT_TRUE(readsUntilEnd(first.fd())) << "took too long";
    second = FileHandle(); // whose turn it was
    EXPECT_TRUE(call(*other, method("Take"), {{Dictionary{{"large", Bytes(std::string(kBody, 'x'))}}}, {}}));
}

TEST(Ipc, OtherUsersAreRefusedBeforeAnyoneIsAsked)
{
    EXPECT_FALSE(mayConnect(0, 1000));
    EXPECT_TRUE(mayConnect(1000, 1000));
    if (geteuid() != 0) GTEST_SKIP() << "only root can become somebody else";
    Service service;
    for (const std::string& path : {std::filesystem::path(service.directory()).parent_path().string(),
                                    service.directory(), service.directory() + "/socket"})
        chmod(path.c_str(), 0777);
    std::thread([&] {
        ASSERT_EQ(syscall(SYS_setresuid, 65534, 65534, -1), 0); // this thread's alone
        EXPECT_TRUE(readsUntilEnd(rawConnection(service).fd()));
    }).join();
    service.settle();
    EXPECT_TRUE(service.connections.empty());
}

TEST(Ipc, EndpointsAreApartFromEachOtherAndGoWithTheirListener)
{
    Service service;
    auto endpoint = service.transport->anonymous(probe(), "com.example.endpoint");
    auto second = service.transport->anonymous(probe(), "com.example.endpoint");
    EXPECT_NE(endpoint->endpoint(), second->endpoint());
    service.serve(*endpoint);
    auto client = service.connect(*endpoint);
    std::string told;
    client->onSignal([&](auto interface, auto member, const Message& message) {
        told = std::string(interface) + "." + std::string(member) + toJson(message.args);
    });
    service.await([&] { return service.connections.size() == 1; });
    EXPECT_EQ(service.connections.at(0)->queue()->label(), "com.example.endpoint");
    EXPECT_EQ(service.connections.at(0)->peer().pid, getpid());
    service.connections[0]->push("Told", {{"news", Dictionary{{"n", 1}}}, {}});
    EXPECT_TRUE(client->wait([&] { return !told.empty(); }, kLong));
    EXPECT_EQ(told, "com.example.Listener.Told[\"news\",{\"n\":1}]");

    const std::string address = endpoint->endpoint();
    endpoint.reset();
    EXPECT_FALSE(Client::connect(address, kObjectPath, kLong));
    EXPECT_TRUE(call(*client, method("Count"))) << "a connection outlives its listener";
}

TEST(Ipc, AnEndpointWhoseSocketCantBeCreatedIsTriedAgain)
{
    namespace fs = std::filesystem;
    Service service;
    const fs::path directory = service.directory(), aside = directory.string() + ".aside";
    fs::rename(directory, aside);
    std::ofstream(directory) << "not a directory";
    const auto endpoint = service.transport->anonymous(probe(), "com.example.endpoint");
    service.serve(*endpoint);
    EXPECT_EQ(endpoint->endpoint(), "");

    fs::remove(directory);
    fs::rename(aside, directory);
    const auto client = service.connect(*endpoint);
    EXPECT_TRUE(call(*client, method("Count")));
    EXPECT_EQ(endpoint->endpoint(), endpoint->endpoint());
}

TEST(Ipc, ConnectionsBeyondTheLimitWaitForTheirTurn)
{
    Service service({.connections = 1});
    auto first = service.connect();
    const FileHandle second = rawConnection(service);
    service.settle();
    service.await([&] { return service.connections.size() == 1; });
    first.reset();
    service.await([&] { return service.connections.size() == 2; });
}

TEST(Ipc, OneProcessCannotTakeAllConnections)
{
    Service service({.connectionsPerProcess = 1});
    auto first = service.connect();
    EXPECT_TRUE(readsUntilEnd(rawConnection(service).fd()));
    EXPECT_TRUE(call(*first, method("Count")));
    first.reset();
    service.await([&] { return service.notes == std::vector<std::string>{"<invalidated>"}; });
    service.settle();
    EXPECT_TRUE(call(*service.connect(), method("Count"))) << "its place is free again";
}

#if !defined(__SANITIZE_ADDRESS__) && !defined(__clang__) // the checks of sanitizers take descriptors of their own
TEST(Ipc, AProcessShortOfDescriptorsAcceptsLater)
{
    Service service;
    std::promise<void> starved;
    int starvations = 0;
    LogTap tap([&](const LogLine& line) {
        if (line.text.find("can't accept") != std::string::npos && ++starvations == 1) starved.set_value();
    });
    const FileHandle socket = newSocket();
    platform::test::withLimit(RLIMIT_NOFILE, 1, [&] {
        connectTo(service, socket);
        starved.get_future().wait();
        service.settle();
    });
    EXPECT_EQ(starvations, 1);
    service.pass(1s);
    service.await([&] { return service.connections.size() == 1; });
}
#endif

// Bindings that were made for a message bus take signals of the name's owner only, and start the service first.
TEST(Ipc, EveryMessageHasASenderTheServiceCountsAsRunningAndIsIntrospected)
{
    Service service;
    const ForeignBus foreign(service, true); // greets, as on a message bus
    const auto senderOf = [](sd_bus_message* message) {
        const char* sender = sd_bus_message_get_sender(message);
        return std::string(sender ? sender : "nobody");
    };
    const auto answersTo = [&](const char* interface, const char* member, const char* types, auto... values) {
        const auto reply = foreign.call(interface, member, types, values...);
        return reply ? senderOf(reply->get()) : reply.error();
    };
    constexpr const char* kBus = "org.freedesktop.DBus";
    EXPECT_EQ(answersTo(kBus, "StartServiceByName", "su", "com.example.x", 0), ":1.0");
    EXPECT_EQ(answersTo(kBus, "NameHasOwner", "s", "com.example.x"), ":1.0");
    EXPECT_EQ(answersTo("org.freedesktop.DBus.Peer", "Ping", ""), ":1.0");
    EXPECT_EQ(answersTo("com.example.Extra", "Count", ""), ":1.0");
    for (const auto& [path, contents] : {std::pair("/", "com"), {kObjectPath, "Hold"}}) {
        const auto reply = foreign.callAt(path, "org.freedesktop.DBus.Introspectable", "Introspect", "");
        ASSERT_TRUE(reply) << reply.error();
        const char* text = "";
        sd_bus_message_read(reply->get(), "s", &text);
        EXPECT_THAT(text, HasSubstr(std::string("name=\"") + contents));
    }

    service.await([&] { return service.connections.size() == 1; });
    service.connections.at(0)->push("Told", {{"news", Dictionary()}, {}});
    sd_bus_message* told = nullptr;
    while (!told && sd_bus_wait(foreign.bus, 60'000'000) > 0)
        while (!told && sd_bus_process(foreign.bus, &told) > 0) {}
    ASSERT_TRUE(told);
    EXPECT_EQ(senderOf(BusMessage(told).get()), ":1.0");
}

} // namespace
} // namespace platform::ipc
