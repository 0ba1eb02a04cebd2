#include "tests/support/TestDevice.h"

namespace platform::test {

void FakeLocation::moveTo(std::optional<Location> location)
{
    place = location;
    handler(location, location ? "" : "lost");
}

void FakeProfile::change(DeviceProfile profile)
{
    current = std::move(profile);
    for (const auto& handler : handlers) handler(current);
}

std::optional<std::string> FakeProcesses::applicationId(pid_t pid)
{
    const auto found = applications.find(pid);
    return found == applications.end() ? std::nullopt : std::optional(found->second);
}

Result<std::string> FakeProcesses::executablePath(pid_t pid)
{
    const auto found = paths.find(pid);
    if (found == paths.end()) return std::unexpected(Error::posix(ENOENT));
    return found->second;
}

struct FakeMemoryPressure::Registration final : Watch {
    Registration(FakeMemoryPressure& owner_, std::function<void()> critical)
        : owner(owner_),
          token(owner.center.observe("critical", [critical = std::move(critical)](auto&) { critical(); }))
    {
        ++owner.watchers;
    }
    ~Registration() override { --owner.watchers; }
    FakeMemoryPressure& owner;
    NotificationCenter::Token token;
};

std::unique_ptr<MemoryPressure::Watch> FakeMemoryPressure::watch(std::function<void()> critical)
{
    return std::make_unique<Registration>(*this, std::move(critical));
}

TestDevice::TestDevice(FileSystem* disk_, std::filesystem::path root_)
    : disk(disk_ ? *disk_ : files), root(std::move(root_))
{
    failOnReplyMisuse();
    Log::privateData = true;
    device.makeQueues();
}

TestDevice::~TestDevice() = default;

} // namespace platform::test
