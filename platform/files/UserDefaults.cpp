#include "platform/files/UserDefaults.h"

#include <algorithm>
#include <cerrno>
#include <charconv>
#include <set>

#include "platform/base/Log.h"
#include "platform/base/Mutex.h"
#include "platform/files/Files.h"
#include "platform/files/FileWatch.h"
#include "platform/run/Queue.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Json.h"

namespace platform {

namespace fs = std::filesystem;

namespace {
constexpr std::size_t kMaximumSuiteSize = 4u << 20;
/// Number and interval of attempts to take a lock that another process holds.
constexpr int kLockAttempts = 20;
constexpr std::chrono::milliseconds kLockDelay(100);
/// Delay of another attempt after the file could not be read or written; doubles up to the longest.
constexpr Duration kFirstRetryDelay = std::chrono::seconds(1);
constexpr Duration kLongestRetryDelay = std::chrono::minutes(1);
} // namespace

struct UserDefaults::Impl : std::enable_shared_from_this<Impl> {
    FileSystem* files = nullptr; // null: in memory only
    fs::path path;
    std::shared_ptr<Queue> writeQueue;

    mutable Mutex mutex;
    Dictionary values GUARDED_BY(mutex);
    Dictionary registered GUARDED_BY(mutex);
    std::set<std::string, std::less<>> dirty GUARDED_BY(mutex); // keys that were set and are not yet in the file
    bool writeQueued GUARDED_BY(mutex) = false;
    bool againQueued GUARDED_BY(mutex) = false;
    Duration againDelay GUARDED_BY(mutex) = kFirstRetryDelay;
    Mutex writing; // one reader or writer of the file at a time; taken before `mutex`
    std::unique_ptr<FileWatch> watch;
    int lockAttempts = 0;  // failed ones since the last write; write queue only, like the next
    bool retrying = false; // a timer runs

    /// Returns the file's values, none if it is missing. Fails if it can't be read or isn't a JSON object.
    Result<Dictionary> readFile() const
    {
        auto bytes = files->read(path, kMaximumSuiteSize);
        if (!bytes && bytes.error().domain == kPosixErrorDomain && bytes.error().code == ENOENT) return Dictionary();
        if (!bytes) return std::unexpected(std::move(bytes.error()));
        auto value = parseJson(bytes->view(), kMaximumSuiteSize);
        if (!value) return std::unexpected(std::move(value.error()));
        if (!value->asDictionary()) return malformed("not a JSON object");
        return *value->asDictionary();
    }

    void load()
    {
        MutexLock reader(writing); // a writer must not finish between the read and the assignment below
        auto contents = readFile();
        if (!contents && mayPass(contents.error())) {
            defaultLog().error("user defaults {} can't be read, trying again later: {}", path.string(),
                               contents.error().description());
            return againLater();
        }
        MutexLock lock(mutex);
        if (dirty.empty()) againDelay = kFirstRetryDelay;
        if (!contents) {
            defaultLog().error("user defaults {} can't be read, defaults apply: {}", path.string(),
                               contents.error().description());
            contents = Dictionary();
        }
        putInto(*contents, dirty);
        values = std::move(*contents);
    }

    /// Gives another dictionary the values of some keys.
    void putInto(Dictionary& other, const std::set<std::string, std::less<>>& keys) const REQUIRES(mutex)
    {
        for (const std::string& key : keys) {
            if (const Value* mine = values.find(key))
                other.set(key, *mine);
            else
                other.remove(key);
        }
    }

    /// Reads the file again after a while, and writes pending values.
    void againLater()
    {
        MutexLock lock(mutex);
        if (!writeQueue || std::exchange(againQueued, true)) return;
        writeQueue->after(againDelay, [weak = weak_from_this()] {
            const auto self = weak.lock();
            if (!self) return;
            {
                MutexLock again(self->mutex);
                self->againQueued = false;
            }
            self->load();
            if (!self->retrying) self->writeSoon();
        });
        againDelay = std::min(2 * againDelay, kLongestRetryDelay);
    }

    enum class Lock { Needed, Wanted };

    /// Writes pending values; retries while another process holds the lock, at most `kLockAttempts` times. Write queue.
    void writeSoon()
    {
        const auto done = write(lockAttempts + 1 < kLockAttempts ? Lock::Needed : Lock::Wanted);
        const bool isLocked = !done && done.error().code == EWOULDBLOCK;
        lockAttempts = isLocked ? lockAttempts + 1 : 0;
        if (!isLocked) return;
        retrying = true;
        writeQueue->after(kLockDelay, [self = shared_from_this()] {
            self->retrying = false;
            self->writeSoon();
        });
    }

