#include "tavrind/FeedbackBooks.h"

#include <algorithm>
#include <cerrno>
#include <functional>
#include <string_view>
#include <utility>

#include "platform/base/Uuid.h"
#include "platform/files/Files.h"
#include "platform/run/Queue.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Error.h"
#include "platform/values/Json.h"
#include "tavrind/TavrinLogging.h"

namespace tavrin {

using platform::Dictionary;
using platform::Value;

namespace {

constexpr std::size_t kMaximumFileSize = 64 * 1024;
/// Number of uploads that `isSettled` remembers. A few suffice: the upload session forgets an outcome right after it is
/// booked.
constexpr std::size_t kMaximumSettled = 100;

/// The keys of the fates. From `kFirstDropped` on, they are reasons for a drop.
constexpr std::array<std::string_view, kFeedbackFates> kNames{
    "open",        "closed",        "uploading",  "sent",          "notSent",    "unknown",      "feedbackOff",
    "noContainer", "refusedAppend", "fileTooBig", "tooOld",        "unreadable", "otherVersion", "damagedTail",
    "notJson",     "noBody",        "noTask",     "endpointUnset", "bufferFull",
};
constexpr auto kFirstDropped = static_cast<std::size_t>(FeedbackFate::FeedbackOff);

constexpr std::size_t at(FeedbackFate fate)
{
    return static_cast<std::size_t>(fate);
}

} // namespace

FeedbackBooks::FeedbackBooks(platform::FileSystem& files, std::filesystem::path path,
                             std::shared_ptr<platform::Queue> queue)
    : _files(files), _path(std::move(path)), _process(platform::Uuid::random().string()), _queue(std::move(queue))
{
    _load();
}

void FeedbackBooks::_load()
{
    const auto contents = _files.read(_path, kMaximumFileSize);
    if (!contents) {
        if (contents.error().code != ENOENT)
            log(kLogFeedback).error("feedback books not read: {}", contents.error().reason());
        _unread = platform::mayPass(contents.error());
        return;
    }
    _unread = false;
    const auto books = platform::parseJson(contents->view(), kMaximumFileSize);
    if (!books || !books->asDictionary())
        return log(kLogFeedback).error("feedback books are damaged, starting with empty ones");

    std::array<std::int64_t, kFeedbackFates> read{};
    for (std::size_t fate = 0; fate < kFeedbackFates; ++fate) {
        const Value& group = fate < kFirstDropped ? *books : (*books)["dropped"];
        const std::int64_t events =
            std::clamp<std::int64_t>(group[kNames[fate]].asInt().value_or(0), 0, INT64_MAX / 64);
        _recorded += events;
        read[fate] = events;
    }
    for (const FeedbackFate underWay : {FeedbackFate::Open, FeedbackFate::Closed, FeedbackFate::Uploading})
        _unresolved += std::exchange(read[at(underWay)], 0);
    read[at(FeedbackFate::Unknown)] += _unresolved;
    std::ranges::transform(_counts, read, _counts.begin(), std::plus());
    if (const auto* settled = (*books)["settled"].asArray())
        for (const Value& upload : *settled)
            if (upload.asString()) _settled.push_back(*upload.asString());
}

void FeedbackBooks::record(FeedbackFate fate, std::uint64_t events)
{
    const platform::MutexLock lock(_mutex);
    _recorded += static_cast<std::int64_t>(events);
    _counts[at(fate)] += static_cast<std::int64_t>(events);
}

void FeedbackBooks::move(FeedbackFate from, FeedbackFate to, std::uint64_t events)
{
    const platform::MutexLock lock(_mutex);
    _counts[at(from)] -= static_cast<std::int64_t>(events);
    _counts[at(to)] += static_cast<std::int64_t>(events);
}

void FeedbackBooks::find(FeedbackFate fate, std::uint64_t events)
{
    const platform::MutexLock lock(_mutex);
    const auto found = static_cast<std::int64_t>(events);
    const std::int64_t known = std::min(found, _unresolved);
    _unresolved -= known;
    _counts[at(FeedbackFate::Unknown)] -= known;
    _recorded += found - known;
    _counts[at(fate)] += found;
}

void FeedbackBooks::settle(const std::string& upload, FeedbackFate outcome, std::uint64_t events)
{
    {
        const platform::MutexLock lock(_mutex);
        _settled.push_back(upload);
        if (_settled.size() > kMaximumSettled) _settled.pop_front();
        _counts[at(FeedbackFate::Uploading)] -= static_cast<std::int64_t>(events);
        _counts[at(outcome)] += static_cast<std::int64_t>(events);
    }
    save();
}

bool FeedbackBooks::isSettled(const std::string& upload) const
{
    const platform::MutexLock lock(_mutex);
    return std::ranges::find(_settled, upload) != _settled.end();
}

void FeedbackBooks::save()
{
    const platform::MutexLock saving(_saving);
    {
        const platform::MutexLock lock(_mutex);
        if (_unread) _load();
        if (_unread) return; // what the file counts must not be overwritten
    }
    Value books = description();
    {
        const platform::MutexLock lock(_mutex);
        books.mutableDictionary().set("settled", Value::Array(_settled.begin(), _settled.end()));
    }
    const std::string text = platform::toJson(books);
    auto written = _files.createDirectories(_path.parent_path());
    if (written) written = _files.writeAtomically(_path, text);
    if (!written) log(kLogFeedback).error("feedback books not saved: {}", written.error().reason());
}

void FeedbackBooks::saveSoon()
{
    {
        const platform::MutexLock lock(_mutex);
        if (std::exchange(_saveQueued, true)) return;
    }
    _queue->async([this] {
        {
            const platform::MutexLock lock(_mutex);
            _saveQueued = false;
        }
        save();
    });
}

std::int64_t FeedbackBooks::recorded() const
{
    const platform::MutexLock lock(_mutex);
    return _recorded;
}

std::int64_t FeedbackBooks::count(FeedbackFate fate) const
{
    const platform::MutexLock lock(_mutex);
    return _counts[at(fate)];
}

Value FeedbackBooks::description() const
{
    const platform::MutexLock lock(_mutex);
    Dictionary books{{"recorded", _recorded}};
    Dictionary dropped;
    for (std::size_t fate = 0; fate < kFeedbackFates; ++fate)
        (fate < kFirstDropped ? books : dropped).set(std::string(kNames[fate]), _counts[fate]);
    books.set("dropped", std::move(dropped));
    return books;
}

} // namespace tavrin
