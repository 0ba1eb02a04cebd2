#include "platform/ipc/ReplyBacklog.h"

#include <chrono>
#include <utility>

#include "platform/values/Dictionary.h"

namespace platform::ipc {

namespace {

/// Longer than any wait: only the event ends one. Duration::max() would overflow when it is added to a time.
constexpr Duration kForever = std::chrono::years(1);

constexpr std::size_t kHandleCost = 16u << 10;

std::size_t memoryOf(const Value& value)
{
    std::size_t size = sizeof(Value);
    if (const std::string* text = value.asString()) size += text->size();
    if (const Bytes* bytes = value.asBytes()) size += bytes->size();
    if (const Value::Array* array = value.asArray())
        for (const Value& element : *array) size += memoryOf(element);
    if (const Dictionary* dictionary = value.asDictionary())
        for (const auto& [key, element] : *dictionary) size += sizeof(key) + key.size() + memoryOf(element);
    return size;
}

} // namespace

std::size_t memoryOf(const Message& message)
{
    std::size_t size = message.handles.size() * kHandleCost;
    for (const Value& argument : message.args) size += memoryOf(argument);
    return size;
}

void ReplyBacklog::runWithRoom(Queue::Task task)
{
    std::shared_ptr<Event> room;
    {
        MutexLock lock(_mutex);
        if (_bytes >= _limit) room = _waiting.emplace_back(std::make_shared<Event>());
    }
    if (!room) return task();
    Queue::current()->suspendUntil(*room, kForever, [this, task = std::move(task)]() mutable {
        task();
        wakeNext(); // the task may have given no reply
    });
}

void ReplyBacklog::add(std::size_t bytes)
{
    MutexLock lock(_mutex);
    _bytes += bytes;
}

void ReplyBacklog::remove(std::size_t bytes)
{
    {
        MutexLock lock(_mutex);
        _bytes -= bytes;
    }
    wakeNext();
}

void ReplyBacklog::wakeNext()
{
    std::shared_ptr<Event> next;
    {
        MutexLock lock(_mutex);
        if (_bytes >= _limit || _waiting.empty()) return;
        next = std::move(_waiting.front());
        _waiting.pop_front();
    }
    next->signal();
}

} // namespace platform::ipc
