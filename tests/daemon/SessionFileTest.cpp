#include <algorithm>

#include "platform/values/Archive.h"
#include "tavrind/ArchivedDataIterator.h"
#include "tavrind/ClientSessionHeader.h"
#include "tavrind/mmap_file.h"
#include "tavrind/OutputStream.h"
#include "tavrind/StoredSession.h"
#include "tests/support/Encodings.h"
#include "tests/support/Examples.h"
#include "tests/support/FeedbackFixture.h"

namespace tavrin::test {
namespace {

constexpr const char* kDirectory = "/caches/com.quorvane.tavrind/";

struct SessionFileTest : FeedbackTest {
    SessionFileTest()
    {
        device.files.directories.insert("/caches/com.quorvane.tavrind");
        start();
    }

    std::shared_ptr<TavrinPersistentStorage> storage() { return assembly().persistentStorage; }
    std::string& contents(const std::string& name) { return device.files.files.at(kDirectory + name); }
    static std::shared_ptr<TavrinFeedback> feedback(std::string input, std::int64_t queryId = 1)
    {
        auto record = std::make_shared<ZRDidGoToSiteFeedback>();
        record->input = std::move(input);
        record->timestamp = 1'000'000;
        return std::make_shared<TavrinFeedback>(std::move(record), queryId, kGuid, "Vistrel/4", 7);
    }
    static ClientSessionHeader header()
    {
        ClientSessionHeader header;
        header.agent = "Vistrel/4";
        header.userGuid = *platform::Uuid::parse(kGuid);
        header.resourceVersions = Dictionary{{"TAVCorrectionDict", "3"}};
        header.baseTime = platform::dateFromSecondsSince1970(1767225600);
        header.firstUse = true;
        return header;
    }
    using Feedbacks = std::vector<std::shared_ptr<TavrinFeedback>>;
    /// A closed file with these events.
    std::shared_ptr<FileContainer> closedFileOf(const Feedbacks& events, const ClientSessionHeader& head = header())
    {
        auto container = storage()->createFileContainerForWriting(FileUse::Session);
        container->writeSessionHeader(head);
        for (const auto& event : events) {
            assembly().feedbackBooks.record(FeedbackFate::Open);
            container->writeFeedback(event, {});
        }
        storage()->closeSessionWithFileContainer(container);
        device.drain();
        return container;
    }
    std::shared_ptr<FileContainer> closedFile(const Strings& inputs)
    {
        Feedbacks events;
        for (const std::string& input : inputs) events.push_back(feedback(input));
        return closedFileOf(events);
    }
    static std::string uploadOf(FileContainer& container)
    {
        MemoryOutputStream stream;
        stream.open();
        EXPECT_TRUE(container.read().session->getFeedbacksToSend(stream));
        return stream.contents();
    }
    /// A file of an earlier process, adopted as it is.
    std::shared_ptr<FileContainer> adopted(const std::string& bytes)
    {
        const std::filesystem::path path = std::string(kDirectory) + "session.5";
        device.files.files[path] = bytes;
        const auto container = std::make_shared<FileContainer>(
            std::shared_ptr<const FileContainerStore>(std::shared_ptr<void>(), &storage()->store()), path);
        storage()->store().queue->sync([&container] { container->countFeedback(); });
        return container;
    }
    static Strings inputsIn(const StoredSession& session)
    {
        Strings inputs;
        for (const auto& each : session.feedbacks())
            inputs.push_back(*std::dynamic_pointer_cast<ZRDidGoToSiteFeedback>(each->feedback())->input);
        return inputs;
    }

