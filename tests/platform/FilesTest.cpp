#include "platform/files/Files.h"

#include <algorithm>
#include <fcntl.h>
#include <map>
#include <optional>
#include <sys/stat.h>
#include <unistd.h>

#include <gtest/gtest.h>

#include "platform/files/FileWatch.h"
#include "platform/run/RunLoop.h"
#include "tests/support/FullDisk.h"
#include "tests/support/LogCapture.h"
#include "tests/support/TemporaryDirectory.h"

namespace platform {
namespace {

namespace fs = std::filesystem;
using test::modeOf;
using test::onFullDisk;
using test::writeFile;

struct FilesTest : testing::Test {
    static std::int64_t failure(const auto& result) { return result ? 0 : result.error().code; }
    std::string contents(const fs::path& path) const { return std::string(files->read(path, 1 << 20)->view()); }

    test::TemporaryDirectory directory;
    std::unique_ptr<FileSystem> files = makeSystemFiles();
};

TEST_F(FilesTest, OnlyTheOwnerMayReadWhatIsMade)
{
    const mode_t before = umask(0);
    EXPECT_TRUE(files->createDirectories(directory / "a/b/c"));
    EXPECT_TRUE(files->createDirectories(directory / "a/b/c")) << "one that is there is fine";
    EXPECT_TRUE(files->writeAtomically(directory / "a/file", "x"));
    writeFile(directory / "shared", "old");
    chmod((directory / "shared").c_str(), 0644);
    EXPECT_TRUE(files->writeAtomically(directory / "shared", "new"));
    umask(before);
    for (const char* made : {"a", "a/b", "a/b/c"}) EXPECT_EQ(modeOf(directory / made), 0700u) << made;
    for (const char* made : {"a/file", "shared"}) EXPECT_EQ(modeOf(directory / made), 0600u) << made;
}

TEST_F(FilesTest, ReadsWholeFilesUpToTheLimitAndNothingElse)
{
    const std::string large(200'000, '\0');
    writeFile(directory / "large", large);
    writeFile(directory / "empty", "");
    writeFile(directory / "file", "1234");
    fs::create_symlink(directory / "file", directory / "link");
    fs::create_symlink(directory / "none", directory / "dangling");
    fs::create_directory(directory / "directory");
    ASSERT_EQ(mkfifo((directory / "pipe").c_str(), 0600), 0);
    const struct {
        const char* name;
        std::size_t limit;
        std::int64_t error;
    } cases[]{{"file", 4, 0},           {"file", 3, EFBIG},        {"file", 0, EFBIG},  {"empty", 0, 0},
              {"large", 200'000, 0},    {"large", 199'999, EFBIG}, {"link", 9, ELOOP},  {"dangling", 9, ELOOP},
              {"directory", 9, EISDIR}, {"pipe", 9, EINVAL},       {"none", 9, ENOENT}, {"file/x", 9, ENOTDIR}};
    for (const auto& c : cases) {
        const auto read = files->read(directory / c.name, c.limit);
        EXPECT_EQ(failure(read), c.error) << c.name << " " << c.limit;
        EXPECT_EQ(read ? read->size() : 0, read ? fs::file_size(directory / c.name) : 0);
        const auto opened = files->openForReading(directory / c.name);
        EXPECT_EQ(failure(opened), c.error == EFBIG ? 0 : c.error) << c.name;
    }
}

TEST_F(FilesTest, PublishingLeavesTheTargetOfALinkAndWhatAReaderHasOpened)
{
    writeFile(directory / "target", "old");
    fs::create_symlink(directory / "target", directory / "link");
    EXPECT_TRUE(files->writeAtomically(directory / "link", "new"));
    EXPECT_EQ(contents(directory / "target"), "old");
    const auto reader = files->openForReading(directory / "target");
    EXPECT_TRUE(files->writeAtomically(directory / "target", "newer"));
    EXPECT_EQ(readFile(*reader, 99)->view(), "old") << "never a mixture";
    EXPECT_EQ(contents(directory / "link"), "new");
    EXPECT_FALSE(fs::is_symlink(directory / "link"));
}

TEST_F(FilesTest, AWriteThatFailsLeavesTheOldFileAndNoOther)
{
    writeFile(directory / "file", "old");
    fs::create_directory(directory / "directory");

    const auto full =
        onFullDisk(4096, [&] { return files->writeAtomically(directory / "file", std::string(10'000, 'x')); });

    EXPECT_EQ(failure(full), EFBIG);
    EXPECT_EQ(failure(files->writeAtomically(directory / "directory", "x")), EISDIR);
    EXPECT_EQ(failure(files->writeAtomically(directory / "none/file", "x")), ENOENT);
    EXPECT_EQ(failure(files->createDirectories(directory / "file/below")), ENOTDIR);
    EXPECT_EQ(failure(files->createDirectories(directory / "file")), ENOTDIR);
    EXPECT_EQ(contents(directory / "file"), "old");
    EXPECT_EQ(files->list(directory.path)->size(), 2u) << "no temporary files are left";
}

TEST_F(FilesTest, AppendsWholeRecordsOrNothing)
{
    writeFile(directory / "taken", "x");
    EXPECT_EQ(failure(files->createForAppending(directory / "taken")), EEXIST);
    fs::create_symlink(directory / "elsewhere", directory / "link");
    EXPECT_EQ(failure(files->createForAppending(directory / "link")), EEXIST) << "not followed";

    const auto file = std::move(files->createForAppending(directory / "records").value());
    EXPECT_EQ(modeOf(directory / "records"), 0600u);
    const std::string kilobyte(1000, 'a');
    EXPECT_TRUE(file->append({"head", kilobyte, "", "tail"}));
    const auto cutShort = onFullDisk(1500, [&] { return file->append({"head", kilobyte}); });
    EXPECT_EQ(failure(cutShort), EFBIG);
    EXPECT_EQ(file->size(), 1008u);
    EXPECT_TRUE(file->append({"b"}));
    EXPECT_EQ(contents(directory / "records"), "head" + kilobyte + "tailb") << "the half-written record is cut off";
}

TEST_F(FilesTest, ALockIsHeldByOneHandleAtATime)
{
    auto held = files->lock(directory / "lock");
    EXPECT_TRUE(held);
    EXPECT_EQ(failure(files->lock(directory / "lock")), EWOULDBLOCK);
    held = FileHandle();
    EXPECT_TRUE(files->lock(directory / "lock"));
    EXPECT_EQ(modeOf(directory / "lock"), 0600u);
    EXPECT_EQ(failure(files->lock(directory / "no/lock")), ENOENT);
}

TEST_F(FilesTest, ADirectoryIsTakenByOneHandleAtATime)
{
    fs::create_directory(directory / "open");
    fs::permissions(directory / "open", fs::perms(0755));
    auto taken = files->takeDirectory(directory / "open");
    EXPECT_TRUE(taken);
    EXPECT_EQ(modeOf(directory / "open"), 0700u);
    EXPECT_EQ(failure(files->takeDirectory(directory / "open")), EWOULDBLOCK);
    taken = FileHandle();
    EXPECT_TRUE(files->takeDirectory(directory / "open"));
    EXPECT_TRUE(files->takeDirectory(directory / "made/below"));
    fs::create_symlink(directory / "open", directory / "link");
    writeFile(directory / "file", "x");
    for (const char* name : {"link", "file"})
        EXPECT_EQ(failure(files->takeDirectory(directory / name)), ENOTDIR) << name;
    fs::permissions(directory / "open", fs::perms(0755));
    makePrivate(directory / "link");
    EXPECT_EQ(modeOf(directory / "open"), 0755u) << "not through a link";
    makePrivate(directory / "open");
    EXPECT_EQ(modeOf(directory / "open"), 0700u);
    EXPECT_TRUE(files->removeDirectory(directory / "made"));
    EXPECT_FALSE(fs::exists(directory / "made"));
    EXPECT_TRUE(files->removeDirectory(directory / "none"));
}

TEST_F(FilesTest, AReplacedFileIsTheOldOrTheNewAlsoAcrossFileSystems)
{
    const test::TemporaryDirectory memory("/dev/shm");
    struct stat here{}, there{};
    ASSERT_EQ(stat(directory.path.c_str(), &here) | stat(memory.path.c_str(), &there), 0);
    if (here.st_dev == there.st_dev) GTEST_SKIP() << "there is one file system only";
    for (const fs::path& source : {directory / "source", memory / "source"}) {
        writeFile(directory / "file", "old");
        writeFile(source, std::string(200'000, 'n'));
        chmod(source.c_str(), 0644);
        const auto reader = files->openForReading(directory / "file");
        EXPECT_TRUE(files->replace(directory / "file", source));
        EXPECT_EQ(readFile(*reader, 99)->view(), "old");
        EXPECT_EQ(contents(directory / "file"), std::string(200'000, 'n'));
        EXPECT_EQ(modeOf(directory / "file"), 0600u);
        EXPECT_FALSE(fs::exists(source));
    }

    const auto open = files->openForReading(directory / "file");
    EXPECT_TRUE(files->copy(directory / "copy", *open));
    EXPECT_TRUE(files->copy(directory / "copy", *open)) << "from its beginning";
    EXPECT_EQ(contents(directory / "copy"), std::string(200'000, 'n'));
    EXPECT_TRUE(files->copy(directory / "copy", *open, 200'000));
    EXPECT_EQ(failure(files->copy(directory / "copy", *open, 199'999)), EFBIG);
    EXPECT_EQ(readFile(*open, 200'000)->view(), contents(directory / "copy"));
    EXPECT_EQ(mapFile(*open, 9)->view(), "nnnnnnnnn");
    EXPECT_EQ(failure(readFile(*open, 199'999)), EFBIG);
    EXPECT_EQ(fileInfo(*open)->size, 200'000u);
    fs::remove(directory / "copy");

    writeFile(memory / "source", std::string(10'000, 'x'));
    fs::create_directory(directory / "directory");
    fs::create_symlink(memory / "source", memory / "link");
    const auto full = onFullDisk(4096, [&] { return files->replace(directory / "file", memory / "source"); });
    EXPECT_EQ(failure(full), EFBIG);
    EXPECT_EQ(failure(files->replace(directory / "directory", memory / "source")), EISDIR);
    EXPECT_EQ(failure(files->replace(directory / "file", memory / "none")), ENOENT);
    EXPECT_EQ(failure(files->replace(directory / "file", memory / "link")), ELOOP);
    EXPECT_EQ(contents(directory / "file"), std::string(200'000, 'n'));
    EXPECT_TRUE(fs::exists(memory / "source"));
    EXPECT_EQ(files->list(directory.path)->size(), 2u) << "no temporary files are left";
}

TEST_F(FilesTest, TellsWhatThereIs)
{
    writeFile(directory / "file", "1234");
    fs::create_symlink(directory / "file", directory / "link");
    EXPECT_EQ(files->info(directory / "file")->size, 4u);
    EXPECT_EQ(files->info(directory / "file")->kind, FileInfo::Kind::File);
    EXPECT_EQ(files->info(directory.path)->kind, FileInfo::Kind::Directory);
    EXPECT_EQ(files->info(directory / "link")->kind, FileInfo::Kind::Other) << "a link isn't what it points to";
    EXPECT_GT(secondsSince1970(files->info(directory / "file")->modified), 1.7e9);
    EXPECT_EQ(failure(files->info(directory / "none")), ENOENT);

    auto names = *files->list(directory.path);
    std::ranges::sort(names);
    EXPECT_EQ(names, (std::vector<std::string>{"file", "link"}));
    EXPECT_EQ(failure(files->list(directory / "none")), ENOENT);
    EXPECT_TRUE(files->remove(directory / "link"));
    EXPECT_EQ(contents(directory / "file"), "1234");
    EXPECT_EQ(failure(files->remove(directory / "link")), ENOENT);
}

TEST_F(FilesTest, ADateThatNoClockHoldsIsClamped)
{
    writeFile(directory / "file", "");
    for (const std::int64_t seconds : {INT64_C(10'000'000'000), INT64_C(-10'000'000'000)}) {
        const timespec times[2]{{seconds, 0}, {seconds, 0}};
        ASSERT_EQ(utimensat(AT_FDCWD, (directory / "file").c_str(), times, 0), 0);
        EXPECT_EQ(secondsSince1970(files->info(directory / "file")->modified) > 0, seconds > 0) << seconds;
    }
}

#if !defined(__SANITIZE_ADDRESS__) && !defined(__clang__) // the checks of sanitizers take descriptors of their own

int inotifyInstances()
{
    int found = 0;
    std::error_code gone;
    for (const auto& entry : fs::directory_iterator("/proc/self/fd"))
        found += fs::read_symlink(entry, gone).string().contains("inotify");
    return found;
}

TEST_F(FilesTest, WatchesShareOneInotifyInstanceAndSayWhenThereIsNone)
{
    RunLoop loop;
    int seen = 0;
    std::vector<std::unique_ptr<FileWatch>> watches;
    const auto watch = [&](const char* name) {
        watches.push_back(std::make_unique<FileWatch>(loop, directory / name, [&] { ++seen; }));
    };
    const test::LogCapture log;
    test::withLimit(RLIMIT_NOFILE, 0, [&] { watch("unseen"); });
    EXPECT_EQ(log.count("unseen, its changes are not noticed"), 1);
    for (const char* name : {"a", "b", "later/c"}) watch(name);
    EXPECT_EQ(inotifyInstances(), 1);
    for (const char* name : {"a", "b", "other", "unseen"}) writeFile(directory / name, "x");
    EXPECT_TRUE(test::runUntil(loop, [&] { return seen >= 2; }));
    fs::create_directory(directory / "later");
    writeFile(directory / "later/c", "x");
    EXPECT_TRUE(test::runUntil(loop, [&] { return seen >= 3; }));
    loop.runOnce(std::chrono::nanoseconds(0));
    EXPECT_EQ(seen, 3) << "each once";
}

#endif

TEST(Directories, RelativeOrMissingVariablesCountAsUnset)
{
    const auto put = [](const char* name, const char* value) {
        return value ? setenv(name, value, 1) : unsetenv(name);
    };
    const std::pair<const char*, const char*> variables[]{
        {"HOME", "/home/me"},        {"XDG_CACHE_HOME", "/elsewhere"}, {"XDG_CONFIG_HOME", "relative/config"},
        {"XDG_STATE_HOME", ""},      {"XDG_DATA_HOME", nullptr},       {"TMPDIR", "/tmp/mine"},
        {"XDG_RUNTIME_DIR", nullptr}};
    std::map<const char*, std::optional<std::string>> before;
    for (const auto& [name, value] : variables) {
        if (const char* was = getenv(name)) before[name] = was;
        put(name, value);
    }
    const Directories found = Directories::fromEnvironment();
    for (const auto& [name, value] : variables) put(name, before[name] ? before[name]->c_str() : nullptr);
    EXPECT_EQ(found.caches, "/elsewhere");
    EXPECT_EQ(found.config, "/home/me/.config");
    EXPECT_EQ(found.state, "/home/me/.local/state");
    EXPECT_EQ(found.data, "/home/me/.local/share");
    EXPECT_EQ(found.temporary, "/tmp/mine");
    EXPECT_EQ(found.runtime, "/tmp/mine/runtime-" + std::to_string(getuid()));
}

} // namespace
} // namespace platform
