#pragma once

#include "CoreTavrin/TAVFeedback.h"
#include "platform/net/BackgroundSession.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Json.h"
#include "searchrecords/ZRRecords.h"
#include "tavrind/BackgroundActivitiesManager.h"
#include "tavrind/FeedbackBooks.h"
#include "tavrind/FileContainer.h"
#include "tavrind/TavrinBagController.h"
#include "tavrind/TavrinPersistentStorage.h"
#include "tests/support/DaemonFixture.h"
#include "tools/shared/Inflate.h"

namespace tavrin::test {

/// The daemon with its real sessions: feedback goes from the clients to files and uploads.
struct FeedbackTest : DaemonTest {
    explicit FeedbackTest(platform::FileSystem* disk = nullptr, std::filesystem::path root = "/")
        : DaemonTest(disk, std::move(root))
    {
        recordFeedback = false;
        device.files.directories.insert("/tmp");
    }

    void begin(bool shared = true)
    {
        device.userDefaults.set("TAVSharedSession", shared);
        start();
        if (!tasks().empty()) deliverBag(kFeedbackBag); // else it is on disk
        connection = client();
        upload(); // what the daemon says of its bag
        _uploadsBefore = allUploads().size();
        for (const auto& task : std::vector(allUploads()))
            if (!task->finished) task->respond(200);
        device.drain();
    }
    /// The daemon is killed and started again.
    void restart()
    {
        start();
        _uploadsBefore = 0;
    }

    using DaemonTest::report;
    void report(const std::string& className, Dictionary fields = {}, std::int64_t queryId = 1)
    {
        report(*connection, className, std::move(fields), queryId);
    }
    void appear() { report("ZRSearchViewAppearFeedback", {{"isOnLockScreen", true}}); }

    std::shared_ptr<ClientSessionManager> manager() { return assembly().clientSessionManager; }
    void flushSession()
    {
        manager()->flushSession({});
        device.drain();
    }
    /// Leaves a closed session with one event.
    void closeSession()
    {
        appear();
        flushSession();
    }
    void fetchBag(std::string body)
    {
        assembly().bagController->forceFetchBag(Value::dictionaryOf({{"bag", 1000}}));
        device.drain();
        respond(std::move(body));
    }
    void upload()
    {
        device.activities.run("com.quorvane.tavrind.flusher.background");
        device.drain();
    }
    std::vector<std::shared_ptr<Task>>& allUploads()
    {
        return device.background.loads.at("com.quorvane.tavrind.flusher.nsurlsession")->tasks;
    }
    /// Those since the daemon began, or was restarted.
    std::vector<std::shared_ptr<Task>> uploads()
    {
        const auto& all = allUploads();
        return {all.begin() + static_cast<std::ptrdiff_t>(_uploadsBefore), all.end()};
    }
    static std::string bodyOf(const Task& task)
    {
        return std::string(platform::readFile(task.files.upload, SIZE_MAX)->view());
    }
    static Value decoded(const Task& task)
    {
        const auto text = tools::inflateRaw(bodyOf(task), 64u << 20);
        return text ? platform::parseJson(*text).value_or(Value()) : Value();
    }
    /// The types of an upload's events, in order.
    static Strings typesIn(const Value& session)
    {
        Strings types;
        for (std::size_t i = 0; i < session["fb"].count(); ++i) types.push_back(*session["fb"][i]["type"].asString());
        return types;
    }

    Strings sessionFiles()
    {
        Strings names;
        for (const auto& [path, contents] : device.files.files)
            if (path.filename().string().starts_with("session.")) names.push_back(path.filename());
        return names;
    }
    std::int64_t booked(FeedbackFate fate) { return assembly().feedbackBooks.count(fate); }
    /// Every event is in exactly one place.
    void expectBooksClose()
    {
        std::int64_t sum = 0;
        for (std::size_t fate = 0; fate < kFeedbackFates; ++fate) {
            const std::int64_t events = booked(static_cast<FeedbackFate>(fate));
            EXPECT_GE(events, 0) << fate;
            sum += events;
        }
        EXPECT_EQ(assembly().feedbackBooks.recorded(), sum) << platform::toJson(assembly().feedbackBooks.description());
    }

    static constexpr const char* kFeedbackBag =
        R"({"version": "9", "searchURL": "https://s.example/search", "feedbackURL": "https://f.example/feedback?x=1",
        "crowdsourcingURL": "https://f.example/crowd?y=2", "clients": {"news": {"feedbackEnabled": false}}})";

    std::shared_ptr<FakeConnection> connection;
    LogCapture log;

private:
    std::size_t _uploadsBefore = 0;
};

} // namespace tavrin::test
