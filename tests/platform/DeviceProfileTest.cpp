#include "platform/device/DeviceProfile.h"

#include <gtest/gtest.h>

#include "platform/files/Files.h"
#include "platform/run/RunLoop.h"
#include "platform/values/Json.h"
#include "tests/support/LogCapture.h"
#include "tests/support/TemporaryDirectory.h"

namespace platform {
namespace {

using test::writeFile;

struct DeviceProfileTest : testing::Test {
    static void SetUpTestSuite() { Log::threshold = LogLevel::Fault; } // what is expected is captured, not printed
    test::LogCapture log;
};

TEST_F(DeviceProfileTest, MembersOfTheWrongTypeReadAsMissing)
{
    const DeviceProfile whole{.countryCode = "CH",
                              .storefront = "143459",
                              .managedAccount = true,
                              .screenScale = 2.5,
                              .geoMetadata = "m",
                              .geoEnvironment = "e",
                              .geoSessionId = "i",
                              .geoSessionEntity = "n"};
    const struct {
        const char* json;
        DeviceProfile profile;
        std::size_t complaints;
    } cases[]{
        {R"({"countryCode": "CH", "storefront": "143459", "managedAccount": true, "screenScale": 2.5, "geoMetadata": "m",
             "geoEnvironment": "e", "geoSession": {"id": "i", "entity": "n"}, "newsSubscribed": false})",
         whole, 0},
        {"{}", {}, 0},
        {R"({"countryCode": "", "storefront": null})", {}, 0},
        {R"({"countryCode": 41, "storefront": ["x"], "geoMetadata": true, "geoSession": {"id": 1}})", {}, 4},
        {R"({"geoSession": "x", "managedAccount": "true", "newsSubscribed": 1, "country": "CH"})", {}, 4},
        {R"({"geoSession": {"id": "i", "identity": "n"}})", {.geoSessionId = "i"}, 1},
        {R"({"screenScale": 0.5})", {.screenScale = 0.5}, 0},
        {R"({"screenScale": 8})", {.screenScale = 8}, 0},
        {R"({"screenScale": 0.49})", {}, 1},
        {R"({"screenScale": 8.01})", {}, 1},
        {R"({"screenScale": -1e300})", {}, 1},
        {R"({"screenScale": "2"})", {}, 1},
        {"[]", {}, 1},
        {"null", {}, 1},
    };
    for (const auto& c : cases) {
        std::vector<std::string> problems;
        EXPECT_EQ(deviceProfileFromValue(parseJson(c.json, 1 << 20).value(), problems), c.profile) << c.json;
        EXPECT_EQ(problems.size(), c.complaints) << c.json;
    }
}

TEST_F(DeviceProfileTest, AChangedFileIsToldOnceAndABrokenOneIsEmpty)
{
    test::TemporaryDirectory directory;
    const auto files = makeSystemFiles();
    RunLoop loop;
    const auto source = makeDeviceProfileSource(*files, directory / "app/device.json", loop);
    std::vector<std::string> told;
    source->onChange([&](const DeviceProfile& profile) { told.push_back(profile.countryCode.value_or("none")); });
    EXPECT_EQ(source->profile(), DeviceProfile()) << "no file, nor its directory";
    loop.runOnce(Duration::zero()); // the watch is there now

    std::filesystem::create_directory(directory / "app");
    for (const auto& [contents, count] :
         {std::pair(R"({"countryCode": "CH"})", 1u), {R"({"countryCode": "DE"})", 2u}, {R"({"countryCode": )", 3u}}) {
        EXPECT_TRUE(files->writeAtomically(directory / "app/device.json", contents));
        EXPECT_TRUE(test::runUntil(loop, [&, expected = count] { return told.size() == expected; })) << contents;
    }
    EXPECT_EQ(told, (std::vector<std::string>{"CH", "DE", "none"}));
    EXPECT_EQ(source->profile(), DeviceProfile());
    EXPECT_EQ(log.count("device.json is broken"), 1);
    writeFile(directory / "app/device.json", R"({"country": "CH"})");
    EXPECT_TRUE(test::runUntil(loop, [&] { return log.count("device.json: country: there is no such member") >= 1; }));
    writeFile(directory / "app/device.json", "{}");
    writeFile(directory / "app/marker", "");
    loop.runOnce(std::chrono::seconds(1));
    EXPECT_EQ(told.size(), 3u) << "another file that says the same is no change";

    for (const char* country : {"AT", "LI"}) { // both: the new directory is watched, too
        std::filesystem::remove_all(directory / "app");
        std::filesystem::create_directory(directory / "app");
        for (const std::string& now : {std::string(country), std::string("X")}) {
            writeFile(directory / "app/device.json", R"({"countryCode": ")" + now + "\"}");
            EXPECT_TRUE(test::runUntil(loop, [&] { return told.back() == now; })) << country << " " << now;
        }
    }
}

} // namespace
} // namespace platform
