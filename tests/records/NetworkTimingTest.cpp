#include "tavrind/NetworkTiming.h"

#include <limits>

#include <gtest/gtest.h>

#include "platform/values/Dictionary.h"
#include "platform/values/Json.h"
#include "tests/records/FeedbackExamples.h"

namespace tavrin {
namespace {

using platform::Dictionary;
using platform::Value;

TEST(NetworkTiming, MarksAreRelativeAndOrderedAndStatisticsFollow)
{
    struct {
        const char* what;
        const char* data;
        const char* rows;
    } const cases[] = {
        {"nothing", "{}", "[]"},
        {"only marks that were not reached", R"({"_kCFNTimingDataFetchStart":0.0,"_kCFNTimingDataResponseEnd":0})",
         "[]"},
        {"the earliest mark is 0, and distances are rounded",
         R"({"_kCFNTimingDataResponseEnd":2.0026,"_kCFNTimingDataFetchStart":2,"_kCFNTimingDataConnectStart":2.0004})",
         R"([["FetchStart",0],["ConnectStart",0],["ResponseEnd",3]])"},
        {"equal marks keep their order",
         R"({"_kCFNTimingDataB Start":1.5,"_kCFNTimingDataA End":1.5,"_kCFNTimingDataFetchStart":1.0})",
         R"([["FetchStart",0],["B Start",500],["A End",500]])"},
        {"neither a mark nor a number",
         R"({"_kCFNTimingDataConnectionReused":true,"_kCFNTimingDataFetchStart":"1","_kCFNTimingDataMiddle":3.5})",
         "[]"},
        {"counts that are not 0",
         R"({"_kCFNTimingDataConnectionStopTimeCounts":{"_kCFNTimingDataNStatTxBytes":12,"_kCFNTimingDataNStatRx":0,
             "_kCFNTimingDataNStatLoss":0.75,"_kCFNTimingDataNStatText":"12","_kCFNTimingDataNStatShare":-1.5,"X":1},
             "_kCFNTimingDataConnectionStartTimeCounts":{},"_kCFNTimingDataFetchStart":1.0})",
         R"([["FetchStart",0],["ConnectionStopTimeCounts",{"TxBytes":12,"Share":-1.5,"X":1}],)"
         R"(["ConnectionStartTimeCounts",{}]])"},
        {"fast-open statistics as they are",
         R"({"_kCFNTimingDataTCPFastOpenStatsStart":{"_kCFNTimingDataNStatA":0,"b":"text"},
             "_kCFNTimingDataTCPFastOpenStats":7})",
         R"([["TCPFastOpenStatsStart",{"_kCFNTimingDataNStatA":0,"b":"text"}]])"},
        {"keys without the prefix", R"({"Start":1.0,"End":2.0})", R"([["Start",0],["End",1000]])"},
        {"no dictionary", R"([1,2])", "null"},
    };
    for (const auto& c : cases) EXPECT_EQ(platform::toJson(formatNetworkTimingData(parsed(c.data))), c.rows) << c.what;
}

TEST(NetworkTiming, NonsenseStaysInRange)
{
    const double infinity = std::numeric_limits<double>::infinity();
    const Dictionary data{{"_kCFNTimingDataAStart", -1e300},
                          {"_kCFNTimingDataBStart", infinity},
                          {"_kCFNTimingDataCStart", -infinity},
                          {"_kCFNTimingDataDEnd", 1e308},
                          {"_kCFNTimingDataEEnd", std::numeric_limits<double>::quiet_NaN()}};
    EXPECT_EQ(platform::toJson(formatNetworkTimingData(data)), R"([["AStart",0],["DEnd",9000000000000000000]])");
}

TEST(NetworkTiming, PeerAddressesAreWrittenWithTheirPort)
{
    const std::pair<const char*, std::optional<std::string>> cases[] = {
        {"10 02 01 bb c0 00 02 07 00 00 00 00 00 00 00 00", "192.0.2.7:443"},
        {"1c 1e 20 fb 00 00 00 00 20 01 0d b8 00 00 00 00 00 00 00 00 00 00 00 1f 00 00 00 00", "[2001:db8::1f]:8443"},
        {"10 02 ff ff ff ff ff ff 00 00 00 00 00 00 00 00", "255.255.255.255:65535"},
        {"10 02 01 bb c0 00 02 07 00 00 00 00 00 00 00", std::nullopt},    // 15 bytes
        {"10 1e 01 bb 00 00 00 00 20 01 0d b8 00 00 00 00", std::nullopt}, // the address is cut off
        {"10 0a 01 bb c0 00 02 07 00 00 00 00 00 00 00 00", std::nullopt}, // another family
        {"", std::nullopt},
    };
    for (const auto& [hex, text] : cases) {
        const Value timing = Dictionary{{"_kCFNTimingDataConnectionPeerAddress", bytesFromHex(hex)}};
        EXPECT_EQ(peerAddress(timing), text) << hex;
    }
    EXPECT_EQ(peerAddress(Dictionary{{"_kCFNTimingDataConnectionPeerAddress", "192.0.2.7:443, or so"}}), std::nullopt);
}

} // namespace
} // namespace tavrin
