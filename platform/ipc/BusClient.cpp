#include "platform/ipc/BusClient.h"

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <poll.h>
#include <time.h>

#include <fmt/format.h>
#include <systemd/sd-bus.h>

#include "platform/ipc/BusMessage.h"

namespace platform::ipc {

namespace {

/// Replies may be as large as sd-bus allows.
constexpr std::size_t kMaximumPeerAnswer = 128u << 20;

std::uint64_t monotonicMicroseconds()
{
    timespec now{};
    clock_gettime(CLOCK_MONOTONIC, &now);
    return static_cast<std::uint64_t>(now.tv_sec) * 1'000'000 + static_cast<std::uint64_t>(now.tv_nsec) / 1'000;
}

std::uint64_t microseconds(Duration duration)
{
    const auto count = std::chrono::duration_cast<std::chrono::microseconds>(duration).count();
    return count > 0 ? static_cast<std::uint64_t>(count) : 0;
}

/// Blocks until the bus has work, `descriptor` is readable (-1 for none), a signal was handled, or the deadline has
/// passed. Returns false if poll fails.
bool waitForInput(sd_bus* bus, int descriptor, std::uint64_t now, std::uint64_t deadline)
{
    const int events = sd_bus_get_events(bus);
    std::uint64_t callTimesOut = UINT64_MAX;
    if (events < 0 || sd_bus_get_timeout(bus, &callTimesOut) < 0) return false;
    const std::uint64_t until = std::min(callTimesOut, deadline);
    const std::uint64_t left = until > now ? until - now : 0;
    const timespec timeout{static_cast<time_t>(left / 1'000'000), static_cast<long>(left % 1'000'000 * 1'000)};
    pollfd watched[] = {{sd_bus_get_fd(bus), static_cast<short>(events), 0}, {descriptor, POLLIN, 0}};
    return ppoll(watched, std::size(watched), &timeout, nullptr) >= 0 || errno == EINTR;
}

/// Decodes a received message; fails if it doesn't have `signature`.
CallResult decodeAs(sd_bus_message* message, std::string_view signature, const RecordArguments& records)
{
    const char* actual = sd_bus_message_get_signature(message, true);
    if (!actual || signature != actual)
        return std::unexpected(CallError{SD_BUS_ERROR_INVALID_SIGNATURE, fmt::format("the answer is \"{}\", not \"{}\"",
                                                                                     actual ? actual : "", signature)});
    auto decoded = decodeArguments(message, kMaximumPeerAnswer, records);
    if (!decoded) return std::unexpected(std::move(decoded.error()));
    return std::move(decoded->message);
}

} // namespace

struct Client::Impl {
    /// A call that was sent; owned by its bus slot.
    struct PendingCall {
        PendingCall(const Member& member, Answer answer_)
            : signature(member.out), records(member.outRecords), answer(std::move(answer_))
        {}
        std::string signature; ///< of the answer
        RecordArguments records;
        Answer answer;
    };

    /// A call that couldn't be sent. Its answer runs inside the next `wait`, like others.
    struct Failure {
        Answer answer;
        CallError error;
    };

    std::string path; ///< of the object that is called
    std::unique_ptr<sd_bus, BusUnref> bus;
    std::vector<Failure> failures;
    std::function<void(std::string_view, std::string_view, Message)> signalHandler;

    void onSignal(sd_bus_message* message)
    {
        const char* interface = sd_bus_message_get_interface(message);
        const char* member = sd_bus_message_get_member(message);
        if (!signalHandler || !interface || !member || std::strcmp(interface, "org.freedesktop.DBus.Local") == 0)
            return;
        if (auto decoded = decodeArguments(message, kMaximumPeerAnswer))
            signalHandler(interface, member, std::move(decoded->message));
    }

    static int onReply(sd_bus_message* message, void* userdata, sd_bus_error*)
    {
        // sd-bus destroys the slot, and with it the call, after this returns. The answer may make new calls.
        auto& call = *static_cast<PendingCall*>(userdata);
        Answer answer = std::move(call.answer);
        if (!answer) return 0;
        if (const sd_bus_error* error = sd_bus_message_get_error(message))
            answer(std::unexpected(CallError{error->name ? error->name : "", error->message ? error->message : ""}));
        else
            answer(decodeAs(message, call.signature, call.records));
        return 0;
    }
};

Client::Client() : _impl(std::make_unique<Impl>()) {}
Client::~Client() = default;

Result<std::unique_ptr<Client>> Client::connect(const std::string& address, std::string objectPath, Duration timeout)
{
    std::unique_ptr<Client> client(new Client());
    Impl* impl = client->_impl.get();
    impl->path = std::move(objectPath);

    sd_bus* bus = nullptr;
    int result = sd_bus_new(&bus);
    if (result < 0) return std::unexpected(Error::posix(-result, address));
    impl->bus.reset(bus);
    result = sd_bus_set_address(bus, address.c_str());
    if (result >= 0) result = sd_bus_negotiate_fds(bus, true);
    if (result >= 0)
        result = sd_bus_add_filter(
            bus, nullptr,
            [](sd_bus_message* message, void* self, sd_bus_error*) {
                std::uint8_t type = 0;
                sd_bus_message_get_type(message, &type);
                if (type == SD_BUS_MESSAGE_SIGNAL) static_cast<Impl*>(self)->onSignal(message);
                return 0;
            },
            impl);
    if (result >= 0) result = sd_bus_start(bus);
    if (result < 0) return std::unexpected(Error::posix(-result, address));
    if (client->wait([bus] { return sd_bus_is_ready(bus) > 0; }, timeout)) return client;
    return std::unexpected(Error::posix(client->connected() ? ETIMEDOUT : ECONNREFUSED, address));
}

void Client::call(std::string_view interface, const Member& member, Message arguments, Answer answer)
{
    const std::string interfaceName(member.interface.empty() ? interface : member.interface);
    const std::string name(member.name);
    const auto fail = [&](std::string reason) {
        _impl->failures.push_back({std::move(answer), CallError{SD_BUS_ERROR_FAILED, std::move(reason)}});
    };

    sd_bus_message* raw = nullptr;
    int result = sd_bus_message_new_method_call(_impl->bus.get(), &raw, nullptr, _impl->path.c_str(),
                                                interfaceName.c_str(), name.c_str());
    const BusMessage message(raw);
    if (result < 0) return fail(std::strerror(-result));
    const auto encoded = encodeArguments(raw, member.in, arguments);
    if (!encoded) return fail(encoded.error());
    // The service would close the connection.
    if (*encoded > Limits().messageSize)
        return fail(fmt::format("the call has {} bytes; the limit is {}", *encoded, Limits().messageSize));

    if (!answer) {
        result = sd_bus_message_set_expect_reply(raw, false);
        if (result >= 0) result = sd_bus_send(_impl->bus.get(), raw, nullptr);
        if (result < 0) fail(std::strerror(-result));
        return;
    }
    auto pending = std::make_unique<Impl::PendingCall>(member, std::move(answer));
    sd_bus_slot* slot = nullptr;
    result = sd_bus_call_async(_impl->bus.get(), &slot, raw, &Impl::onReply, pending.get(), UINT64_MAX);
    if (result < 0) {
        answer = std::move(pending->answer);
        return fail(std::strerror(-result));
    }
    sd_bus_slot_set_destroy_callback(slot, [](void* call) { delete static_cast<Impl::PendingCall*>(call); });
    (void)pending.release(); // the slot owns it
    sd_bus_slot_set_floating(slot, true);
    sd_bus_slot_unref(slot);
}

void Client::onSignal(std::function<void(std::string_view, std::string_view, Message)> handler)
{
    _impl->signalHandler = std::move(handler);
}

bool Client::wait(const std::function<bool()>& done, Duration timeout, int descriptor)
{
    const std::uint64_t deadline = monotonicMicroseconds() + microseconds(timeout);
    sd_bus* bus = _impl->bus.get();
    bool mayHaveInput = false;
    for (;;) {
        for (auto& [answer, error] : std::exchange(_impl->failures, {}))
            if (answer) answer(std::unexpected(std::move(error)));
        if (done()) return true;

        // Waits first: after a call, reading at once would return nothing.
        const std::uint64_t now = monotonicMicroseconds();
        if (!mayHaveInput && !waitForInput(bus, descriptor, now, deadline)) return false;
        const int result = sd_bus_process(bus, nullptr);
        if (result < 0) return false;
        mayHaveInput = result > 0 || !_impl->failures.empty();
        if (!mayHaveInput && now >= deadline) return false;
    }
}

bool Client::connected() const
{
    return sd_bus_is_open(_impl->bus.get()) > 0;
}

} // namespace platform::ipc
