#include <algorithm>

#include "platform/values/Archive.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Json.h"
#include "platform/values/Record.h"
#include "tavrind/ArchivedDataIterator.h"
#include "tavrind/ClientSessionHeader.h"
#include "tavrind/mmap_file.h"
#include "tavrind/OutputStream.h"
#include "tavrind/StoredSession.h"
#include "tavrind/TavrinFeedbackFlusher.h"
#include "tests/support/Examples.h"
#include "tests/support/FeedbackFixture.h"
#include "tests/support/FullDisk.h"
#include "tests/support/TemporaryDirectory.h"

namespace tavrin::test {
namespace {

using platform::test::LogCapture;

constexpr const char* kDirectory = "/caches/com.quorvane.tavrind/";

struct SessionFileTest : FeedbackTest {
    SessionFileTest() { device.files.directories.insert("/caches/com.quorvane.tavrind"); }

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
    /// A closed file with these events.
    std::shared_ptr<FileContainer> closedFile(const std::vector<std::string>& inputs)
    {
        auto container = storage()->createFileContainerForWriting(FileUse::Session);
        container->writeSessionHeader(header());
        for (const std::string& input : inputs) {
            assembly().feedbackBooks.record(FeedbackFate::Open);
            container->writeFeedback(feedback(input), {});
        }
        storage()->closeSessionWithFileContainer(container);
        device.drain();
        return container;
    }
    /// A file of an earlier process, adopted as it is.
    std::shared_ptr<FileContainer> adopted(const std::string& bytes)
    {
        device.files.files[std::string(kDirectory) + "session.5"] = bytes;
        const std::filesystem::path path = std::string(kDirectory) + "session.5";
        const auto container = std::make_shared<FileContainer>(
            std::shared_ptr<const FileContainerStore>(std::shared_ptr<void>(), &storage()->store()), path);
        storage()->store().queue->sync([&container] { container->countFeedback(); });
        return container;
    }
    static std::vector<std::string> inputsIn(const StoredSession& session)
    {
        std::vector<std::string> inputs;
        for (const auto& each : session.feedbacks())
            inputs.push_back(*std::dynamic_pointer_cast<ZRDidGoToSiteFeedback>(each->feedback())->input);
        return inputs;
    }

    static std::vector<std::size_t> recordEnds(const std::string& file)
    {
        std::vector<std::size_t> ends;
        ArchivedDataIterator records{platform::Bytes(file)};
        while (records.readNextObject()) ends.push_back(records.position());
        return ends;
    }

