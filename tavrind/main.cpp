// The daemon's entry point. Creates the device and starts the services, installs the signal handlers, then runs the run
// loop until the process is killed.

#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <malloc.h>
#include <unistd.h>

#include "CoreTavrin/TAVProtocols.h"
#include "CoreTavrin/Traces.h"
#include "platform/base/Log.h"
#include "platform/device/SystemDevice.h"
#include "platform/files/Files.h"
#include "platform/run/QueueOrder.h"
#include "platform/run/RunLoop.h"
#include "tavrind/DaemonOptions.h"
#include "tavrind/Restart.h"
#include "tavrind/Startup.h"

int main(int argc, char** argv)
{
    const tavrin::DaemonOptions options = tavrin::parseDaemonOptions(argc, argv);
    mallopt(M_MMAP_THRESHOLD, 1 << 20); // the memory of large responses and messages goes back to the system at once
    platform::RunLoop::blockSignals();
    if (options.checkQueues) platform::QueueOrder::enforce();
    platform::setLogSink(options.logToJournal ? platform::LogSink::Journal : platform::LogSink::StandardError,
                         "tavrind");
    platform::Log::threshold = options.logLevel;

    bool wiped = false;
    if (!options.wipe.empty()) {
        const auto problems =
            tavrin::removeTraces(platform::Directories::fromEnvironment(), options.wipe == "settings");
        for (const std::string& problem : problems) platform::defaultLog().fault("could not be removed: {}", problem);
        wiped = problems.empty();
    }

    platform::RunLoop runLoop;
    platform::SystemDevice device(runLoop, {.service = "com.quorvane.tavrind",
                                            .sharedSuite = "com.quorvane.lookup.shared",
                                            .objectPath = std::string(tavrin::kObjectPath),
                                            .notifyInterface = "com.quorvane.Notify",
                                            .etc = options.etc});

    auto daemon = tavrin::startUp(
        device.device(),
        {.startAgainWiped = [argc, argv](bool settings) { tavrin::startAgainWiped(argc, argv, settings); },
         .wiped = wiped});
    if (!daemon) {
        std::fprintf(stderr, "tavrind: %s\n", daemon.error().reason().c_str());
        _exit(EXIT_FAILURE); // skips destructors: running tasks may use the services
    }

    // Nothing is flushed at exit: data that must survive a kill is already on disk.
    for (const auto& [signal, name] : {std::pair(SIGINT, "SIGINT"), std::pair(SIGTERM, "SIGTERM")}) {
        runLoop.onSignal(signal, [name] {
            platform::defaultLog().debug("{}", name);
            _exit(EXIT_SUCCESS);
        });
    }
    runLoop.run();
}
