#include "platform/net/Url.h"

#include <fmt/format.h>
#include <gtest/gtest.h>

namespace platform {
namespace {

TEST(Url, OnlyAbsoluteUrlsAreTaken)
{
    const std::string tooLong = "http://h/" + std::string(64 << 10, 'x');
    for (const std::string_view text :
         {"", "x", "/x", "//h/x", "1a://h", "://h", "h_t://h", "http://h h/", "http://[::1", "http://h:99999/",
          "http://h:x/", "http://h/\n", "http://h/a\tb", "http://h/\x7f", tooLong.c_str()})
        EXPECT_EQ(Url::parse(text), std::nullopt) << text.substr(0, 40);
    EXPECT_EQ(Url::parse(std::string_view("http://h/\0x", 11)), std::nullopt);
    EXPECT_TRUE(Url::parse(tooLong.substr(0, 64 << 10)));
    EXPECT_TRUE(Url().empty());
}

TEST(Url, IsTakenApart)
{
    const std::pair<std::string, std::string> cases[]{
        {"HTTPS://Example.COM:8443/A/b?C=d#E", "https | example.com | 8443 | /A/b | C=d"},
        {"http://h", "http | h | 0 | / | none"},
        {"http://h?", "http | h | 0 | / | "},
        {"http://h?a=b?c/d", "http | h | 0 | / | a=b?c/d"},
        {"http://h#f?a=b", "http | h | 0 | / | none"},
        {"http://h/x#f?a=b", "http | h | 0 | /x | none"},
        {"http://user:secret@h/", "http | h | 0 | / | none"},
        {"http://good.example@evil.example/", "http | evil.example | 0 | / | none"},
        {"http://[2001:DB8::1]:80/", "http | [2001:db8::1] | 80 | / | none"},
        {"file:///etc/x", "file |  | 0 | /etc/x | none"},
        {"x-app.2+b://open", "x-app.2+b | open | 0 | / | none"},
        {"http://h/a/../b%2Fc;d/", "http | h | 0 | /a/../b%2Fc;d/ | none"},
    };
    for (const auto& [text, parts] : cases) {
        const auto url = Url::parse(text);
        ASSERT_TRUE(url) << text;
        EXPECT_EQ(url->string(), text);
        EXPECT_EQ(fmt::format("{} | {} | {} | {} | {}", url->scheme(), url->host(), url->port().value_or(0),
                              url->path(), url->query().value_or("none")),
                  parts);
    }
}

TEST(Url, HostsInUnicodeBecomeTheirAsciiNames)
{
    const std::pair<std::string, std::string> cases[]{
        {"http://bücher.example/ü", "http://xn--bcher-kva.example/%C3%BC"},
        {"HTTPS://u@BÜCHER.example:1?ü#ü", "HTTPS://u@xn--bcher-kva.example:1?%C3%BC#%C3%BC"},
        {"http://b%C3%BCcher.example/", "http://xn--bcher-kva.example/"},
        {"http://straße.example", "http://xn--strae-oqa.example"},
        {"http://例え。テスト/", "http://xn--r8jz45g.xn--zckzah/"},
        {"http://１２７.０.０.１/", "http://127.0.0.1/"},
        {"http://Plain.example/", "http://Plain.example/"},
        {"http://under_score.example/", "http://under_score.example/"},
        {"http://h/ü@b/", "http://h/%C3%BC@b/"},
        {"http://\xff.example/", ""},
        {"http://evil.example℀.good.example/", ""},
        {"http://good.example＠evil.example/", ""},
        {"http://a\u200b\u200d.example/", ""},
        {"http://ü" + std::string(2000, 'x') + "/", ""},
    };
    for (const auto& [text, url] : cases) EXPECT_EQ(Url::parse(text).value_or(Url()).string(), url) << text;
}

TEST(Url, ReferencesAreResolved)
{
    const Url base = *Url::parse("https://u:p@h.example:8/a/b/c?q=1#f");
    const std::pair<std::string, std::string> cases[]{
        {"d", "https://u:p@h.example:8/a/b/d"},
        {"../d?x", "https://u:p@h.example:8/a/d?x"},
        {"/d", "https://u:p@h.example:8/d"},
        {"?r", "https://u:p@h.example:8/a/b/c?r"},
        {"//o.example/d", "https://o.example/d"},
        {"http://o.example", "http://o.example"},
        {"./ü d", "https://u:p@h.example:8/a/b/%C3%BC%20d"},
        {"//bücher.example/", "https://xn--bcher-kva.example/"},
        {"javascript:1", ""},
        {"http://[", ""},
        {"a:b/c", ""},
    };
    for (const auto& [reference, url] : cases)
        EXPECT_EQ(base.resolve(reference).value_or(Url()).string(), url) << reference;
}

TEST(Url, WhatAUrlCannotHoldIsEncodedOnce)
{
    const std::pair<std::string, std::string> cases[]{
        {"http://h/a b", "http://h/a%20b"},   {"http://h/ü?q=日", "http://h/%C3%BC?q=%E6%97%A5"},
        {"http://h/a%20b", "http://h/a%20b"}, {"http://h/%zz", "http://h/%25zz"},
        {"http://h/100%", "http://h/100%25"}, {"http://h/100%4", "http://h/100%254"},
        {"http://h/%%41", "http://h/%25%41"}, {"http://h/<\">^`{|}\\", "http://h/%3C%22%3E%5E%60%7B%7C%7D%5C"},
        {"http://h/\xff", "http://h/%FF"},    {"http://h/a+b;c'(d)*,~", "http://h/a+b;c'(d)*,~"},
    };
    for (const auto& [text, encoded] : cases) EXPECT_EQ(Url::parse(text).value_or(Url()).string(), encoded) << text;
}

TEST(PercentEncoding, KeepsWhatMayStay)
{
    const struct {
        std::string text, inQuery, inPath;
    } cases[]{
        {"azAZ09-._~", "azAZ09-._~", "azAZ09-._~"},
        {"a b", "a%20b", "a%20b"},
        {"c++", "c%2B%2B", "c%2B%2B"},
        {"a&b=c#d%e", "a%26b%3Dc%23d%25e", "a%26b%3Dc%23d%25e"},
        {"/?:@!$'()*,;", "/?:@!$'()*,;", "%2F%3F%3A%40%21%24%27%28%29%2A%2C%3B"},
        {"\"<>[]\\^`{|}", "%22%3C%3E%5B%5D%5C%5E%60%7B%7C%7D", "%22%3C%3E%5B%5D%5C%5E%60%7B%7C%7D"},
        {"ü日😀", "%C3%BC%E6%97%A5%F0%9F%98%80", "%C3%BC%E6%97%A5%F0%9F%98%80"},
        {std::string("\0\n\x7f\xff", 4), "%00%0A%7F%FF", "%00%0A%7F%FF"},
    };
    for (const auto& c : cases) {
        EXPECT_EQ(percentEncodeQueryComponent(c.text), c.inQuery);
        EXPECT_EQ(percentEncodePathSegment(c.text), c.inPath);
    }
}

TEST(PercentEncoding, InvalidEscapesStandForThemselves)
{
    const std::pair<std::string, std::string> cases[]{{"%", "%"},         {"a%4", "a%4"}, {"%zz", "%zz"},
                                                      {"%4z%41", "%4zA"}, {"%%41", "%A"}, {"%c3%BC", "ü"},
                                                      {"+", "+"},         {"%2B", "+"}};
    for (const auto& [text, decoded] : cases) EXPECT_EQ(percentDecode(text), decoded) << text;
}

TEST(UrlComponents, ItemsAreReadInOrder)
{
    const auto items = UrlComponents(*Url::parse("http://h/?a=1&&b=x%26y&a=2&c&d=&=e&f=g=h&i+j=k+l#z=1")).queryItems();
    std::string read;
    for (const auto& item : items) read += "[" + item.name + "]" + (item.value ? "=[" + *item.value + "]" : "") + " ";
    EXPECT_EQ(read, "[a]=[1] [b]=[x&y] [a]=[2] [c] [d]=[] []=[e] [f]=[g=h] [i+j]=[k+l] ");

    const Url url = *Url::parse("http://h/?a=1&a=2&b&c=%C3%BC+d");
    EXPECT_EQ(url.queryValue("a"), "1") << "the first";
    EXPECT_EQ(url.queryValue("b"), std::nullopt);
    EXPECT_EQ(url.queryValue("c"), "ü+d");
    EXPECT_EQ(url.queryValue("d"), std::nullopt);
}

TEST(UrlComponents, ItemsOfOursCannotBreakOutOfTheQuery)
{
    UrlComponents components(*Url::parse("http://h/p?old#f"));
    components.setQueryItems({{"q", "a&b=c#d"}, {"n=m", "c++ ü"}, {"bare"}, {"empty", ""}});
    EXPECT_EQ(components.url().string(), "http://h/p?q=a%26b%3Dc%23d&n%3Dm=c%2B%2B%20%C3%BC&bare&empty=#f");
    EXPECT_EQ(components.url().queryValue("q"), "a&b=c#d");
    EXPECT_EQ(components.url().queryValue("n=m"), "c++ ü");
    components.setQueryItems({});
    EXPECT_EQ(components.url().string(), "http://h/p#f");
}

} // namespace
} // namespace platform
