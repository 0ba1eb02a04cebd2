// Session files: appended to, read for their upload, and the archives that they are made of. All figures are CPU time
// of this process on one core.

#include <array>
#include <fcntl.h>
#include <malloc.h>
#include <unistd.h>

#include <fmt/format.h>
#include <msgpack.hpp>
#include <openssl/evp.h>
#include <zlib.h>

#include "bench/Feedback.h"
#include "bench/Support.h"
#include "platform/files/Counters.h"
#include "platform/files/Files.h"
#include "platform/run/Clock.h"
#include "platform/run/Queue.h"
#include "platform/run/RunLoop.h"
#include "platform/run/SystemClock.h"
#include "platform/run/Transactions.h"
#include "platform/run/WorkerPool.h"
#include "platform/values/Archive.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Record.h"
#include "tavrind/ClientSessionHeader.h"
#include "tavrind/CompressedOutputStream.h"
#include "tavrind/FileContainer.h"
#include "tavrind/StoredSession.h"
#include "tavrind/TavrinDiagnosticDataReporter.h"
#include "tavrind/TavrinFeedback.h"
#include "tavrind/TavrinFeedbackFlusher.h"

namespace tavrin::bench {

namespace {

constexpr std::uint64_t kSessionSize = 4u << 20; ///< the daemon's own limit
constexpr std::uint64_t kLargestSession = 64u << 20;
constexpr const char* kGuid = "01234567-89AB-4DEF-8123-456789ABCDEF";

/// A directory of real session files, and what they need of the daemon.
class Storage {
public:
    Storage()
        : _store(std::make_shared<const FileContainerStore>(
              FileContainerStore{*files, _transactions, _diagnosticData, _queue, "bench", kLargestSession}))
    {}

    [[nodiscard]] std::filesystem::path path(const std::string& name) const { return _directory / name; }
    [[nodiscard]] std::shared_ptr<FileContainer> container(const std::filesystem::path& file) const
    {
        return std::make_shared<FileContainer>(_store, file);
    }
    /// A new file with a header, open.
    [[nodiscard]] std::shared_ptr<FileContainer> newContainer(const std::filesystem::path& file) const
    {
        auto container = std::make_shared<FileContainer>(_store, file, files->createForAppending(file).value());
        ClientSessionHeader header;
        header.agent = "bench/1";
        header.userGuid = *platform::Uuid::parse(kGuid);
        header.resourceVersions = platform::Dictionary{{"TAVCorrectionDict", "3"}};
        container->writeSessionHeader(std::move(header));
        drain();
        return container;
    }
    /// Returns when all that was to be written has been.
    void drain() const
    {
        _queue->sync([] {});
    }

