// Users who type, through every step of a search: random schedules of everything that can happen on the way.

#include <cstdlib>
#include <random>

#include "platform/text/Text.h"
#include "platform/values/Json.h"
#include "tests/support/DaemonFixture.h"

namespace tavrin::test {
namespace {

/// The text that a task searches for; none for other requests.
std::optional<std::string> searchedFor(const Task& task)
{
    const platform::Url& url = task.originalRequest().url;
    return url.string().starts_with("https://s.example/search") ? url.queryValue("q") : std::nullopt;
}

using TypingTest = DaemonTest;

/// One schedule of a few users: what they send, what the service does and when, and what the device does meanwhile.
class Schedule {
public:
    Schedule(DaemonTest& test, std::uint32_t seed) : _test(test), _random(seed), _name(std::to_string(seed))
    {
        for (int i = 0; i < 2; ++i) connect(_users.emplace_back());
    }

    void run()
    {
        for (int i = 0; i < 40 && !testing::Test::HasFailure(); ++i) {
            step();
            _test.device.drain();
            judge();
        }
        while (deliverBag()) {}
        while (auto task = anyTask()) {
            respond(*task);
            _test.device.drain();
            judge();
        }
        for (User& user : _users) {
            for (const Call& call : user.calls) EXPECT_TRUE(call.call->answered()) << call.text << " isn't answered";
            disconnect(user);
        }
        for (const Call& call : _gone) EXPECT_FALSE(call.call->pending()) << call.text << " keeps its slot";
    }

private:
    struct Call {
        std::shared_ptr<FakeCall> call;
        std::int64_t id;
        std::string text;
        bool newest; ///< when it was sent; a service's answer must find it so, too
        bool withItems;
        bool judged = false;
    };
    struct User {
        std::shared_ptr<FakeConnection> connection;
        std::string text;
        std::int64_t newest = 0;
        std::vector<Call> calls;
    };

    unsigned upTo(unsigned limit) { return static_cast<unsigned>(_random() % (limit + 1)); }
    bool oneIn(unsigned count) { return upTo(count - 1) == 0; }
    User& anyUser() { return _users[upTo(static_cast<unsigned>(_users.size()) - 1)]; }

    void connect(User& user)
    {
        // Users of one identifier share a cache.
        user.connection = _test.client("com.quorvane.vistrel." + _name, oneIn(4) ? "Vistrel/5" : "Vistrel/4");
    }
    void disconnect(User& user)
    {
        _test.end(*user.connection);
        for (Call& call : user.calls) _gone.push_back(std::move(call));
        user = User();
    }

    /// Answers a request for the bag. Until the first one, every connection is suspended with its first search.
    bool deliverBag()
    {
        const auto bag = std::ranges::find_if(_test.tasks(),
                                              [](const auto& task) { return !task->finished && !searchedFor(*task); });
        if (bag == _test.tasks().end()) return false;
        _test.answer(**bag, DaemonTest::kBag);
        return true;
    }

    void step()
    {
        if (oneIn(8) && deliverBag()) return;
        switch (const unsigned what = upTo(19)) {
        case 0: _test.device.advance(std::chrono::seconds(upTo(40))); break;
        case 1: {
            User& user = anyUser();
            disconnect(user);
            connect(user);
            break;
        }
        case 2:
            if (oneIn(3))
                _test.device.locale.handler(platform::LocaleSource::Change::Locale);
            else if (oneIn(2))
                _test.device.memoryPressure.raise();
            else
                (void)_test.configure(*anyUser().connection, "com.quorvane.vistrel." + _name, "Vistrel/6");
            break;
        case 3: // several keys before the daemon runs, now and then a flood of them
            if (User& flooding = anyUser(); oneIn(4))
                for (unsigned i = 0; i < 30; ++i) key(flooding);
            else
                for (unsigned i = upTo(3); i < 4; ++i) key(anyUser());
            break;
        default:
            if (what > 9)
                key(anyUser());
            else if (auto task = anyTask())
                respond(*task);
        }
    }

    void key(User& user)
    {
        if (!user.text.empty() && oneIn(3))
            user.text.pop_back();
        else
            user.text += oneIn(8) ? 'A' : static_cast<char>('a' + upTo(2));
        const bool outOfOrder = oneIn(12);
        const std::int64_t id = user.newest + (outOfOrder ? -static_cast<int>(upTo(3)) : 1 + static_cast<int>(upTo(2)));
        Dictionary fields{{"queryString", user.text},      {"class", "TAVSearchRequest"}, {"queryId", id},
                          {"scale", oneIn(6) ? 3.0 : 2.0}, {"keyboardInputMode", "de"},   {"verboseReply", true}};
        const bool withItems = oneIn(10);
        if (withItems)
            fields.set("queryItems",
                       Value::Array{Value::dictionaryOf({{"class", "TAVQueryItem"}, {"name", "x"}, {"value", "y"}})});
        const bool newest = id > user.newest;
        user.newest = std::max(user.newest, id);
        user.calls.push_back({user.connection->call("Request", {std::move(fields)}), id, user.text, newest, withItems});
    }

