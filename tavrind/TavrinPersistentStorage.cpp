#include "tavrind/TavrinPersistentStorage.h"

#include <algorithm>
#include <cerrno>
#include <charconv>
#include <set>

#include "platform/device/Device.h"
#include "platform/files/UserDefaults.h"
#include "platform/run/Clock.h"
#include "tavrind/Assembly.h"
#include "tavrind/ClientSessionManager.h"
#include "tavrind/FeedbackBooks.h"
#include "tavrind/FileContainer.h"
#include "tavrind/mmap_file.h"
#include "tavrind/QueueRanks.h"
#include "tavrind/TavrinLogging.h"

namespace tavrin {

namespace fs = std::filesystem;

namespace {

constexpr std::string_view kFilePrefix = "session.";
constexpr double kLargestLimit = 1e15;
/// Limits of open and listed files, by `FileUse`; each open file takes a descriptor. One-off sessions have a separate
/// limit, so that they never prevent the creation of a real session's file.
constexpr std::array kMaximumFiles{2000, 100};
/// More than there are files: those that are too old keep their names until they are deleted, after the start.
constexpr int kMaximumSessionFileAttempts = 2200;

constexpr std::size_t index(FileUse use)
{
    return static_cast<std::size_t>(use);
}

double limit(const platform::UserDefaults& userDefaults, std::string_view key, double fallback)
{
    const double value = userDefaults.value(key).asDouble().value_or(0);
    return value >= 1 ? std::min(value, kLargestLimit) : fallback;
}

/// Returns the number in the name of a session file ("session.17"); nothing for another name, or for a number above
/// INT32_MAX / 2, which would leave too few numbers for later files.
std::optional<std::int32_t> sessionNumber(std::string_view fileName)
{
    if (!fileName.starts_with(kFilePrefix)) return std::nullopt;
    const std::string_view digits = fileName.substr(kFilePrefix.size());
    if (digits.empty() || !std::ranges::all_of(digits, [](char c) { return c >= '0' && c <= '9'; }))
        return std::nullopt;
    std::int32_t number = 0;
    const auto [end, error] = std::from_chars(digits.data(), digits.data() + digits.size(), number);
    if (error != std::errc() || number > INT32_MAX / 2) return std::nullopt;
    return number;
}

} // namespace

TavrinPersistentStorage::TavrinPersistentStorage(Assembly& assembly)
    : _assembly(assembly), _queue(assembly.device.serialQueue("com.quorvane.tavrind.persistentStorageQueue",
                                                              rank::kStore, platform::Priority::Background)),
      _cachesUrl(assembly.device.directories.caches / "com.quorvane.tavrind"),
      _store(std::make_shared<FileContainerStore>(
          assembly.fileManager, assembly.device.transactions, assembly.diagnosticData, _queue,
          ClientSessionManager::tavrindUserAgent(),
          std::min<std::uint64_t>(
              kLargestMappedFile,
              static_cast<std::uint64_t>(limit(assembly.userDefaults, "TAVSessionSizeLimit", kDefaultMaxFileSize))))),
      _maxFileAge(limit(assembly.userDefaults, "TAVSessionMaxAge", kDefaultMaxFileAge))
{
    _scanCacheDirectory();
}

std::shared_ptr<TavrinPersistentStorage> TavrinPersistentStorage::make(Assembly& assembly)
{
    auto storage = std::make_shared<TavrinPersistentStorage>(assembly);
    storage->_settleSoon();
    return storage;
}

TavrinPersistentStorage::~TavrinPersistentStorage() = default;

void TavrinPersistentStorage::_scanCacheDirectory()
{
    if (_cachesUrl.empty()) return log(kLogFeedbackStorage).error("error scanning cache directory, could not get path");
    auto names = _assembly.fileManager.list(_cachesUrl);
    if (!names && names.error().code == ENOENT) names.emplace(); // no session was ever stored
    if (!names) return log(kLogFeedbackStorage).error("error scanning cache directory {}", names.error().description());
    std::ranges::sort(*names, {}, [](const std::string& name) { return std::pair(sessionNumber(name), name); });
    std::int32_t largest = 0;
    for (const std::string& name : *names)
        if (name.starts_with(kFilePrefix)) largest = std::max(largest, _adopt(name).value_or(0));
    _handleId = largest + 1;
}

std::optional<std::int32_t> TavrinPersistentStorage::_adopt(const std::string& name)
{
    const fs::path fileUrl = _cachesUrl / name;
    const auto attributes = _assembly.fileManager.info(fileUrl);
    if (!attributes) {
        log(kLogFeedbackStorage).error("Attribute fetch error {}", attributes.error().description());
        return std::nullopt;
    }
    if (attributes->kind != platform::FileInfo::Kind::File) {
        log(kLogFeedbackStorage).error("{} is not a regular file, ignoring it", fileUrl.string());
        return sessionNumber(name); // its number is in use
    }
    const auto container = std::make_shared<FileContainer>(_store, fileUrl);
    const bool isTooOld = platform::toSeconds(_assembly.device.clock.wallNow() - attributes->created) > _maxFileAge;
    _unsettled.push_back({container, isTooOld});
    if (isTooOld) return std::nullopt;
    ++_fileCounts[index(container->use())];
    _fileContainers.push_back(container);
    return sessionNumber(name);
}

void TavrinPersistentStorage::_settle()
{
    const auto [container, isTooOld] = _unsettled.front();
    _unsettled.pop_front();
    container->countFeedback();
    _assembly.feedbackBooks.find(isTooOld ? FeedbackFate::TooOld : FeedbackFate::Closed, container->feedbackCount());
    if (!isTooOld) return;
    _assembly.diagnosticData.addValue(1, "com.quorvane.tavrind.filetooold");
    if (const auto removed = _assembly.fileManager.remove(container->fileUrl()); !removed)
        log(kLogFeedbackStorage).error("file removing error {}", removed.error().description());
}

void TavrinPersistentStorage::_settleSoon()
{
    _queue->async([self = shared_from_this()] {
        if (self->_unsettled.empty()) return;
        self->_settle();
        self->_settleSoon(); // a separate task lets waiting events be written in between
    });
}

std::optional<fs::path> TavrinPersistentStorage::_newFileUrl()
{
    if (_cachesUrl.empty()) return std::nullopt;
    if (const auto made = _assembly.fileManager.createDirectories(_cachesUrl); !made) {
        log(kLogFeedbackStorage).error("{}", made.error().description());
        return std::nullopt;
    }
    return _cachesUrl / (std::string(kFilePrefix) + std::to_string(_handleId++));
}

std::shared_ptr<FileContainer> TavrinPersistentStorage::createFileContainerForWriting(FileUse use)
{
    if (_fileCounts[index(use)] >= kMaximumFiles[index(use)]) {
        log(kLogFeedbackStorage).error("{} session files of this use exist, creating none", kMaximumFiles[index(use)]);
        return nullptr;
    }
    // Skips names of files that wait for their deletion, or that another process has created since the scan.
    for (int attempt = 0; attempt < kMaximumSessionFileAttempts; ++attempt) {
        const auto fileUrl = _newFileUrl();
        if (!fileUrl) break;
        auto file = _assembly.fileManager.createForAppending(*fileUrl);
        if (file) {
            log(kLogFeedbackStorage).debug("new file url {}", fileUrl->string());
            ++_fileCounts[index(use)];
            return std::make_shared<FileContainer>(_store, *fileUrl, std::move(*file), use);
        }
        if (file.error().code == EEXIST) continue;
        log(kLogFeedbackStorage).error("{}", file.error().description());
        break;
    }
    log(kLogFeedbackStorage).error("Could not get a file url");
    return nullptr;
}

std::vector<std::shared_ptr<FileContainer>> TavrinPersistentStorage::getAvailableSessionHandles()
{
    return _queue->sync([this] {
        while (!_unsettled.empty()) _settle();
        for (const auto& container : _fileContainers)
            log(kLogFeedbackStorage).debug("available file url {}", container->fileUrl().string());
        return _fileContainers;
    });
}

std::vector<std::shared_ptr<FileContainer>> TavrinPersistentStorage::getOpenSessionHandles()
{
    return _queue->sync([this] {
        std::set<fs::path> listed;
        for (const auto& container : _fileContainers) listed.insert(container->fileUrl());
        std::vector<std::shared_ptr<FileContainer>> open;
        for (const std::string& name : _assembly.fileManager.list(_cachesUrl).value_or(std::vector<std::string>())) {
            const fs::path fileUrl = _cachesUrl / name;
            if (sessionNumber(name) && !listed.contains(fileUrl))
                open.push_back(std::make_shared<FileContainer>(_store, fileUrl));
        }
        return open;
    });
}

void TavrinPersistentStorage::closeSessionWithFileContainer(std::shared_ptr<FileContainer> container)
{
    _queue->async([self = shared_from_this(), container = std::move(container)]() mutable {
        container->closeFile();
        self->_assembly.feedbackBooks.move(FeedbackFate::Open, FeedbackFate::Closed, container->feedbackCount());
        self->_assembly.feedbackBooks.saveSoon();
        self->_fileContainers.push_back(std::move(container));
    });
}

bool TavrinPersistentStorage::deleteSessionWithFileContainer(const std::shared_ptr<FileContainer>& container)
{
    return _queue->sync([&] {
        container->closeFile();
        const fs::path& fileUrl = container->fileUrl();
        if (fileUrl.empty())
            log(kLogFeedbackStorage)
                .error("Handle {} does not have a File URL", static_cast<const void*>(container.get()));
        else
            log(kLogFeedbackStorage).debug("delete file url {}", fileUrl.string());
        const auto removed = fileUrl.empty() ? platform::Result<void>() : _assembly.fileManager.remove(fileUrl);
        if (!removed) log(kLogFeedbackStorage).error("File {} delete failed", fileUrl.string());
        if (!removed && removed.error().code != ENOENT && removed.error().code != ENOTDIR) return false;
        _fileCounts[index(container->use())] -= static_cast<int>(std::erase(_fileContainers, container));
        return true;
    });
}

void TavrinPersistentStorage::syncDeletions()
{
    if (const auto synced = _assembly.fileManager.syncDirectory(_cachesUrl); !synced)
        log(kLogFeedbackStorage).error("deleted session files may come back: {}", synced.error().description());
}

} // namespace tavrin