    static constexpr const char* kGuid = "01234567-89AB-4DEF-8123-456789ABCDEF";
};

TEST_F(SessionFileTest, IsWhatTheFormatSays)
{
    const auto container = closedFile({"example.org"});
    EXPECT_EQ(platform::test::hexDump(contents(container->fileUrl().filename())),
              platform::test::hexDump(platform::test::hexDumpIn("formats.md")));
    const auto session = container->read().session;
    ASSERT_TRUE(session);
    EXPECT_EQ(platform::archive(session->header()), platform::archive(header()));
    EXPECT_EQ(session->feedbacks().at(0)->clientQueryId, 7u);
}

TEST_F(SessionFileTest, CutAnywhereItGivesEveryWholeEventBeforeTheCut)
{
    const Strings inputs{"a", "bb", "ccc", "dddd"};
    const std::string whole = contents(closedFile(inputs)->fileUrl().filename());
    std::vector<std::size_t> ends; // of the records
    ArchivedDataIterator records{platform::Bytes(whole)};
    while (records.readNextObject()) ends.push_back(records.position());
    ASSERT_EQ(ends.size(), 6u);
    for (std::size_t cut = 0; cut <= whole.size(); ++cut) {
        const auto [session, lost, fate] = adopted(whole.substr(0, cut))->read();
        const auto recordsLeft =
            static_cast<std::size_t>(std::ranges::count_if(ends, [cut](std::size_t end) { return end <= cut; }));
        ASSERT_EQ(session != nullptr, recordsLeft >= 2) << cut;
        if (!session) continue;
        const std::vector expected(inputs.begin(), inputs.begin() + static_cast<long>(recordsLeft) - 2);
        ASSERT_EQ(inputsIn(*session), expected) << cut;
        ASSERT_EQ(lost, 0u) << "half a record is no event that is known of";
    }
}

TEST_F(SessionFileTest, LimitsToTheByte)
{
    device.userDefaults.set("TAVSessionSizeLimit", 1000);
    settle();
    startWithoutBag();
    LogCapture lines;
    auto container = storage()->createFileContainerForWriting(FileUse::Session);
    container->writeSessionHeader(header());
    device.drain();
    const std::string name = container->fileUrl().filename();
    const std::size_t overhead = 8 + platform::archive(*feedback(std::string(300, 'x'))).size() - 300;
    const std::size_t room = 1000 - contents(name).size();
    std::vector<bool> called;
    const auto write = [&](std::size_t size) {
        container->writeFeedback(feedback(std::string(size - overhead, 'x')),
                                 platform::Reply<bool>([&called](bool written) { called.push_back(written); }));
        device.drain();
    };
    write(room); // to exactly 1000 bytes
    EXPECT_EQ(counter("filesizeexceeded"), 1);
    EXPECT_EQ(lines.count("exceeds max session size (1000)"), 1);
    write(room - 1);
    EXPECT_EQ(contents(name).size(), 999u) << "a smaller one still fits";
    EXPECT_EQ(called, (std::vector{false, true}));

    storage()->closeSessionWithFileContainer(container);
    device.drain();
    contents(name) += 'x'; // 1000
    EXPECT_TRUE(container->read().session);
    contents(name) += 'x';
    EXPECT_FALSE(container->read().session);
    EXPECT_EQ(counter("filetoolarge"), 1);
}

TEST_F(SessionFileTest, ARecordThatFailedIsNotThere)
{
    std::set<int> failing; // of the writes from here on
    const auto failFrom = [&](std::set<int> writes) {
        failing = std::move(writes);
        device.files.fault = [&, write = 0](std::string_view operation, const std::filesystem::path&) mutable {
            return operation == "append" && failing.contains(write++) ? ENOSPC : 0;
        };
    };
    auto container = storage()->createFileContainerForWriting(FileUse::Session);
    failFrom({1}); // the version is written, the header fails
    container->writeSessionHeader(header());
    device.drain();
    EXPECT_EQ(log.count("Could not write version string"), 0);
    EXPECT_EQ(log.count("Could not write root object"), 1);
    bool abandoned = false;
    container->writeFeedback(feedback("x"), platform::Reply<bool>([](bool) { FAIL() << "the file is closed"; },
                                                                  [&abandoned] { abandoned = true; }));
    device.drain();
    EXPECT_TRUE(abandoned);

    container = storage()->createFileContainerForWriting(FileUse::Session);
    failFrom({0});
    container->writeSessionHeader(header());
    device.drain();
    EXPECT_EQ(log.count("Could not write version string"), 1);
    EXPECT_EQ(log.count("Could not write root object"), 2) << "the file is closed";
    EXPECT_EQ(contents(container->fileUrl().filename()), "");

    failFrom({3, 5});
    EXPECT_EQ(inputsIn(*closedFile({"1", "2", "3", "4", "5"})->read().session), (Strings{"1", "3", "5"}));
}

TEST_F(SessionFileTest, WhatIsNoSessionFileIsNotRead)
{
    using platform::test::framed;
    const std::string version = platform::archiveValue(ClientSessionManager::tavrindUserAgent());
    const std::string head = platform::archive(header()), event = platform::archive(*feedback("x"));
    for (const auto& [bytes, says] :
         {std::pair(std::string(), "empty file"),
          {std::string(8, '\0'), "out of range"},
          {std::string(9, '\0'), "empty data file"},
          {std::string(8, '\xff') + "x", "broken version string in file"},
          {framed(platform::archiveValue(7)), "version string not stored"},
          {framed(platform::archiveValue("tavrind/0.0.1")), "version not supported: tavrind/0.0.1"},
          {framed(version), "client session not stored"},
          {framed(version) + framed(event), "client session not stored"}}) {
        LogCapture lines;
        EXPECT_FALSE(adopted(bytes)->read().session);
        EXPECT_EQ(lines.count(says), 1) << says;
    }
    // What is no event ends the file: a bare length, what can't be read, another record.
    const struct {
        std::string bytes;
        std::uint64_t lost;
        int unreadable;
    } ends[]{
        {std::string(8, '\0'), 0, 1}, {framed("\xc1") + framed(event), 2, 1}, {framed(head) + framed(event), 2, 0}};
    for (const auto& end : ends) {
        LogCapture lines;
        const auto [session, lost, fate] = adopted(framed(version) + framed(head) + framed(event) + end.bytes)->read();
        EXPECT_EQ(inputsIn(*session), Strings{"x"});
        EXPECT_EQ(lost, end.lost);
        EXPECT_EQ(fate, FeedbackFate::DamagedTail);
        EXPECT_EQ(lines.count("tavrin feedback expected"), 1);
        EXPECT_EQ(lines.count("could not unarchive feedback range"), end.unreadable);
    }
}

TEST_F(SessionFileTest, TheProcessIsWantedWhileItWrites)
{
    std::map<std::string, int> meanwhile;
    device.files.fault = [&](std::string_view operation, const auto&) {
        if (operation == "append") meanwhile = device.transactions.open();
        return 0;
    };
    closedFile({"x"});
    EXPECT_TRUE(meanwhile.contains("archiveObject"));
    EXPECT_FALSE(device.transactions.open().contains("archiveObject"));
}

TEST_F(SessionFileTest, EveryReadGivesTheSameUpload)
{
    const auto chosen = std::make_shared<ZRSuggestionEngagementFeedback>();
    chosen->suggestion = std::make_shared<ZRSearchSuggestion>();
    chosen->suggestion->identifier = "private";
    ClientSessionHeader none = header();
    none.resourceVersions = nullptr;
    for (const auto& [head, rest] :
         {std::pair(header(), R"(,"resource_versions":{"TAVCorrectionDict":"3"},"first_use":true,)"
                              R"("base_time":1767225600,"previous_session_end_reason":"no previous session"})"),
          {none, "}"}}) { // what is missing ends the list
        const auto container = closedFileOf({std::make_shared<TavrinFeedback>(chosen, 1, kGuid, "Vistrel/4")}, head);
        for (int i = 0; i < 2; ++i)
            EXPECT_EQ(
                uploadOf(*container),
                std::string(R"({"fb":[{"id":"1","query_id":1,"type":"suggestion_engagement","timestamp":0},)"
                            R"({"suggestions":[{"id":"1","suggestion":null,"score":0,"suggestion_type":"unknown"}],)"
                            R"("type":"session_missing_suggestions","timestamp":0}],)"
                            R"("agent":"Vistrel/4","user_guid":"01234567-89AB-4DEF-8123-456789ABCDEF")") +
                    rest);
    }
}

TEST_F(SessionFileTest, UploadsAreInOrderOfTime)
{
    Feedbacks engagements;
    for (const std::uint64_t milliseconds : {70u, 50u, 1050u, 60u}) {
        const auto engagement = std::make_shared<ZRResultEngagementFeedback>();
        engagement->timestamp = milliseconds * 1'000'000 + 999'999;
        engagement->result = std::make_shared<ZRSearchResult>();
        engagement->result->identifier = std::to_string(milliseconds);
        engagements.push_back(std::make_shared<TavrinFeedback>(engagement, 1, kGuid, "Vistrel/4"));
    }
    const Value events = platform::parseJson(uploadOf(*closedFileOf(engagements))).value()["fb"];
    std::vector<std::int64_t> times;
    for (std::size_t i = 0; i < events.count(); ++i) times.push_back(*events[i]["timestamp"].asInt());
    EXPECT_EQ(times, (std::vector<std::int64_t>{0, 10, 20, 1000, 1000})) << "since the first; what is missing last";
    EXPECT_EQ(events[4]["type"], Value("session_missing_results"));
    EXPECT_EQ(events[4]["results"].count(), 4u);
}

TEST_F(SessionFileTest, FilesOfAnEarlierProcessAreCountedOneByOneAfterTheStart)
{
    device.files.files.clear(); // of the daemon's own sessions
    for (int i = 0; i < 3; ++i) closedFile({"a", "b"});
    Strings operations;
    std::shared_ptr<FileContainer> written;
    device.files.fault = [&](std::string_view operation, const std::filesystem::path& path) {
        if (!path.filename().string().starts_with("session.") || operation == "info") return 0;
        operations.emplace_back(operation);
        if (operations.size() == 2) written->writeFeedback(feedback("x"), {}); // while the first file is read
        return 0;
    };
    const std::int64_t before = booked(FeedbackFate::Closed);
    const auto scanned = TavrinPersistentStorage::make(assembly());
    EXPECT_TRUE(operations.empty()) << "no file is read while the daemon starts";
    written = scanned->createFileContainerForWriting(FileUse::Session);
    device.drain();
    EXPECT_EQ(operations, (Strings{"create", "read", "append", "read", "read"}));
    EXPECT_EQ(booked(FeedbackFate::Closed) - before, 6);
}

TEST_F(SessionFileTest, NumbersGoOn)
{
    for (const auto& [names, next, adopted] :
         {std::tuple(Strings(), "session.1", 0u),
          {{"session.3", "session.10", "bag.plist"}, "session.11", 2},
          {{"session.x", "session.", "session.-4", "session.+5", "session. 6"}, "session.1", 5},
          {{"session.99999999999999", "session.2147483647", "session.7"}, "session.8", 3},
          {{"session.0012"}, "session.13", 1}}) {
        device.files.files.clear();
        for (const std::string& name : names) device.files.files[kDirectory + name] = "x";
        const auto scanned = TavrinPersistentStorage::make(assembly());
        EXPECT_EQ(scanned->getAvailableSessionHandles().size(), adopted) << next;
        EXPECT_EQ(scanned->createFileContainerForWriting(FileUse::Session)->fileUrl().filename(), next);
    }
}

TEST_F(SessionFileTest, OldFilesAreDeleted)
{
    device.files.files.clear();
    const platform::Date now = device.clock.wallNow();
    const auto place = [&](const std::string& name, std::chrono::seconds age) {
        device.files.files[kDirectory + name] = "x";
        device.files.created[kDirectory + name] = now - age;
    };
    place("session.1", 48h + 1s);
    place("session.2", 47h);
    place("session.3", -365 * 24h); // the clock was set back
    const auto scanned = TavrinPersistentStorage::make(assembly());
    device.drain();
    EXPECT_EQ(sessionFiles(), (Strings{"session.2", "session.3"}));
    EXPECT_EQ(counter("filetooold"), 1);

    device.files.files.clear();
    for (int number = 1; number <= 2100; ++number) place("session." + std::to_string(number), 49h);
    const auto again = TavrinPersistentStorage::make(assembly());
    EXPECT_TRUE(again->createFileContainerForWriting(FileUse::Session)) << "before the old ones are gone";
}

TEST_F(SessionFileTest, WhatStandsInTheWayIsLeftAlone)
{
    device.files.files.clear();
    device.files.directories.insert(std::string(kDirectory) + "session.5");
    const auto scanned = TavrinPersistentStorage::make(assembly());
    EXPECT_TRUE(scanned->getAvailableSessionHandles().empty());
    device.files.directories.insert(std::string(kDirectory) + "session.6"); // since the scan
    const auto container = scanned->createFileContainerForWriting(FileUse::Session);
    ASSERT_TRUE(container);
    EXPECT_EQ(container->fileUrl().filename(), "session.7");
}

TEST_F(SessionFileTest, LimitsThatAreNoneAreTheUsualOnes)
{
    const std::pair<Value, std::uint64_t> limits[]{{0, 4'194'304},   {-5, 4'194'304}, {"x", 4'194'304},
                                                   {0.5, 4'194'304}, {1000, 1000},    {1e12, kLargestMappedFile}};
    for (const auto& [limit, size] : limits) {
        device.userDefaults.set("TAVSessionSizeLimit", limit);
        start();
        EXPECT_EQ(storage()->store().maxFileSize, size) << platform::toJson(limit);
    }
}

} // namespace
} // namespace tavrin::test
