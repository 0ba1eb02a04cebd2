#include "fuzz/Check.h"
#include "platform/device/InstalledApplications.h"
#include "tavrind/AppWhitelistController.h"
#include "tavrind/decoder.h"

namespace {

struct Installed final : platform::InstalledApplications {
    std::vector<platform::InstalledApplication> applications() override
    {
        return {{"", "1"}, {"a", "1"}, {"b", "1"}, {"org.example.Mail", "2.1"}, {"unversioned", ""}};
    }
    void onChange(std::function<void()>) override {}
};

} // namespace

/// The input is an allow-list. Where it gives a signature, a service can read it.
void runInput(std::string_view input)
{
    Installed installed;
    if (const auto signature = tavrin::processWhitelist(input, installed)) {
        const auto read = tavrin::readSignature(*signature);
        check(read.has_value(), *signature);
    }
}
