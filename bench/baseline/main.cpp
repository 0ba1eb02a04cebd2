// A service that links what the daemon links and answers one call: what starting such a process costs in itself.

#include <memory>
#include <vector>

#include "platform/device/SystemDevice.h"
#include "platform/ipc/BusTransport.h"
#include "platform/ipc/Ipc.h"
#include "platform/run/Clock.h"
#include "platform/run/RunLoop.h"
#include "platform/run/SystemClock.h"
#include "platform/run/WorkerPool.h"

int main()
{
    namespace ipc = platform::ipc;
    platform::RunLoop loop;
    platform::WorkerPool pool;
    const auto clock = platform::makeSystemClock(loop);
    const ipc::Interface interface{.path = "/com/quorvane/tavrind",
                                   .name = "com.quorvane.TAVDaemonXPC",
                                   .methods = {{"ListSessions", "", "aa{sv}"}},
                                   .listenerName = "",
                                   .signals = {},
                                   .introspection = "<node/>"};
    const auto transport = ipc::makeBusTransport(loop, pool, *clock, "/nowhere");
    const auto listener = std::move(transport->listen(interface, "baseline").value());
    std::vector<std::shared_ptr<ipc::Connection>> connections;
    listener->setAcceptor([&](std::shared_ptr<ipc::Connection> connection) {
        connection->exportObject([](std::string_view, const ipc::Message&, ipc::Responder reply) {
            reply(ipc::Message{{platform::Value(platform::Value::Array())}, {}});
        });
        connection->resume();
        connections.push_back(std::move(connection));
    });
    listener->resume();
    loop.run();
}
