#include <gtest/gtest.h>

#include "tavrind/TavrinURLRequestBuilder.h"

namespace tavrin {
namespace {

using Builder = TavrinURLRequestBuilder;

Builder builderFor(std::string_view url)
{
    return Builder::requestBuilderWithURL(*platform::Url::parse(url));
}

std::string urlOf(const Builder& builder)
{
    return builder.createUrlRequest().url.string();
}

TEST(RequestBuilder, SortsTheQueryByNameAndCase)
{
    Builder builder = builderFor("https://s.example/q?b=2&a=1&a=3");
    builder.defaultQueryItemWithName("Z", "1");
    builder.forceQueryItemWithName("bare", std::nullopt);
    EXPECT_EQ(urlOf(builder), "https://s.example/q?Z=1&a=3&b=2&bare");
    EXPECT_EQ(urlOf(builder), "https://s.example/q?Z=1&a=3&b=2&bare") << "a second request is the same";
}

TEST(RequestBuilder, ForcedItemsWinOverDefaults)
{
    Builder builder = builderFor("https://s.example/?key=theirs");
    builder.defaultQueryItemWithName("key", "ours");
    builder.defaultQueryItemWithName("q", "default");
    builder.forceQueryItemWithName("q", "forced");
    builder.defaultQueryItemWithName("q", "late");
    builder.forceHttpHeaderWithName("X-A", "1");
    builder.defaultHttpHeaderWithName("X-A", "2");
    builder.forceHttpHeaderWithName("X-B", "1");
    builder.forceHttpHeaderWithName("X-B", std::nullopt);
    builder.defaultHttpHeaderWithName("x-a", "names are compared exactly");

    EXPECT_EQ(urlOf(builder), "https://s.example/?key=theirs&q=forced");
    EXPECT_TRUE(builder.containsHttpHeaderWithName("X-A"));
    EXPECT_FALSE(builder.containsHttpHeaderWithName("X-B"));
}

TEST(RequestBuilder, EncodesWhatAServerWouldMisread)
{
    const std::pair<const char*, const char*> cases[]{{"a;b", "a%3Bb"},
                                                      {"c++", "c%2B%2B"},
                                                      {"a&b=c#d", "a%26b%3Dc%23d"},
                                                      {"ü 日", "%C3%BC%20%E6%97%A5"},
                                                      {"/?:@!$'()*,-._~", "/?:@!$'()*,-._~"},
                                                      {"100%", "100%25"},
                                                      {"\"<>[]^`{|}", "%22%3C%3E%5B%5D%5E%60%7B%7C%7D"}};
    for (const auto& [text, encoded] : cases) {
        Builder builder = builderFor("https://s.example/");
        builder.forceQueryItemWithName("q", text);
        EXPECT_EQ(urlOf(builder), std::string("https://s.example/?q=") + encoded);
    }
    EXPECT_EQ(urlOf(builderFor("https://s.example/?q=a+b;c&r=%2B%7e")), "https://s.example/?q=a+b%3Bc&r=%2B%7e")
        << "what the service encoded stays as it is";
}

} // namespace
} // namespace tavrin