    std::shared_ptr<Task> anyTask()
    {
        std::erase_if(_test.tasks(), [](const auto& task) { return task->finished; });
        std::vector<std::shared_ptr<Task>> waiting;
        for (const auto& task : _test.tasks())
            if (searchedFor(*task)) waiting.push_back(task);
        return waiting.empty() ? nullptr : waiting[upTo(static_cast<unsigned>(waiting.size()) - 1)];
    }
    void respond(Task& task)
    {
        const std::string text = *searchedFor(task);
        const platform::Date now = _test.device.clock.wallNow();
        switch (upTo(11)) {
        case 0: return task.fail(platform::Error::withReason("x", 1, "the network is gone"));
        case 1: return task.cancel();
        case 2: return task.respond(200, "no JSON");
        case 3: return task.finish(platform::Bytes("[]"), std::nullopt, std::nullopt);
        default: break;
        }
        Value::Array sets;
        for (unsigned i = upTo(2); i < 3; ++i) {
            std::string query = text;
            for (unsigned more = upTo(2); more > 0; --more) query += static_cast<char>('a' + upTo(2));
            Dictionary set{{"query", query}, {"input", text}, {"completion_score", static_cast<int>(upTo(2))}};
            set.set("made", platform::secondsSince1970(now));
            if (oneIn(2)) set.set("max_age", 20);
            if (oneIn(9)) set.set("status", "ERROR");
            sets.emplace_back(std::move(set));
        }
        task.respond(oneIn(9) ? 500 : 200, platform::toJson(sets));
    }

    /// Looks at what was answered in this step.
    void judge()
    {
        for (User& user : _users)
            for (Call& call : user.calls) {
                if (call.judged || !call.call->answered()) continue;
                call.judged = true;
                const Value reply = call.call->argument(1);
                EXPECT_EQ(call.call->argument(0), Value(call.id));
                if (reply.count() == 0) continue;
                EXPECT_TRUE(call.newest) << call.text << " was no news when it came, and got an answer";
                const platform::Bytes* raw = reply["rawResponse"].asBytes();
                const Value sets = raw ? platform::parseJson(raw->view()).value_or(Value()) : Value();
                if (reply["httpResponse"].count() == 0) {
                    judgeFromCache(call, reply, sets[0]);
                    continue;
                }
                EXPECT_EQ(call.id, user.newest) << call.text << " was overtaken, and got an answer";
                for (std::size_t i = 0; i < sets.count(); ++i) EXPECT_EQ(sets[i]["input"], Value(call.text));
            }
    }
    void judgeFromCache(const Call& call, const Value& reply, const Value& set)
    {
        const std::string typed = platform::lowerCased(call.text);
        const auto lower = [&](const char* key) {
            return set[key].asString() ? platform::lowerCased(*set[key].asString()) : "?";
        };
        EXPECT_TRUE(lower("query").starts_with(typed) && typed.starts_with(lower("input")))
            << call.text << " got " << platform::toJson(set);
        const double age =
            platform::secondsSince1970(_test.device.clock.wallNow()) - set["made"].asDouble().value_or(0);
        EXPECT_LT(age, set["max_age"].asDouble().value_or(1e9)) << call.text;
        EXPECT_NE(set["status"], Value("ERROR"));
        EXPECT_FALSE(call.withItems) << call.text << " has items of its own";
        const std::string* scale = reply["httpRequest"]["headers"]["X-Quorvane-UI-Scale"].asString();
        EXPECT_EQ(scale ? std::strtod(scale->c_str(), nullptr) : 0, reply["scale"].asDouble());
        ++hits;
    }

    DaemonTest& _test;
    std::mt19937 _random;
    const std::string _name;
    std::vector<User> _users;
    std::vector<Call> _gone; // of connections that ended

public:
    int hits = 0;
};

// SCHEDULES=100000 SEED=1 tests/daemon_tests --gtest_filter=TypingTest.NoScheduleMakesAStaleAnswer
TEST_F(TypingTest, NoScheduleMakesAStaleAnswer)
{
    const auto number = [](const char* name, int otherwise) {
        const char* text = std::getenv(name);
        return text ? std::atoi(text) : otherwise;
    };
    const int schedules = number("SCHEDULES", 400);
    const int first = number("SEED", 1);
    int hits = 0;
    for (int i = 0; i < schedules; ++i) {
        if (i % 25 == 0) { // a daemon keeps its clients' states for its life
            i % 50 == 0 ? start() : startWithoutBag();
        }
        SCOPED_TRACE("SEED=" + std::to_string(first + i) + " SCHEDULES=1");
        Schedule schedule(*this, static_cast<std::uint32_t>(first + i));
        schedule.run();
        hits += schedule.hits;
        session->records.clear();
        ASSERT_FALSE(HasFailure());
    }
    EXPECT_GT(hits, schedules / 2);
}

} // namespace
} // namespace tavrin::test