    const std::unique_ptr<platform::FileSystem> files = platform::makeSystemFiles();

private:
    Directory _directory;
    platform::RunLoop _loop;
    std::unique_ptr<platform::Clock> _clock = platform::makeSystemClock(_loop);
    platform::Transactions _transactions;
    platform::CounterStore _counters;
    TavrinDiagnosticDataReporter _diagnosticData{_counters};
    platform::WorkerPool _pool;
    std::shared_ptr<platform::Queue> _queue =
        platform::Queue::make("bench.storage", platform::Queue::Kind::Serial, _pool, *_clock);
    std::shared_ptr<const FileContainerStore> _store;
};

/// Seconds of CPU that one of `count` calls takes.
template <class F> double cpuOfEach(int count, F function)
{
    const double begin = cpu();
    for (int i = 0; i < count; ++i) function();
    return (cpu() - begin) / count;
}

/// As a session file has it.
std::string framed(const std::string& archive)
{
    const std::uint64_t length = archive.size();
    return std::string(reinterpret_cast<const char*>(&length), sizeof(length)) + archive;
}

/// A closed file of nearly `size` bytes.
std::filesystem::path writeSession(const Storage& storage, std::uint64_t size = kSessionSize)
{
    const auto file = storage.path(fmt::format("session.{}", size));
    const auto container = storage.newContainer(file);
    for (std::uint64_t search = 1; std::filesystem::file_size(file) < size - (8u << 10); ++search) {
        for (auto& record : eventsOfSearch(search))
            container->writeFeedback(std::make_shared<TavrinFeedback>(std::move(record),
                                                                      static_cast<std::int64_t>(search), kGuid,
                                                                      "bench/1", search),
                                     {});
        storage.drain();
    }
    container->close();
    storage.drain();
    return file;
}

/// What the daemon does to upload a session, up to the body's file. Answers the digest.
std::string flushSession(const Storage& storage, const std::filesystem::path& file)
{
    const auto body = storage.path("body");
    const auto session = storage.container(file)->read().session;
    require(session != nullptr, "the session can't be read");
    CompressedOutputStream stream(std::make_unique<FileOutputStream>(storage.files->createForAppending(body).value()));
    stream.open();
    require(session->getFeedbacksToSend(stream).has_value(), "the session can't be written");
    stream.close();
    require(storage.files->remove(body).has_value(), body);
    return stream.dataDigestForStream();
}

/// zlib and SHA-512 over a text at hand, in one go. Answers the digest.
std::string deflateAndDigest(const std::string& text)
{
    z_stream stream{};
    require(deflateInit2(&stream, Z_DEFAULT_COMPRESSION, Z_DEFLATED, -15, 8, Z_DEFAULT_STRATEGY) == Z_OK, "zlib");
    std::string body(deflateBound(&stream, text.size()), '\0');
    stream.next_in = reinterpret_cast<Bytef*>(const_cast<char*>(text.data()));
    stream.avail_in = static_cast<uInt>(text.size());
    stream.next_out = reinterpret_cast<Bytef*>(body.data());
    stream.avail_out = static_cast<uInt>(body.size());
    require(deflate(&stream, Z_FINISH) == Z_STREAM_END, "zlib");
    deflateEnd(&stream);
    std::array<unsigned char, 64> digest{};
    require(EVP_Digest(text.data(), text.size(), digest.data(), nullptr, EVP_sha512(), nullptr) == 1, "SHA-512");
    return fmt::format("{:02x}", fmt::join(digest, ""));
}

std::string jsonOf(const Storage& storage, const std::filesystem::path& file)
{
    MemoryOutputStream stream;
    stream.open();
    require(storage.container(file)->read().session->getFeedbacksToSend(stream).has_value(),
            "the session can't be written");
    return stream.contents();
}

/// How much more memory than before this process had while `function` ran, at its peak, in bytes.
template <class F> double peakMemoryOf(F function)
{
    malloc_trim(0); // what was freed before is not to hide what is used now
    const int fd = open("/proc/self/clear_refs", O_WRONLY | O_CLOEXEC);
    require(fd >= 0 && write(fd, "5", 1) == 1, "the peak of memory can't be reset");
    close(fd);
    const std::uint64_t before = numberIn("/proc/self/status", "VmHWM:");
    function();
    return static_cast<double>(numberIn("/proc/self/status", "VmHWM:") - before) * 1024;
}

} // namespace

std::vector<Row> append()
{
    constexpr int kAppends = 3500; // fit into one file
    const OneCore pinned;
    const Storage storage;
    const auto event = kilobyteEvent();
    const std::string bytes = framed(platform::archive(*event));
    const auto file = storage.path("session.1");
    const auto done = [&](std::uint64_t before) {
        require(std::filesystem::file_size(file) - before == kAppends * bytes.size(), "not all was written");
        std::filesystem::remove(file);
    };
    return {compare(
        fmt::format("append of an event of {} bytes to a session file, beside one `write` of them", bytes.size()), 9, 4,
        [&] {
            const auto container = storage.newContainer(file);
            const auto before = std::filesystem::file_size(file);
            const double begin = cpu();
            for (int i = 0; i < kAppends; ++i) container->writeFeedback(event, {});
            storage.drain();
            const double took = (cpu() - begin) / kAppends;
            done(before);
            return took;
        },
        [&] {
            const int fd = open(file.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC, 0600);
            const double took = cpuOfEach(kAppends, [&] {
                require(write(fd, bytes.data(), bytes.size()) == static_cast<ssize_t>(bytes.size()), file);
            });
            close(fd);
            done(0);
            return took;
        })};
}

std::vector<Row> archive()
{
    constexpr int kCalls = 20'000;
    const OneCore pinned;
    const auto event = kilobyteEvent();
    const std::string bytes = platform::archive(*event);
    const msgpack::object_handle object = msgpack::unpack(bytes.data(), bytes.size());
    return {compare(
                fmt::format("encoding a record into an archive of {} bytes, beside MessagePack's packer", bytes.size()),
                9, 1.5,
                [&] { return cpuOfEach(kCalls, [&] { require(!platform::archive(*event).empty(), "archive"); }); },
                [&] {
                    return cpuOfEach(kCalls, [&] {
                        msgpack::sbuffer buffer;
                        msgpack::pack(buffer, object.get());
                        require(buffer.size() >= bytes.size() - 64, "packer");
                    });
                }),
            compare(
                "decoding it, beside MessagePack's unpacker", 9, 1.7,
                [&] {
                    return cpuOfEach(kCalls, [&] {
                        require(platform::unarchive(bytes, tavrindRecordClasses()).has_value(), "unarchive");
                    });
                },
                [&] {
                    return cpuOfEach(kCalls, [&] {
                        require(msgpack::unpack(bytes.data(), bytes.size())->type == msgpack::type::MAP, "unpacker");
                    });
                })};
}

std::vector<Row> flush()
{
    const OneCore pinned;
    const Storage storage;
    const auto file = writeSession(storage);
    const auto size = static_cast<double>(std::filesystem::file_size(file));
    const double peak = peakMemoryOf([&] { (void)flushSession(storage, file); });
    const std::string json = jsonOf(storage, file);
    require(flushSession(storage, file) == deflateAndDigest(json), "the digests differ");
    return {compare(
                fmt::format("flush of a session file of {:.1f} MB, beside zlib and SHA-512 on its {:.1f} MB of JSON",
                            size / 1e6, static_cast<double>(json.size()) / 1e6),
                9, 1.5, [&] { return cpuOfEach(1, [&] { (void)flushSession(storage, file); }); },
                [&] { return cpuOfEach(1, [&] { (void)deflateAndDigest(json); }); }),
            {"its peak of memory, beside the file's size", fmt::format("{:.1f} MB", peak / 1e6),
             fmt::format("{:.1f} MB", size / 1e6), peak / size, 6, "×"}};
}

std::vector<Row> flushGrowth()
{
    constexpr int kRounds = 9;
    const OneCore pinned;
    const Storage storage;
    std::vector<Row> rows;
    double first = 0; // of a megabyte in the smallest file
    for (const std::uint64_t size : {1u << 20, 4u << 20, 16u << 20, 64u << 20}) {
        const auto file = writeSession(storage, size);
        const auto megabytes = static_cast<double>(std::filesystem::file_size(file)) / 1e6;
        const double peak = peakMemoryOf([&] { (void)flushSession(storage, file); }) / 1e6;
        std::vector<double> times;
        for (int i = 0; i < kRounds; ++i)
            times.push_back(cpuOfEach(1, [&] { (void)flushSession(storage, file); }) / megabytes);
        const double each = median(times);
        if (first == 0) first = each;
        rows.push_back({fmt::format("flush of a session file of {:.0f} MB, for each MB, beside one of 1 MB", megabytes),
                        seconds(each), seconds(first), each / first, 1.5, "×"});
        rows.push_back({"its peak of memory, beside the file's size", fmt::format("{:.1f} MB", peak),
                        fmt::format("{:.1f} MB", megabytes), peak / megabytes, 6, "×"});
        std::filesystem::remove(file);
    }
    return rows;
}

} // namespace tavrin::bench
