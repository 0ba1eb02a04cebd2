#include "platform/ipc/ReplyBacklog.h"

#include <chrono>
#include <utility>

#include "platform/values/Dictionary.h"
#include "platform/values/Record.h"

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

/// Adds up the memory of a record's values.
class MemoryCounter final : public Encoder {
public:
    void beginRecord(std::string_view, std::size_t) override { size += sizeof(Value); }
    void key(std::string_view name) override { size += sizeof(std::string) + name.size(); }
    void endRecord() override {}
    void beginArray(std::size_t) override { size += sizeof(Value); }
    void endArray() override {}
    void null() override { size += sizeof(Value); }
    void boolean(bool) override { size += sizeof(Value); }
    void integer(std::int64_t) override { size += sizeof(Value); }
    void unsignedInteger(std::uint64_t) override { size += sizeof(Value); }
    void real(double) override { size += sizeof(Value); }
    void string(std::string_view text) override { size += sizeof(Value) + text.size(); }
    void bytes(const Bytes& bytes) override { size += sizeof(Value) + bytes.size(); }
    void date(Date) override { size += sizeof(Value); }
    void value(const Value& value) override { size += memoryOf(value); }

    std::size_t size = 0;
};

} // namespace

std::size_t memoryOf(const Message& message)
{
    std::size_t size = message.handles.size() * kHandleCost;
    for (const Value& argument : message.args) size += memoryOf(argument);
    MemoryCounter records;
    for (const auto& record : message.records)
        if (record) encodeRecord(records, *record);
    return size + records.size;
}

std::shared_ptr<Event> ReplyBacklog::awaitedRoom()
{
    MutexLock lock(_mutex);
    return _bytes < _limit ? nullptr : _waiting.emplace_back(std::make_shared<Event>());
}

void ReplyBacklog::runLater(const Event& room, Queue::Task task)
{
    Queue::current()->suspendUntil(room, kForever, [this, task = std::move(task)]() mutable {
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
