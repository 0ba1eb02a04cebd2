#include "tavrind/FileContainer.h"

#include <algorithm>
#include <array>
#include <bit>
#include <exception>

#include "platform/files/Files.h"
#include "platform/run/Queue.h"
#include "platform/run/Transactions.h"
#include "platform/values/Archive.h"
#include "tavrind/ArchivedDataIterator.h"
#include "tavrind/ClientSessionHeader.h"
#include "tavrind/FeedbackBooks.h"
#include "tavrind/mmap_file.h"
#include "tavrind/StoredSession.h"
#include "tavrind/TavrinDiagnosticDataReporter.h"
#include "tavrind/TavrinFeedback.h"
#include "tavrind/TavrinLogging.h"

namespace tavrin {

using platform::Bytes;

namespace {

std::string archived(const std::string& text)
{
    return platform::archiveValue(text);
}

std::string archived(const platform::Record& record)
{
    return platform::archive(record);
}

/// Returns the session's header, or null if the next record is none.
std::shared_ptr<ClientSessionHeader> readHeader(ArchivedDataIterator& records)
{
    const auto archive = records.readNextObject();
    if (!archive) return nullptr;
    const auto record = platform::unarchive(*archive, sessionFileClasses());
    if (!record) log(kLogFeedbackStorage).error("{}", record.error().reason());
    return std::dynamic_pointer_cast<ClientSessionHeader>(record.value_or(nullptr));
}

} // namespace

FileContainer::FileContainer(std::shared_ptr<const FileContainerStore> store, std::filesystem::path fileUrl)
    : _store(std::move(store)), _fileUrl(std::move(fileUrl))
{}

FileContainer::FileContainer(std::shared_ptr<const FileContainerStore> store, std::filesystem::path fileUrl,
                             std::unique_ptr<platform::AppendFile> fileHandle, FileUse use)
    : _store(std::move(store)), _fileUrl(std::move(fileUrl)), _use(use), _fileHandle(std::move(fileHandle))
{}

FileContainer::~FileContainer() = default;

void FileContainer::writeSessionHeader(ClientSessionHeader header)
{
    _store->queue->async([self = shared_from_this(), header = std::move(header)] {
        if (!self->_archiveObject(self->_store->version)) {
            log(kLogFeedbackStorage).error("Could not write version string");
            self->closeFile();
        }
        if (!self->_archiveObject(header)) {
            log(kLogFeedbackStorage).error("Could not write root object");
            self->closeFile();
        }
    });
}

void FileContainer::writeFeedback(std::shared_ptr<const TavrinFeedback> feedback, platform::Reply<bool> done)
{
    _store->queue->async([self = shared_from_this(), feedback = std::move(feedback), done = std::move(done)]() mutable {
        if (!self->_fileHandle) return done.abandon();
        const bool written = self->_archiveObject(*feedback);
        if (written) ++self->_feedbackCount;
        if (done) done(written);
    });
}

template <class Object> bool FileContainer::_archiveObject(const Object& object)
{
    _store->queue->assertOnQueue();
    if (!_fileHandle) return false;
    const auto transaction = _store->transactions.begin("archiveObject");
    return _append(archived(object));
}

bool FileContainer::_append(const std::string& archive)
{
    const std::uint64_t end = _fileHandle->size();
    const std::uint64_t length = archive.size();
    if (end + sizeof(length) + length >= _store->maxFileSize) {
        _store->diagnosticData.addValue(1, "com.quorvane.tavrind.filesizeexceeded");
        log(kLogFeedbackStorage)
            .error("bytes written ({}) + feedback ({}) exceeds max session size ({})", end, length,
                   _store->maxFileSize);
        return false;
    }
    const auto frame = std::bit_cast<std::array<char, sizeof(length)>>(length);
    const auto written = _fileHandle->append({{frame.data(), frame.size()}, archive});
    if (!written)
        log(kLogFeedbackStorage).error("record not written to {}: {}", _fileUrl.string(), written.error().reason());
    return written.has_value();
}

void FileContainer::close()
{
    _store->queue->async([self = shared_from_this()] { self->closeFile(); });
}

void FileContainer::closeFile()
{
    _store->queue->assertOnQueue();
    if (!_fileHandle) return;
    log(kLogFeedbackStorage).debug("close file url {}", _fileUrl.string());
    _fileHandle.reset();
}

FileReading FileContainer::read()
{
    return _store->queue->sync([this] { return _read(); });
}

FileReading FileContainer::_notRead(FeedbackFate fate, const std::string& text) const
{
    log(kLogFeedbackStorage).error("{}", text);
    return {.session = nullptr, .lost = _feedbackCount, .fate = fate};
}

FileReading FileContainer::_read()
{
    log(kLogFeedbackStorage).debug("reading file url {}", _fileUrl.string());
    if (_fileHandle) {
        log(kLogFeedbackStorage).error("file is already open closing it {}", _fileUrl.string());
        closeFile();
    }
    if (_fileUrl.empty()) return _notRead(FeedbackFate::Unreadable, "No file url available");
    const auto attributes = _store->files.info(_fileUrl);
    if (!attributes)
        return _notRead(FeedbackFate::Unreadable, "Attribute fetch error " + attributes.error().description());
    if (attributes->size > _store->maxFileSize) {
        _store->diagnosticData.addValue(1, "com.quorvane.tavrind.filetoolarge");
        return _notRead(FeedbackFate::FileTooBig, "Session too big to process");
    }
    if (attributes->size == 0) return _notRead(FeedbackFate::Unreadable, "empty file");
    const auto file = _store->files.openForReading(_fileUrl);
    if (!file)
        return _notRead(FeedbackFate::Unreadable, "Could not open file for reading " + file.error().description());
    const auto data = mmapFileHandle(*file);
    if (!data) return _notRead(FeedbackFate::Unreadable, "mmap: " + data.error().description());
    try {
        return _unarchiveObject(*data);
    } catch (const std::exception& exception) { // out of memory, or a failing library
        return _notRead(FeedbackFate::Unreadable, std::string("exception reading session archive ") + exception.what());
    }
}

FileReading FileContainer::_unarchiveObject(const Bytes& data)
{
    _store->queue->assertOnQueue();
    if (data.size() > UINT32_MAX) return _notRead(FeedbackFate::Unreadable, "erroneous file data length");

    ArchivedDataIterator records(data);
    const auto versionArchive = records.readNextObject();
    const auto version = versionArchive ? platform::valueFromArchive(*versionArchive) : platform::Value();
    if (!version || !version->asString()) return _notRead(FeedbackFate::Unreadable, "version string not stored");
    if (*version->asString() != _store->version)
        return _notRead(FeedbackFate::OtherVersion, "version not supported: " + *version->asString());
    const auto header = readHeader(records);
    if (!header) return _notRead(FeedbackFate::Unreadable, "client session not stored");

    const auto session = std::make_shared<StoredSession>(*header, data);
    while (records.hasMore()) {
        const std::uint64_t position = records.position();
        const auto archive = records.readNextObject();
        const auto added = archive ? session->add(*archive) : platform::Result<bool>(false);
        if (!added) log(kLogFeedbackStorage).error("{}", added.error().reason());
        if (!archive || !added)
            log(kLogFeedbackStorage).error("could not unarchive feedback range {} size {}", position, records.size());
        if (!added.value_or(false)) {
            log(kLogFeedbackStorage).error("tavrin feedback expected");
            break;
        }
    }
    const std::uint64_t lost = _feedbackCount - std::min<std::uint64_t>(_feedbackCount, session->recordedEvents());
    return {.session = session, .lost = lost, .fate = FeedbackFate::DamagedTail};
}

void FileContainer::countFeedback()
{
    _store->queue->assertOnQueue();
    constexpr std::uint64_t kHead = 2; // the version and the session's header
    const auto file = _store->files.openForReading(_fileUrl);
    const auto data = file ? mmapFileHandle(*file) : std::unexpected(file.error());
    const std::uint64_t records = data ? ArchivedDataIterator(*data).countRecords() : 0;
    _feedbackCount = records - std::min(records, kHead);
}

} // namespace tavrin