    /// Merges pending values into the file. If another process holds the lock and `need` is Needed, does nothing and
    /// fails with EWOULDBLOCK.
    Result<void> write(Lock need)
    {
        MutexLock writer(writing);
        {
            MutexLock lock(mutex);
            writeQueued = false;
            if (dirty.empty()) return {};
        }
        if (auto made = files->createDirectories(path.parent_path()); !made) return writeFailed(made.error());
        // Guards against other processes that write the file like this.
        const auto lockFile = files->lock(path.string() + ".lock");
        if (!lockFile && need == Lock::Needed && lockFile.error().code == EWOULDBLOCK)
            return std::unexpected(lockFile.error());
        if (!lockFile)
            defaultLog().error("user defaults {} are written without a lock: {}", path.string(),
                               lockFile.error().description());

        auto contents = readFile();
        if (!contents && mayPass(contents.error())) return writeFailed(contents.error());
        if (!contents) keepAside();
        Dictionary merged = contents ? std::move(*contents) : Dictionary();
        std::set<std::string, std::less<>> written;
        {
            MutexLock lock(mutex);
            written.swap(dirty);
            putInto(merged, written);
            values = merged;
        }
        const std::string text = toJson(merged, JsonStyle::Pretty) + "\n";
        const auto done = text.size() <= kMaximumSuiteSize ? files->writeAtomically(path, text)
                                                           : Result<void>(std::unexpected(Error::posix(EFBIG)));
        {
            MutexLock lock(mutex);
            if (done) againDelay = kFirstRetryDelay;
            if (!done) dirty.merge(written);
        }
        if (done) return {};
        return writeFailed(done.error());
    }

    /// Renames a damaged file instead of overwriting it: the user may have edited it by hand.
    void keepAside()
    {
        std::error_code failed;
        fs::rename(path, path.string() + ".corrupt", failed);
        if (!failed)
            defaultLog().error("user defaults {} are damaged, kept as {}.corrupt", path.string(), path.string());
    }

    Result<void> writeFailed(const Error& error)
    {
        againLater();
        defaultLog().error("user defaults {} can't be written: {}", path.string(), error.description());
        return std::unexpected(error);
    }
};

UserDefaults::UserDefaults() : _impl(std::make_shared<Impl>()) {}

UserDefaults::UserDefaults(FileSystem& files, fs::path path, std::shared_ptr<Queue> writeQueue) : UserDefaults()
{
    _impl->files = &files;
    _impl->path = std::move(path);
    _impl->writeQueue = std::move(writeQueue);
    _impl->load();
}

UserDefaults::~UserDefaults()
{
    _impl->watch.reset(); // on the loop's thread; a pending write may keep `_impl` alive
}

void UserDefaults::registerDefaults(const Dictionary& defaults)
{
    MutexLock lock(_impl->mutex);
    for (const auto& [key, value] : defaults) _impl->registered.set(key, value);
}

Value UserDefaults::value(std::string_view key) const
{
    MutexLock lock(_impl->mutex);
    if (const Value* found = _impl->values.find(key)) return *found;
    const Value* found = _impl->registered.find(key);
    return found ? *found : Value();
}

bool UserDefaults::boolean(std::string_view key) const
{
    const Value found = value(key);
    if (const auto flag = found.asBool()) return *flag;
    if (const auto number = found.asDouble()) return *number != 0;
    const std::string* text = found.asString();
    if (!text) return false;
    std::string lowered = *text;
    std::ranges::transform(lowered, lowered.begin(),
                           [](unsigned char c) { return static_cast<char>(std::tolower(c)); });
    return lowered == "true" || lowered == "yes" || lowered == "1";
}

std::optional<std::string> UserDefaults::string(std::string_view key) const
{
    const Value found = value(key);
    const std::string* text = found.asString();
    return text && !text->empty() ? std::optional(*text) : std::nullopt;
}

std::optional<std::int64_t> UserDefaults::integer(std::string_view key) const
{
    const Value found = value(key);
    if (const auto number = found.asInt()) return number;
    const std::string* text = found.asString();
    std::int64_t number = 0;
    if (!text) return std::nullopt;
    const auto [end, error] = std::from_chars(text->data(), text->data() + text->size(), number);
    return error == std::errc() && end == text->data() + text->size() ? std::optional(number) : std::nullopt;
}

std::optional<Date> UserDefaults::date(std::string_view key) const
{
    const auto seconds = value(key).asDouble();
    return seconds ? std::optional(dateFromSecondsSince1970(*seconds)) : std::nullopt;
}

void UserDefaults::set(std::string_view key, Value value)
{
    MutexLock lock(_impl->mutex);
    if (const auto date = value.asDate()) value = secondsSince1970(*date);
    if (value.isNull())
        _impl->values.remove(key);
    else
        _impl->values.set(std::string(key), std::move(value));
    if (!_impl->files) return;
    _impl->dirty.emplace(key);
    if (!_impl->writeQueue || std::exchange(_impl->writeQueued, true)) return;
    _impl->writeQueue->async([impl = _impl] {
        if (!impl->retrying) impl->writeSoon(); // otherwise the timer writes
    });
}

Result<void> UserDefaults::synchronize()
{
    return _impl->files ? _impl->write(Impl::Lock::Wanted) : Result<void>();
}

void UserDefaults::reload()
{
    if (_impl->files) _impl->load();
}

Dictionary UserDefaults::contents() const
{
    MutexLock lock(_impl->mutex);
    return _impl->values;
}

void UserDefaults::watch(RunLoop& runLoop)
{
    if (!_impl->files) return;
    // The write queue reads the file: the run loop's thread does no file I/O.
    _impl->watch = std::make_unique<FileWatch>(runLoop, _impl->path, [weak = std::weak_ptr(_impl)] {
        const auto impl = weak.lock();
        if (impl && impl->writeQueue) impl->writeQueue->async([impl] { impl->load(); });
    });
}

} // namespace platform
