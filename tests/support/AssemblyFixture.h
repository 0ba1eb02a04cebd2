#pragma once

#include <gtest/gtest.h>

#include "CoreTavrin/TAVBag.h"
#include "platform/values/Dictionary.h"
#include "tavrind/Assembly.h"
#include "tavrind/TAVNetworkRequestFactory.h"
#include "tavrind/TavrinBagController.h"
#include "tests/support/TestDevice.h"

namespace tavrin {

using namespace std::chrono_literals;
using platform::Dictionary;
using platform::Url;
using platform::Value;

namespace test {

/// An assembly without services on a device of twins, for tests of a service on its own.
struct AssemblyTest : testing::Test {
    /// Posts a bag with these entries, as the bag controller does.
    void announce(Value entries)
    {
        device.notifications.post(
            {.name = TAVBagChangeNotification,
             .userInfo = {{"bag", std::make_shared<const TAVBag>(std::move(entries), "Vistrel/4")}}});
        device.drain();
    }
    void moveTo(std::optional<platform::Location> location)
    {
        device.location.moveTo(std::move(location));
        device.drain();
    }
    void changeProfile(platform::DeviceProfile profile)
    {
        device.profile.change(std::move(profile));
        device.drain();
    }
    void changeLocale(platform::LocaleSource::Change change = platform::LocaleSource::Change::Locale)
    {
        device.locale.handler(change);
        device.drain();
    }
    void performSearch()
    {
        assembly.requestFactory->setPerformedSearch();
        device.drain();
    }
    /// Empty if the request doesn't have it.
    static std::string header(const platform::UrlRequest& request, std::string_view name)
    {
        const std::string* value = request.headers.find(name);
        return value ? *value : "";
    }

    platform::test::TestDevice device;
    platform::test::LogCapture log;
    Assembly assembly{device.device};
};

} // namespace test
} // namespace tavrin
