#pragma once

#include <gtest/gtest.h>

#include "CoreTavrin/TAVBag.h"
#include "platform/values/Dictionary.h"
#include "tavrind/Assembly.h"
#include "tavrind/TavrinBagController.h"
#include "tests/support/TestDevice.h"

namespace tavrin::test {

/// An assembly without services on a device of twins, for tests of a service on its own.
struct AssemblyTest : testing::Test {
    /// Posts a bag with these entries, as the bag controller does.
    void announce(platform::Value entries)
    {
        device.notifications.post(
            {.name = TAVBagChangeNotification,
             .userInfo = {{"bag", std::make_shared<const TAVBag>(std::move(entries), "Vistrel/4")}}});
        device.drain();
    }

    platform::test::TestDevice device;
    platform::test::LogCapture log;
    Assembly assembly{device.device};
};

} // namespace tavrin::test
