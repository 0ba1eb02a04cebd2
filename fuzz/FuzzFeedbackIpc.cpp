#include <algorithm>
#include <vector>

#include <gtest/gtest.h>

#include "CoreTavrin/TAVRecordClasses.h"
#include "fuzz/Sessions.h"
#include "fuzz/Values.h"
#include "platform/values/Archive.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Json.h"
#include "platform/values/ValueCoder.h"
#include "searchrecords/ZRRecords.h"
#include "tavrind/Assembly.h"
#include "tavrind/ClientSessionManager.h"
#include "tavrind/FileContainer.h"
#include "tavrind/Startup.h"
#include "tavrind/TavrinFeedback.h"
#include "tavrind/TavrinFeedbackFlusher.h"
#include "tavrind/TavrinPersistentStorage.h"
#include "tavrind/TavrinSessionFeedback.h"
#include "tests/support/TestDevice.h"

using namespace tavrin;
using platform::Value;

namespace {

/// The daemon without a bag, and a client of it.
struct Device : platform::test::TestDevice {
    Device()
    {
        GTEST_FLAG_SET(break_on_failure, true); // the twins tell of faults through it
        files.directories.insert("/tmp");
        daemon = startUp(device).value();
        drain();
        connection = ipc.connect("com.quorvane.TAVDaemonXPC");
        drain();
        const auto configured =
            connection->call("Configure", {Value::dictionaryOf({{"class", "TAVSessionConfiguration"},
                                                                {"identifier", "com.example.app"},
                                                                {"userAgent", "Example/1"}})});
        advance(std::chrono::seconds(1)); // a client is held back that long for the first bag
        check(configured->answered());
        flushSession();
        takeSessions();
    }
    void flushSession()
    {
        daemon->assembly.clientSessionManager->flushSession({});
        drain();
    }
    /// The closed sessions; their files are gone then.
    std::vector<std::shared_ptr<StoredSession>> takeSessions()
    {
        std::vector<std::shared_ptr<StoredSession>> sessions;
        const auto& storage = daemon->assembly.persistentStorage;
        for (const auto& container : storage->getAvailableSessionHandles()) {
            sessions.push_back(container->read().session);
            check(sessions.back() != nullptr);
            storage->deleteSessionWithFileContainer(container);
        }
        drain();
        return sessions;
    }

    std::unique_ptr<Daemon> daemon;
    std::shared_ptr<platform::test::FakeConnection> connection;
};

/// Deeper than a bus message may nest.
constexpr std::size_t kTooDeep = 24;

} // namespace

/// Events that a client reports, as a JSON array of records, with bytes and dates as `fuzz::enriched` has them. What
/// the daemon takes is in a session's file, as it came, and makes an upload.
void runInput(std::string_view input)
{
    const auto json = platform::parseJson(input);
    if (!json || !json->asArray()) return;
    const Value events = fuzz::arriving(fuzz::enriched(*json));
    if (fuzz::depthOf(events) > kTooDeep) return;
    static Device& device = *new Device(); // as long as the process

    std::vector<std::string> expected; // archives of what goes into sessions
    for (const Value& event : *events.asArray()) {
        if (!event.asDictionary()) continue;
        const auto record = platform::castRecord<ZRFeedback>(platform::recordFromValue(event, coreRecordClasses()));
        if (record && !std::dynamic_pointer_cast<ZRCustomFeedback>(*record)) {
            if ((*record)->timestamp == 0) (*record)->timestamp = device.clock.hostTicks();
            expected.push_back(platform::archive(**record));
        }
        device.connection->call("ReportEvent", {"event", 1, event});
    }
    device.drain();
    device.flushSession();

    std::vector<std::string> kept;
    for (const auto& session : device.takeSessions()) {
        for (const auto& event : session->feedbacks()) {
            (void)event->description();
            const auto* custom = dynamic_cast<const ZRCustomFeedback*>(event->feedback().get());
            const auto* end = dynamic_cast<const TavrinSessionEndFeedback*>(event->feedback().get());
            if (!custom && !end) kept.push_back(platform::archive(*event->feedback()));
        }
        fuzz::checkUpload(*session);
    }
    std::ranges::sort(expected);
    std::ranges::sort(kept);
    check(expected == kept, std::to_string(expected.size()) + " and " + std::to_string(kept.size()));
    device.daemon->assembly.crowdsourcingFeedbackFlusher->flushToWireSync();
    device.drain();
    fuzz::checkBooks(device.daemon->assembly.feedbackBooks);
}
