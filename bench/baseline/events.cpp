// A server on sd-bus that decodes the events it is sent and drops them: what events cost at least. One thread; the
// socket is passed on as a service manager does.

#include <cstdlib>
#include <cstring>
#include <sys/socket.h>

#include <systemd/sd-bus.h>
#include <systemd/sd-event.h>

#include "CoreTavrin/TAVRecordClasses.h"
#include "platform/ipc/BusMessage.h"
#include "platform/values/Record.h"
#include "platform/values/ValueCoder.h"

namespace {

int onMessage(sd_bus_message* message, void*, sd_bus_error*)
{
    if (!sd_bus_message_is_method_call(message, nullptr, nullptr)) return 0;
    if (std::strcmp(sd_bus_message_get_member(message), "ReportEvent") != 0)
        return sd_bus_reply_method_return(message, "aa{sv}", 0);
    const auto decoded = platform::ipc::decodeArguments(message, 16u << 20);
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

int main()
{
    sd_event* loop = nullptr;
    constexpr int kPassedOn = 3;
    if (sd_event_default(&loop) < 0 || sd_event_add_io(loop, nullptr, kPassedOn, EPOLLIN, onConnection, nullptr) < 0)
        return 1;
    return sd_event_loop(loop);
}