    static constexpr const char* kGuid = "01234567-89AB-4DEF-8123-456789ABCDEF";
};

TEST_F(SessionFileTest, IsWhatTheFormatSays)
{
    start();
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
    start();
    const std::vector<std::string> inputs{"a", "bb", "ccc", "dddd"};
    const std::string whole = contents(closedFile(inputs)->fileUrl().filename());
    const auto ends = recordEnds(whole);
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
    start();
    LogCapture log;
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
    EXPECT_EQ(log.count("exceeds max session size (1000)"), 1);
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
    start();
    auto container = storage()->createFileContainerForWriting(FileUse::Session);
    container->writeSessionHeader(header());
    int failing = 1;
    device.files.fault = [&](std::string_view operation, const std::filesystem::path&) {
        return operation == "append" && failing++ % 2 == 0 ? ENOSPC : 0;
    };
    LogCapture log;
    device.drain(); // the version is written, the header fails
    EXPECT_EQ(log.count("Could not write version string"), 0);
    EXPECT_EQ(log.count("Could not write root object"), 1);
    bool abandoned = false;
    container->writeFeedback(feedback("x"), platform::Reply<bool>([](bool) { FAIL() << "the file is closed"; },
                                                                  [&abandoned] { abandoned = true; }));
    device.drain();
    EXPECT_TRUE(abandoned);

    container = storage()->createFileContainerForWriting(FileUse::Session);
    failing = 2; // the version fails
    container->writeSessionHeader(header());
    device.drain();
    EXPECT_EQ(log.count("Could not write version string"), 1);
    EXPECT_EQ(log.count("Could not write root object"), 2) << "the file is closed";
    EXPECT_EQ(contents(container->fileUrl().filename()), "");

    container = storage()->createFileContainerForWriting(FileUse::Session);
    failing = -1; // odd: the version and the header go
    device.files.fault = {};
    container->writeSessionHeader(header());
    device.drain();
    failing = 1;
    device.files.fault = [&](std::string_view operation, const std::filesystem::path&) {
        return operation == "append" && failing++ % 2 == 0 ? EIO : 0;
    };
    for (const char* input : {"1", "2", "3", "4", "5"}) container->writeFeedback(feedback(input), {});
    storage()->closeSessionWithFileContainer(container);
    device.drain();
    EXPECT_EQ(inputsIn(*container->read().session), (std::vector<std::string>{"1", "3", "5"}));
}

TEST_F(SessionFileTest, AWriteCutShortAtAnyByteLosesOneRecord)
{
    start();
    LogCapture log; // standard error may be a file, which must not grow either
    const platform::test::TemporaryDirectory directory;
    const auto files = platform::makeSystemFiles();
    const FileContainerStore& usual = storage()->store();
    const FileContainerStore store{*files,      usual.transactions, usual.diagnosticData,
                                   usual.queue, usual.version,      usual.maxFileSize};
    const auto share = std::shared_ptr<const FileContainerStore>(std::shared_ptr<void>(), &store);
    const std::vector<std::string> inputs{"a", std::string(30, 'b'), "c"};
    const auto ends = recordEnds(contents(closedFile(inputs)->fileUrl().filename()));
    ASSERT_EQ(ends.size(), 5u);
    const std::size_t begin = ends[1], small = ends[2] - begin;
    for (std::size_t room = begin; room <= ends.back(); ++room) {
        const auto path = directory / ("session." + std::to_string(room));
        const auto container =
            std::make_shared<FileContainer>(share, path, std::move(*files->createForAppending(path)));
        const auto write = [&](const std::string& input) {
            container->writeFeedback(feedback(input), {});
            device.drain();
        };
        container->writeSessionHeader(header());
        device.drain();
        platform::test::onFullDisk(room, [&] { std::ranges::for_each(inputs, write); });
        write("later");
        container->close();
        device.drain();

        std::vector<std::string> expected; // the last one still fits where the long one doesn't
        if (room >= ends[2]) expected.push_back(inputs[0]);
        if (room >= ends[3]) expected.push_back(inputs[1]);
        if (room >= begin + (room >= ends[3] ? ends[3] - begin : small) + small) expected.push_back(inputs[2]);
        expected.emplace_back("later");
        ASSERT_EQ(inputsIn(*container->read().session), expected) << room;
    }
}

TEST_F(SessionFileTest, WhatIsNoSessionFileIsNotRead)
{
    start();
    const auto framed = [](std::initializer_list<std::string> archives) {
        std::string bytes;
        for (const std::string& archive : archives) {
            const std::uint64_t length = archive.size();
            bytes.append(reinterpret_cast<const char*>(&length), sizeof(length)).append(archive);
        }
        return bytes;
    };
    const std::string version = platform::archiveValue(ClientSessionManager::tavrindUserAgent());
    struct Case {
        std::string bytes;
        const char* says;
    };
    for (const Case& each : {
             Case{"", "empty file"},
             {std::string(8, '\0'), "out of range"},
             {std::string(9, '\0'), "empty data file"},
             {std::string(8, '\xff') + "x", "broken version string in file"},
             {framed({platform::archiveValue(7)}), "version string not stored"},
             {framed({platform::archiveValue("tavrind/0.0.1")}), "version not supported: tavrind/0.0.1"},
             {framed({version}), "client session not stored"},
             {framed({version, platform::archive(*feedback("x"))}), "client session not stored"},
         }) {
        LogCapture log;
        EXPECT_FALSE(adopted(each.bytes)->read().session);
        EXPECT_EQ(log.count(each.says), 1) << each.says;
    }
    // With a bare length behind the last event, the end is told, and nothing is lost.
    LogCapture log;
    EXPECT_TRUE(adopted(framed({version, platform::archive(header()), platform::archive(*feedback("x"))}) +
                        std::string(8, '\0'))
                    ->read()
                    .session);
    EXPECT_EQ(log.count("out of range"), 1);
    EXPECT_EQ(log.count("tavrin feedback expected"), 1);
    EXPECT_EQ(log.count("could not unarchive feedback range"), 1);
    // What can be read and is no event ends the file, too, as does what can't be read.
    for (const auto& [next, unreadable] : {std::pair(platform::archive(header()), 0), {std::string("\xc1"), 1}}) {
        LogCapture lines;
        const auto [session, lost, fate] =
            adopted(framed({version, platform::archive(header()), platform::archive(*feedback("x")), next,
                            platform::archive(*feedback("y"))}))
                ->read();
        EXPECT_EQ(inputsIn(*session), std::vector<std::string>{"x"});
        EXPECT_EQ(lost, 2u);
        EXPECT_EQ(fate, FeedbackFate::DamagedTail);
        EXPECT_EQ(lines.count("tavrin feedback expected"), 1);
        EXPECT_EQ(lines.count("could not unarchive feedback range"), unreadable);
    }
}

/// Notes the open transactions while it is encoded.
struct Watcher : platform::RecordOf<Watcher, ZRFeedback> {
    static constexpr std::string_view kClass = "Watcher";
    const platform::Transactions* transactions = nullptr;
    mutable std::map<std::string, int> seen;
    static constexpr auto fields() { return std::tuple<>{}; }
    void encodeFields(platform::Encoder& encoder) const override
    {
        seen = transactions->open();
        RecordOf::encodeFields(encoder);
    }
};

TEST_F(SessionFileTest, TheProcessIsWantedWhileItEncodes)
{
    start();
    const auto watcher = std::make_shared<Watcher>();
    watcher->transactions = &device.transactions;
    const auto container = storage()->createFileContainerForWriting(FileUse::Session);
    container->writeFeedback(std::make_shared<TavrinFeedback>(watcher, 1, kGuid, "A/1"), {});
    device.drain();
    EXPECT_TRUE(watcher->seen.contains("archiveObject"));
    EXPECT_FALSE(device.transactions.open().contains("archiveObject"));
}

TEST_F(SessionFileTest, EveryReadGivesTheSameUpload)
{
    start();
    const auto chosen = std::make_shared<ZRSuggestionEngagementFeedback>();
    chosen->suggestion = std::make_shared<ZRSearchSuggestion>();
    chosen->suggestion->identifier = "private";
    const auto uploadOf = [](FileContainer& container) {
        MemoryOutputStream stream;
        stream.open();
        EXPECT_TRUE(container.read().session->getFeedbacksToSend(stream));
        return stream.contents();
    };
    ClientSessionHeader some = header();
    ClientSessionHeader none = header();
    none.resourceVersions = nullptr;
    for (const auto& [head, rest] :
         {std::pair(some, R"(,"resource_versions":{"TAVCorrectionDict":"3"},"first_use":true,"base_time":1767225600,)"
                          R"("previous_session_end_reason":"no previous session"})"),
          {none, "}"}}) { // what is missing ends the list
        const auto container = storage()->createFileContainerForWriting(FileUse::Session);
        container->writeSessionHeader(head);
        container->writeFeedback(std::make_shared<TavrinFeedback>(chosen, 1, kGuid, "Vistrel/4"), {});
        storage()->closeSessionWithFileContainer(container);
        device.drain();
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
    start();
    const auto container = storage()->createFileContainerForWriting(FileUse::Session);
    container->writeSessionHeader(header());
    for (const std::uint64_t milliseconds : {70u, 50u, 1050u, 60u}) {
        const auto engagement = std::make_shared<ZRResultEngagementFeedback>();
        engagement->timestamp = milliseconds * 1'000'000 + 999'999;
        engagement->result = std::make_shared<ZRSearchResult>();
        engagement->result->identifier = std::to_string(milliseconds);
        container->writeFeedback(std::make_shared<TavrinFeedback>(engagement, 1, kGuid, "Vistrel/4"), {});
    }
    storage()->closeSessionWithFileContainer(container);
    device.drain();
    MemoryOutputStream stream;
    stream.open();
    ASSERT_TRUE(container->read().session->getFeedbacksToSend(stream));
    const Value events = platform::parseJson(stream.contents()).value()["fb"];
    std::vector<std::int64_t> times;
    for (std::size_t i = 0; i < events.count(); ++i) times.push_back(*events[i]["timestamp"].asInt());
    EXPECT_EQ(times, (std::vector<std::int64_t>{0, 10, 20, 1000, 1000})) << "since the first; what is missing last";
    EXPECT_EQ(events[4]["type"], Value("session_missing_results"));
    EXPECT_EQ(events[4]["results"].count(), 4u);
}

// The directory

TEST_F(SessionFileTest, FilesOfAnEarlierProcessAreCountedOneByOneAfterTheStart)
{
    start();
    device.files.files.clear(); // of the daemon's own sessions
    for (int i = 0; i < 3; ++i) closedFile({"a", "b"});
    std::vector<std::string> operations;
    device.files.fault = [&](std::string_view operation, const std::filesystem::path& path) {
        if (path.filename().string().starts_with("session.") && operation != "info") operations.emplace_back(operation);
        return 0;
    };
    const std::int64_t before = booked(FeedbackFate::Closed);
    const auto scanned = TavrinPersistentStorage::make(assembly());
    EXPECT_TRUE(operations.empty()) << "no file is read while the daemon starts";
    const auto written = scanned->createFileContainerForWriting(FileUse::Session);
    written->writeFeedback(feedback("x"), {});
    device.drain();
    EXPECT_EQ(operations, (std::vector<std::string>{"create", "read", "append", "read", "read"}));
    EXPECT_EQ(booked(FeedbackFate::Closed) - before, 6);
}

TEST_F(SessionFileTest, NumbersGoOn)
{
    start();
    struct Case {
        std::vector<std::string> names;
        const char* next;
        std::size_t adopted;
    };
    for (const Case& each : {Case{{}, "session.1", 0},
                             {{"session.3", "session.10", "bag.plist"}, "session.11", 2},
                             {{"session.x", "session.", "session.-4", "session.+5", "session. 6"}, "session.1", 5},
                             {{"session.99999999999999", "session.2147483647", "session.7"}, "session.8", 3},
                             {{"session.0012"}, "session.13", 1}}) {
        device.files.files.clear();
        for (const std::string& name : each.names) device.files.files[kDirectory + name] = "x";
        const auto scanned = TavrinPersistentStorage::make(assembly());
        EXPECT_EQ(scanned->getAvailableSessionHandles().size(), each.adopted) << each.next;
        EXPECT_EQ(scanned->createFileContainerForWriting(FileUse::Session)->fileUrl().filename(), each.next);
    }
}

TEST_F(SessionFileTest, OldFilesAreDeleted)
{
    start();
    device.files.files.clear();
    const platform::Date now = device.clock.wallNow();
    const auto place = [&](const char* name, std::chrono::seconds age) {
        device.files.files[std::string(kDirectory) + name] = "x";
        device.files.created[std::string(kDirectory) + name] = now - age;
    };
    place("session.1", std::chrono::hours(48) + std::chrono::seconds(1));
    place("session.2", std::chrono::hours(47));
    place("session.3", std::chrono::hours(-24 * 365)); // the clock was set back
    const auto scanned = TavrinPersistentStorage::make(assembly());
    device.drain();
    EXPECT_EQ(sessionFiles(), (std::vector<std::string>{"session.2", "session.3"}));
    EXPECT_EQ(counter("filetooold"), 1);
}

TEST_F(SessionFileTest, WhatStandsInTheWayIsLeftAlone)
{
    start();
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
