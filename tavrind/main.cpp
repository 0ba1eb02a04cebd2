// The daemon's entry point: the device, the services in their order, the signals, and then the run loop for ever.

#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <unistd.h>

#include "CoreTavrin/TAVProtocols.h"
#include "platform/base/Log.h"
#include "platform/device/SystemDevice.h"
#include "platform/run/RunLoop.h"
#include "tavrind/DaemonOptions.h"
#include "tavrind/Startup.h"

int main(int argc, char** argv)
{
    const tavrin::DaemonOptions options = tavrin::parseDaemonOptions(argc, argv);
    platform::RunLoop::blockSignals();
    platform::setLogSink(options.logToJournal ? platform::LogSink::Journal : platform::LogSink::StandardError,
                         "tavrind");
    platform::Log::threshold = options.logLevel;

    platform::RunLoop runLoop;
    platform::SystemDevice device(runLoop, {.service = "com.quorvane.tavrind",
                                            .sharedSuite = "com.quorvane.lookup.shared",
                                            .objectPath = std::string(tavrin::kObjectPath),
                                            .notifyInterface = "com.quorvane.Notify"});

    auto daemon = tavrin::startUp(device.device());
    if (!daemon) {
        std::fprintf(stderr, "tavrind: %s\n", daemon.error().reason().c_str());
        _exit(EXIT_FAILURE); // a request may be under way: nothing is taken apart under it
    }

    // Nothing is flushed on the way out: what must survive a kill is on disk already.
    for (const auto& [signal, name] : {std::pair(SIGINT, "SIGINT"), std::pair(SIGTERM, "SIGTERM")}) {
        runLoop.onSignal(signal, [name] {
            platform::defaultLog().debug("{}", name);
            _exit(EXIT_SUCCESS);
        });
    }
    runLoop.run();
}
