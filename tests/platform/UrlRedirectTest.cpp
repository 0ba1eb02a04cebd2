#include "platform/net/UrlRedirect.h"

#include <sstream>

#include <gtest/gtest.h>

#include "platform/net/CurlSupport.h"
#include "platform/net/NetworkStatus.h"

namespace platform {
namespace {

using namespace std::chrono_literals;

TEST(UrlRedirect, ListsInnerAddresses)
{
    const auto expectEach = [](bool isPublic, const char* addresses) {
        std::istringstream list(addresses);
        for (std::string address; list >> address;) EXPECT_EQ(isPublicAddress(address), isPublic) << address;
    };
    expectEach(true, "8.8.8.8 11.0.0.0 172.15.255.255 172.32.0.0 100.63.255.255 100.128.0.0 192.169.0.1 192.0.1.1 "
                     "198.17.255.255 198.20.0.0 223.255.255.255 2606:4700::1 2001:4860::8888 3ffe::1 ::ffff:8.8.8.8 "
                     "64:ff9b::808:808 2002:808:808::1");
    expectEach(false, "127.0.0.1 127.255.0.1 10.1.2.3 172.16.0.1 172.31.255.255 192.168.0.1 169.254.169.254 "
                      "100.64.0.1 100.127.255.255 0.0.0.0 192.0.0.1 192.0.2.1 198.18.0.1 198.19.255.255 198.51.100.1 "
                      "203.0.113.1 224.0.0.1 239.255.255.255 240.0.0.1 255.255.255.255 ::1 :: fe80::1 fec0::1 fc00::1 "
                      "fdff::1 ff02::1 100::1 2001::1 2001:db8::1 3fff::1 5f00::1 64:ff9b:1::1 ::ffff:10.0.0.1 "
                      "::ffff:127.0.0.1 ::10.0.0.1 64:ff9b::a00:1 2002:a00:1:: localhost 10.0.0 fe80::1%lo");
    EXPECT_FALSE(isPublicAddress(""));
}

TEST(UrlRedirect, AnAnswerLimitsTheUrlsThatItNames)
{
    const struct {
        const char* url;
        std::optional<bool> publicPeer;
        UrlSource source;
    } cases[]{
        {"https://service.example/", true, {true, true}},
        {"https://service.example/", false, {true, false}},
        {"https://service.example/", std::nullopt, {true, true}},
        {"http://service.example/", std::nullopt, {false, true}},
        {"http://localhost:1/", std::nullopt, {false, false}},
        {"http://127.0.0.1:1/", std::nullopt, {false, false}},
        {"http://[::1]:1/", std::nullopt, {false, false}},
        {"http://[2606:4700::1]/", std::nullopt, {false, true}},
    };
    for (const auto& c : cases)
        EXPECT_EQ(sourceOf(UrlResponse{.url = *Url::parse(c.url), .publicPeer = c.publicPeer}), c.source) << c.url;
}

TEST(UrlRedirect, SourcesAllowHttpsAndNoUserInfo)
{
    const struct {
        const char* url;
        std::optional<UrlSource> source;
        const char* allowed; // null if it isn't
    } cases[]{
        {"http://u:p@h/", std::nullopt, "http://u:p@h/"},
        {"ftp://h/", std::nullopt, "ftp://h/"},
        {"http://u:p@h/a@b", UrlSource{}, "http://h/a@b"},
        {"https://u@h:1/", UrlSource{.secure = true}, "https://h:1/"},
        {"http://h/", UrlSource{.secure = true}, nullptr},
        {"HTTP://h/", UrlSource{.secure = true}, nullptr},
        {"file:///etc/x", UrlSource{}, nullptr},
    };
    for (const auto& c : cases) {
        const auto allowed = withinSource({.url = *Url::parse(c.url), .source = c.source});
        EXPECT_EQ(allowed ? allowed->url.string() : std::to_string(allowed.error().code),
                  c.allowed ? c.allowed : std::to_string(kUrlForbiddenRedirect))
            << c.url;
    }
}

TEST(UrlRedirect, OldConnectionsAreClosedOnMeteredNetworks)
{
    NetworkStatus network;
    const UrlSessionConfiguration configuration{.meteredPurgeTimeout = 10s, .network = &network};
    EXPECT_EQ(connectionPurgeTimeout(configuration), std::nullopt) << "not known";
    for (const bool metered : {false, true, false}) {
        network.set({.online = true, .metered = metered});
        EXPECT_EQ(connectionPurgeTimeout(configuration), metered ? std::optional<Duration>(10s) : std::nullopt);
    }
    network.set({.online = true, .metered = true});
    EXPECT_EQ(connectionPurgeTimeout({.network = &network}), std::nullopt);
    EXPECT_EQ(connectionPurgeTimeout({.meteredPurgeTimeout = 10s}), std::nullopt);
}

} // namespace
} // namespace platform
