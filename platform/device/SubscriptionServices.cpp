#include "platform/device/SubscriptionServices.h"

#include <algorithm>
#include <cerrno>
#include <optional>

#include "platform/base/Log.h"
#include "platform/base/Mutex.h"
#include "platform/files/Files.h"
#include "platform/files/FileWatch.h"
#include "platform/run/Clock.h"
#include "platform/run/RunLoop.h"
#include "platform/text/Text.h"
#include "platform/values/Json.h"

namespace platform {

namespace {

constexpr std::size_t kMaximumSubscriptionSize = 4u << 10;
constexpr std::size_t kMaximumFiles = 64;

class SubscriptionFiles final : public SubscriptionServices {
public:
    SubscriptionFiles(FileSystem& files, std::filesystem::path directory, RunLoop& runLoop, Clock& clock)
        : _files(files), _directory(std::move(directory)), _runLoop(runLoop), _clock(clock)
    {}

    Result<std::map<std::string, Value>> activeServices(const SubscriptionQuery& query) override
    {
        auto names = _files.list(_directory);
        if (!names && names.error().code == ENOENT) return {};
        if (!names) return std::unexpected(std::move(names.error()));
        std::erase_if(*names, [](const std::string& name) { return !name.ends_with(".json"); });
        std::ranges::sort(*names);
        if (names->size() > kMaximumFiles) {
            defaultLog().error("of {} subscription files, {} are read", names->size(), kMaximumFiles);
            names->resize(kMaximumFiles);
        }
        std::map<std::string, Value> services;
        for (const std::string& name : *names) {
            const auto path = _directory / name;
            const auto info = _files.info(path);
            if (!info) continue; // the file was removed after the listing
            if (auto service = read(path)) {
                const std::string provider = *(*service)["provider"].asString();
                services.erase(provider);
                if (isActiveSubscription(*service, info->modified, query, _clock.wallNow()))
                    services[provider] = std::move(*service);
            }
        }
        return services;
    }

    void onChange(std::function<void()> handler) override
    {
        MutexLock lock(_mutex);
        const bool watched = static_cast<bool>(_handler);
        _handler = std::move(handler);
        if (watched) return;
        // The watch lives on the run loop's thread. `changed` covers changes that preceded it.
        _runLoop.execute(Priority::Default, [this] {
            _watch.emplace(_runLoop, _directory / "", [this] { changed(); });
            changed();
        });
    }

private:
    std::optional<Value> read(const std::filesystem::path& path)
    {
        const auto bytes = _files.read(path, kMaximumSubscriptionSize);
        const auto value = bytes ? parseJson(bytes->view(), kMaximumSubscriptionSize) : std::unexpected(bytes.error());
        if (!value) {
            defaultLog().error("subscription {} can't be read: {}", path.string(), value.error().description());
            return std::nullopt;
        }
        const std::string* provider = (*value)["provider"].asString();
        if (!provider || provider->empty()) {
            defaultLog().error("subscription {} has no \"provider\"", path.string());
            return std::nullopt;
        }
        return *value;
    }

    void changed()
    {
        std::function<void()> handler;
        {
            MutexLock lock(_mutex);
            handler = _handler;
        }
        if (handler) handler();
    }

    FileSystem& _files;
    const std::filesystem::path _directory;
    RunLoop& _runLoop;
    Clock& _clock;
    Mutex _mutex;
    std::function<void()> _handler GUARDED_BY(_mutex);
    std::optional<FileWatch> _watch; // loop's thread
};

bool contains(const std::vector<std::string>& list, const Value& text, bool anyCase)
{
    if (!text.asString()) return false;
    return std::ranges::any_of(list, [&](const std::string& each) {
        return anyCase ? lowerCased(each) == lowerCased(*text.asString()) : each == *text.asString();
    });
}

} // namespace

bool isActiveSubscription(const Value& service, Date written, const SubscriptionQuery& query, Date now)
{
    bool matches = contains(query.bundleIdentifiers, service["bundleIdentifier"], false);
    if (const Value::Array* domains = service["domains"].asArray())
        for (const Value& domain : *domains) matches = matches || contains(query.domains, domain, true);
    if (!matches || !service["active"].asBool().value_or(true)) return false;
    const auto expires = service["expires"].asDouble();
    return now - written < query.maximumExpiration && (!expires || now < dateFromSecondsSince1970(*expires));
}

std::unique_ptr<SubscriptionServices> makeSubscriptionServices(FileSystem& files, std::filesystem::path directory,
                                                               RunLoop& runLoop, Clock& clock)
{
    return std::make_unique<SubscriptionFiles>(files, std::move(directory), runLoop, clock);
}

} // namespace platform
