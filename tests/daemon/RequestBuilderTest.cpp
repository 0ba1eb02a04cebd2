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
    Builder builder = builderFor("https://s.example/");
    builder.forceQueryItemWithName("q", "a&b=c#d;e+f 100% /?:@!$'()*,-._~ \"<>[]^`{|}日");
    EXPECT_EQ(urlOf(builder), "https://s.example/?q=a%26b%3Dc%23d%3Be%2Bf%20100%25%20/?:@!$'()*,-._~%20"
                              "%22%3C%3E%5B%5D%5E%60%7B%7C%7D%E6%97%A5");
    EXPECT_EQ(urlOf(builderFor("https://s.example/?q=a+b;c&r=%2B%7e")), "https://s.example/?q=a+b%3Bc&r=%2B%7e")
        << "what the service encoded stays as it is";
}

} // namespace
} // namespace tavrin
