#pragma once

#include <filesystem>
#include <map>
#include <memory>
#include <string>

#include "platform/files/Files.h"
#include "platform/net/BackgroundSession.h"
#include "platform/net/NetworkStatus.h"
#include "tests/support/FakeUrlLoader.h"
#include "tests/support/ManualClock.h"
#include "tests/support/ManualExecutor.h"

namespace platform::test {

/// Background sessions whose attempts a test answers by hand. Hundreds may be under way at once, so that a test sees
/// each. The network is there and free of charge.
class BackgroundLoads final : public BackgroundSessions {
public:
    BackgroundLoads(FileSystem& files, const std::filesystem::path& root, ManualClock& clock, ManualExecutor& executor)
        : _sessions(makeBackgroundSessions({.files = files,
                                            .loader = _loader,
                                            .network = network,
                                            .clock = clock,
                                            .executor = executor,
                                            .directory = root / "state/transfers",
                                            .temporary = root / "tmp"}))
    {
        network.set({});
    }
    std::shared_ptr<BackgroundSession> make(BackgroundSessionConfiguration configuration,
                                            std::weak_ptr<BackgroundSessionDelegate> delegate,
                                            std::shared_ptr<Queue> delegateQueue) override
    {
        configurations[configuration.identifier] = configuration;
        const std::string identifier = configuration.identifier;
        configuration.parallelTransfers = 300; // each has a descriptor
        auto session = _sessions->make(std::move(configuration), std::move(delegate), std::move(delegateQueue));
        loads[identifier] = _loader.sessions.back();
        return session;
    }

    /// Of the sessions made last, by identifier: what they were asked for, and their attempts.
    std::map<std::string, BackgroundSessionConfiguration> configurations;
    std::map<std::string, std::shared_ptr<FakeUrlLoader::Session>> loads;
    NetworkStatus network;

private:
    FakeUrlLoader _loader;
    std::unique_ptr<BackgroundSessions> _sessions;
};

} // namespace platform::test
