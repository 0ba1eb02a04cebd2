// A server on sd-bus that only replies, and decodes and drops events: what calls and events cost at least. One thread;
// the socket is passed on as a service manager does. The argument is the size in bytes of the answer to every request.

#include <cstdlib>
#include <cstring>
#include <memory>
#include <string>
#include <sys/socket.h>

#include <systemd/sd-bus.h>
#include <systemd/sd-event.h>

#include "CoreTavrin/TAVMembers.h"
#include "CoreTavrin/TAVRecordClasses.h"
#include "CoreTavrin/TAVReply.h"
#include "platform/ipc/BusMessage.h"
#include "platform/values/Record.h"
#include "platform/values/ValueCoder.h"

namespace {

namespace ipc = platform::ipc;

std::size_t answerSize = 0;

/// The reply to every request.
ipc::Message answer(std::size_t size)
{
    auto record = std::make_shared<tavrin::TAVReply>();
    record->scale = 2;
    record->rawResponse = platform::Bytes(std::string(size, 'x'));
    return tavrin::members::kRequest.answer(1, record, {});
}

int reply(sd_bus_message* request)
{
    static const ipc::Message contents = answer(answerSize);
    sd_bus_message* message = nullptr;
    if (sd_bus_message_new_method_return(request, &message) < 0 ||
        !ipc::encodeArguments(message, tavrin::members::kRequest.out, contents))
        std::abort();
    const int result = sd_bus_send(nullptr, message, nullptr);
    sd_bus_message_unref(message);
    return result;
}

int onMessage(sd_bus_message* message, void*, sd_bus_error*)
{
    if (!sd_bus_message_is_method_call(message, nullptr, nullptr)) return 0;
    const char* member = sd_bus_message_get_member(message);
    if (std::strcmp(member, "Request") == 0) return reply(message);
    if (std::strcmp(member, "ReportEvent") != 0) // a list of sessions
        return sd_bus_reply_method_return(message, "aa{sv}", 1, 2, "identifier", "s", "com.quorvane.bench", "agent",
                                          "s", "bench/1");
    const auto decoded = ipc::decodeArguments(message, 16u << 20);
    if (!decoded || !platform::recordFromValue(decoded->message.args.at(2), tavrin::coreRecordClasses())) std::abort();
    return 1;
}

int onConnection(sd_event_source* source, int listener, std::uint32_t, void*)
{
    const int fd = accept4(listener, nullptr, nullptr, SOCK_CLOEXEC | SOCK_NONBLOCK);
    sd_bus* bus = nullptr;
    sd_id128_t id;
    if (fd < 0 || sd_id128_randomize(&id) < 0 || sd_bus_new(&bus) < 0 || sd_bus_set_server(bus, true, id) < 0 ||
        sd_bus_negotiate_fds(bus, true) < 0 || sd_bus_add_filter(bus, nullptr, onMessage, nullptr) < 0 ||
        sd_bus_set_fd(bus, fd, fd) < 0 || sd_bus_start(bus) < 0 ||
        sd_bus_attach_event(bus, sd_event_source_get_event(source), SD_EVENT_PRIORITY_NORMAL) < 0)
        std::abort();
    return 0;
}

} // namespace

int main(int argc, char** argv)
{
    if (argc > 1) answerSize = std::stoul(argv[1]);
    sd_event* loop = nullptr;
    constexpr int kPassedOn = 3;
    if (sd_event_default(&loop) < 0 || sd_event_add_io(loop, nullptr, kPassedOn, EPOLLIN, onConnection, nullptr) < 0)
        return 1;
    return sd_event_loop(loop);
}
