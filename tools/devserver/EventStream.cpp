#include "tools/devserver/EventStream.h"

#include <chrono>
#include <cstdint>
#include <memory>
#include <optional>

#include "platform/values/Dictionary.h"
#include "platform/values/Json.h"
#include "tools/devserver/Service.h"

namespace devserver {

using platform::Value;

namespace {

constexpr int kMaximumStreams = 16;
constexpr std::chrono::milliseconds kTick{100}; // collects the changes of a burst
constexpr int kSilentTicks = 150;               // then a comment shows that the connection lives

class EventStream {
public:
    EventStream(Service& service, int connection) : _service(service), _connection(connection) {}
    EventStream(const EventStream&) = delete;
    EventStream& operator=(const EventStream&) = delete;
    ~EventStream() { --_service.streamCount; }

    std::optional<std::string> next()
    {
        for (int tick = 0; tick < kSilentTicks; ++tick) {
            Value event = _service.log.changesSince(_mark);
            if (event.isNull()) event = platform::Dictionary();
            if (Value state = currentState(); state != _state) {
                event.mutableDictionary().set("state", state);
                _state = std::move(state);
            }
            if (event.count() > 0) return "data: " + platform::toJson(event) + "\n\n";
            if (_service.streams.wait(kTick, _connection) != Gate::Outcome::TimeOver) return std::nullopt;
        }
        return ": nothing new\n\n";
    }

private:
    [[nodiscard]] Value currentState() const
    {
        return Value::dictionaryOf({{"status", statusOf(_service)},
                                    {"faults", _service.faults.list()},
                                    {"bag_changes", _service.bag.changes()}});
    }

    Service& _service;
    const int _connection;
    std::uint64_t _mark = 0;
    Value _state;
};

} // namespace

Value statusOf(const Service& service)
{
    Value::Array endpoints;
    for (const std::string_view name : endpointNames()) endpoints.push_back(name);
    return Value::dictionaryOf({{"bag_version", service.bag.version()},
                                {"requests", service.log.total()},
                                {"by_endpoint", service.log.byEndpoint()},
                                {"uploads", service.uploads.totals()},
                                {"faults", service.faults.count()},
                                {"max_age", service.maxAge.load()},
                                {"catalogue", service.catalogue.entries().size()},
                                {"endpoints", std::move(endpoints)}});
}

Answer eventStream(Service& service, int connection)
{
    if (++service.streamCount > kMaximumStreams) {
        --service.streamCount;
        return errorAnswer(503, "too many streams: close a console page");
    }
    return {.contentType = "text/event-stream",
            .body = "retry: 1000\n\n",
            .headers = {{"Cache-Control", "no-store"}},
            .more = [stream = std::make_shared<EventStream>(service, connection)] { return stream->next(); }};
}

} // namespace devserver
