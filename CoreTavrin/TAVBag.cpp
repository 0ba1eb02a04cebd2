#include "CoreTavrin/TAVBag.h"

#include <algorithm>
#include <cmath>
#include <tuple>

#include <fmt/format.h>

#include "CoreTavrin/ClientVocabulary.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Json.h"

namespace tavrin {

using platform::Url;
using platform::Value;

const std::vector<std::string_view> kTAVResourceIdentifiers{
    "TAVAutofillTLDWhitelist",  kTAVInstalledAppWhitelist, "TAVQIFeatures",    "TAVWebsiteCategoryLabels",
    kTAVLookupHintsWeekly,      kTAVLookupHintsMonthly,    "TAVVistrelModels", "TAVCorrectionDict",
    kTAVCrowdsourcingBlacklist, kTAVCrowdsourcingWhitelist};

namespace {

// The types of keys. Each reads a value of its type, and returns nothing for any other value.

struct Text {
    static constexpr std::string_view kExpected = "a string or a number";
    static std::optional<std::string> read(const Value& value)
    {
        if (const std::string* text = value.asString()) return *text;
        return value.isNumber() ? std::optional(platform::toJson(value)) : std::nullopt;
    }
};

struct Switch {
    static constexpr std::string_view kExpected = "true or false";
    static std::optional<bool> read(const Value& value) { return value.asBool(); }
};

struct Count {
    static constexpr std::string_view kExpected = "a whole number of 0 or more";
    static std::optional<std::uint64_t> read(const Value& value) { return value.asUInt(); }
};

struct Seconds {
    static constexpr std::string_view kExpected = "a number of seconds above 0";
    static std::optional<double> read(const Value& value)
    {
        const auto seconds = value.asDouble();
        return seconds && std::isfinite(*seconds) && *seconds > 0 ? seconds : std::nullopt;
    }
};

struct HttpUrl {
    static constexpr std::string_view kExpected = "an http or https URL";
    static std::optional<Url> read(const Value& value)
    {
        const std::string* text = value.asString();
        auto url = text ? Url::parse(*text) : std::nullopt;
        if (!url || url->host().empty()) return std::nullopt;
        const std::string scheme = url->scheme();
        return scheme == "http" || scheme == "https" ? url : std::nullopt;
    }
};

struct UrlTemplate {
    static constexpr std::string_view kExpected = "a URL with {id} or {query} in it";
    static std::optional<std::string> read(const Value& value)
    {
        const std::string* text = value.asString();
        return text ? std::optional(*text) : std::nullopt;
    }
};

struct Texts {
    static constexpr std::string_view kExpected = "an array of strings";
    static std::optional<std::vector<std::string>> read(const Value& value)
    {
        const Value::Array* array = value.asArray();
        if (!array) return std::nullopt;
        std::vector<std::string> result;
        for (const Value& element : *array)
            if (const std::string* text = element.asString()) result.push_back(*text);
        return result;
    }
};

struct ViewsByClient {
    static constexpr std::string_view kExpected = "a dictionary by client name";
    static std::optional<Value> read(const Value& value)
    {
        return value.asDictionary() ? std::optional(value) : std::nullopt;
    }
};

/// A key and its type.
template <class T> struct Key {
    using Type = T;
    std::string_view name;
    [[nodiscard]] constexpr TAVBag::KnownKey known() const
    {
        return {name, Type::kExpected, [](const Value& value) { return Type::read(value).has_value(); }};
    }
};

/// Every key of the bag except those of the downloadable resources (`kTAVResourceIdentifiers`).
constexpr std::tuple kKeys{
    Key<Text>{"version"},
    Key<Switch>{"isEnabled"},
    Key<Switch>{"feedbackEnabled"},
    Key<Count>{"minimumQueryLength"},
    Key<Seconds>{"timeoutIntervalForRequest"},
    Key<HttpUrl>{"searchURL"},
    Key<HttpUrl>{"warmURL"},
    Key<HttpUrl>{"flightURL"},
    Key<HttpUrl>{"feedbackURL"},
    Key<HttpUrl>{"crowdsourcingURL"},
    Key<UrlTemplate>{"imageURL"},
    Key<UrlTemplate>{"searchPageURL"}, // only clients read it
    Key<Switch>{"sendGeoEnvironmentHeader"},
    Key<Texts>{"supportedGeoLocationSources"},
    Key<Switch>{"hashtagImagesVisible"},
    Key<Texts>{"subscriptionProviderDomainWhitelist"},
    Key<Texts>{"subscriptionProviderBundleIdentifierWhitelist"},
    Key<Seconds>{"subscriptionTTL"},
    Key<ViewsByClient>{"clients"},
};

/// A key's name as a template argument.
template <std::size_t Size> struct Name {
    consteval Name(const char (&name)[Size]) { std::ranges::copy(name, text); }
    char text[Size];
};

consteval std::size_t rowOf(std::string_view name)
{
    std::size_t row = 0;
    std::apply([&](const auto&... key) { (void)((key.name == name || (++row, false)) || ...); }, kKeys);
    return row;
}

/// The key of this name. An unknown name does not compile.
template <Name name> constexpr const auto& kKey = std::get<rowOf(name.text)>(kKeys);

void findProblems(const Value& view, const std::string& where, std::vector<std::string>& problems)
{
    for (const TAVBag::KnownKey& key : TAVBag::knownKeys()) {
        const Value& value = view[key.name];
        if (!value.isNull() && !key.accepts(value))
            problems.push_back(fmt::format("{}{}: expected {}", where, key.name, key.expected));
    }
}

} // namespace

const std::vector<TAVBag::KnownKey>& TAVBag::knownKeys()
{
    static const std::vector<KnownKey> all = [] {
        auto keys = std::apply([](const auto&... key) { return std::vector{key.known()...}; }, kKeys);
        for (std::string_view resource : kTAVResourceIdentifiers) keys.push_back(Key<HttpUrl>{resource}.known());
        return keys;
    }();
    return all;
}

TAVBag::TAVBag(Value rawBag, std::string userAgent) : _rawBag(std::move(rawBag)), _userAgent(std::move(userAgent))
{
    if (!_rawBag.asDictionary()) _rawBag = platform::Dictionary();
    if (const auto name = extractClientNameFromString(_userAgent)) _clientView = _rawBag[kKey<"clients">.name][*name];
}

template <class Key> auto TAVBag::read(const Key& key) const
{
    const Value& overriding = _clientView[key.name];
    return Key::Type::read(overriding.isNull() ? _rawBag[key.name] : overriding);
}

std::string TAVBag::version() const
{
    return read(kKey<"version">).value_or("");
}
bool TAVBag::isEnabled() const
{
    return read(kKey<"isEnabled">).value_or(true);
}
bool TAVBag::feedbackEnabled() const
{
    return read(kKey<"feedbackEnabled">).value_or(true);
}
std::uint64_t TAVBag::minimumQueryLength() const
{
    return read(kKey<"minimumQueryLength">).value_or(1);
}
std::optional<double> TAVBag::timeoutIntervalForRequest() const
{
    return read(kKey<"timeoutIntervalForRequest">);
}
std::optional<Url> TAVBag::searchURL() const
{
    return read(kKey<"searchURL">);
}
std::optional<Url> TAVBag::warmURL() const
{
    return read(kKey<"warmURL">);
}
std::optional<Url> TAVBag::flightURL() const
{
    return read(kKey<"flightURL">);
}
std::optional<Url> TAVBag::feedbackURL() const
{
    return read(kKey<"feedbackURL">);
}
std::optional<Url> TAVBag::crowdsourcingURL() const
{
    return read(kKey<"crowdsourcingURL">);
}
std::optional<Url> TAVBag::resourceURL(std::string_view identifier) const
{
    return read(Key<HttpUrl>{identifier});
}
bool TAVBag::sendGeoEnvironmentHeader() const
{
    return read(kKey<"sendGeoEnvironmentHeader">).value_or(false);
}
std::optional<bool> TAVBag::hashtagImagesVisible() const
{
    return read(kKey<"hashtagImagesVisible">);
}
double TAVBag::subscriptionTTL() const
{
    return read(kKey<"subscriptionTTL">).value_or(86400);
}
std::vector<std::string> TAVBag::supportedGeoLocationSources() const
{
    return read(kKey<"supportedGeoLocationSources">).value_or(std::vector<std::string>());
}
std::optional<std::vector<std::string>> TAVBag::subscriptionProviderDomainWhitelist() const
{
    return read(kKey<"subscriptionProviderDomainWhitelist">);
}
std::optional<std::vector<std::string>> TAVBag::subscriptionProviderBundleIdentifierWhitelist() const
{
    return read(kKey<"subscriptionProviderBundleIdentifierWhitelist">);
}

std::optional<std::string> TAVBag::imageURL() const
{
    return read(kKey<"imageURL">);
}

std::optional<Url> TAVBag::urlForIdentifier(std::string_view identifier) const
{
    static constexpr std::string_view kPlaceholder = "{id}";
    auto text = imageURL();
    const std::size_t at = text ? text->find(kPlaceholder) : std::string::npos;
    if (at == std::string::npos) return std::nullopt;
    text->replace(at, kPlaceholder.size(), platform::percentEncodePathSegment(identifier));
    return HttpUrl::read(Value(std::move(*text)));
}

std::vector<std::string> TAVBag::problems() const
{
    std::vector<std::string> problems;
    findProblems(_rawBag, "", problems);
    if (const platform::Dictionary* clients = _rawBag[kKey<"clients">.name].asDictionary()) {
        for (const auto& [name, view] : *clients) {
            if (view.asDictionary())
                findProblems(view, fmt::format("clients.{}.", name), problems);
            else
                problems.push_back(fmt::format("clients.{}: expected a dictionary", name));
        }
    }
    return problems;
}

TAVBagRecord::TAVBagRecord(const TAVBag& bag) : rawBag(platform::toJson(bag.rawBag())), userAgent(bag.userAgent()) {}

std::shared_ptr<const TAVBag> TAVBagRecord::bag() const
{
    auto raw = platform::parseJson(rawBag.view());
    if (!raw || !raw->asDictionary()) return nullptr;
    return std::make_shared<const TAVBag>(std::move(*raw), userAgent);
}

} // namespace tavrin
