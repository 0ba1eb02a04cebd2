#include "CoreTavrin/TAVBag.h"

#include <cmath>

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

enum class Kind { Text, Switch, Count, Seconds, UrlText, Template, Texts, Clients };

struct Key {
    std::string_view name;
    Kind kind;
};

const std::vector<Key>& knownKeys()
{
    static const std::vector<Key> keys = [] {
        std::vector<Key> all{{"version", Kind::Text},
                             {"isEnabled", Kind::Switch},
                             {"feedbackEnabled", Kind::Switch},
                             {"minimumQueryLength", Kind::Count},
                             {"timeoutIntervalForRequest", Kind::Seconds},
                             {"searchURL", Kind::UrlText},
                             {"warmURL", Kind::UrlText},
                             {"flightURL", Kind::UrlText},
                             {"feedbackURL", Kind::UrlText},
                             {"crowdsourcingURL", Kind::UrlText},
                             {"imageURL", Kind::Template},
                             {"sendGeoEnvironmentHeader", Kind::Switch},
                             {"supportedGeoLocationSources", Kind::Texts},
                             {"hashtagImagesVisible", Kind::Switch},
                             {"subscriptionProviderDomainWhitelist", Kind::Texts},
                             {"subscriptionProviderBundleIdentifierWhitelist", Kind::Texts},
                             {"subscriptionTTL", Kind::Seconds},
                             {"clients", Kind::Clients}};
        for (std::string_view resource : kTAVResourceIdentifiers) all.push_back({resource, Kind::UrlText});
        return all;
    }();
    return keys;
}

std::optional<double> secondsIn(const Value& value)
{
    const auto seconds = value.asDouble();
    return seconds && std::isfinite(*seconds) && *seconds > 0 ? seconds : std::nullopt;
}

std::optional<Url> httpUrlIn(const Value& value)
{
    const std::string* text = value.asString();
    auto url = text ? Url::parse(*text) : std::nullopt;
    if (!url || url->host().empty()) return std::nullopt;
    const std::string scheme = url->scheme();
    return scheme == "http" || scheme == "https" ? url : std::nullopt;
}

std::optional<std::vector<std::string>> stringsIn(const Value& value)
{
    const Value::Array* array = value.asArray();
    if (!array) return std::nullopt;
    std::vector<std::string> result;
    for (const Value& element : *array)
        if (const std::string* text = element.asString()) result.push_back(*text);
    return result;
}

const char* expectation(Kind kind, const Value& value)
{
    switch (kind) {
    case Kind::Text: return value.asString() || value.isNumber() ? nullptr : "a string or a number";
    case Kind::Switch: return value.asBool() ? nullptr : "true or false";
    case Kind::Count: return value.asUInt() ? nullptr : "a whole number of 0 or more";
    case Kind::Seconds: return secondsIn(value) ? nullptr : "a number of seconds above 0";
    case Kind::UrlText: return httpUrlIn(value) ? nullptr : "an http or https URL";
    case Kind::Template: return value.asString() ? nullptr : "a URL with {id} in it";
    case Kind::Texts: return stringsIn(value) ? nullptr : "an array of strings";
    case Kind::Clients: return value.asDictionary() ? nullptr : "a dictionary by client name";
    }
    return nullptr;
}

void findProblems(const Value& view, const std::string& where, std::vector<std::string>& problems)
{
    for (const Key& key : knownKeys()) {
        const Value& value = view[key.name];
        if (value.isNull()) continue;
        if (const char* expected = expectation(key.kind, value))
            problems.push_back(fmt::format("{}{}: expected {}", where, key.name, expected));
    }
}

} // namespace

TAVBag::TAVBag(Value rawBag, std::string userAgent) : _rawBag(std::move(rawBag)), _userAgent(std::move(userAgent))
{
    if (!_rawBag.asDictionary()) _rawBag = platform::Dictionary();
    if (const auto name = extractClientNameFromString(_userAgent)) _clientView = _rawBag["clients"][*name];
}

const Value& TAVBag::get(std::string_view key) const
{
    const Value& overriding = _clientView[key];
    return overriding.isNull() ? _rawBag[key] : overriding;
}

std::optional<Url> TAVBag::url(std::string_view key) const
{
    return httpUrlIn(get(key));
}

bool TAVBag::boolean(std::string_view key, bool fallback) const
{
    return get(key).asBool().value_or(fallback);
}

std::optional<std::vector<std::string>> TAVBag::strings(std::string_view key) const
{
    return stringsIn(get(key));
}

std::string TAVBag::version() const
{
    const Value& value = get("version");
    if (const std::string* text = value.asString()) return *text;
    return value.isNumber() ? platform::toJson(value) : std::string();
}

bool TAVBag::isEnabled() const
{
    return boolean("isEnabled", true);
}
bool TAVBag::feedbackEnabled() const
{
    return boolean("feedbackEnabled", true);
}
std::uint64_t TAVBag::minimumQueryLength() const
{
    return get("minimumQueryLength").asUInt().value_or(1);
}
std::optional<double> TAVBag::timeoutIntervalForRequest() const
{
    return secondsIn(get("timeoutIntervalForRequest"));
}
std::optional<Url> TAVBag::searchURL() const
{
    return url("searchURL");
}
std::optional<Url> TAVBag::warmURL() const
{
    return url("warmURL");
}
std::optional<Url> TAVBag::flightURL() const
{
    return url("flightURL");
}
std::optional<Url> TAVBag::feedbackURL() const
{
    return url("feedbackURL");
}
std::optional<Url> TAVBag::crowdsourcingURL() const
{
    return url("crowdsourcingURL");
}
std::optional<Url> TAVBag::resourceURL(std::string_view identifier) const
{
    return url(identifier);
}
bool TAVBag::sendGeoEnvironmentHeader() const
{
    return boolean("sendGeoEnvironmentHeader", false);
}
std::optional<bool> TAVBag::hashtagImagesVisible() const
{
    return get("hashtagImagesVisible").asBool();
}
double TAVBag::subscriptionTTL() const
{
    return secondsIn(get("subscriptionTTL")).value_or(86400);
}

std::vector<std::string> TAVBag::supportedGeoLocationSources() const
{
    return strings("supportedGeoLocationSources").value_or(std::vector<std::string>());
}

std::optional<std::vector<std::string>> TAVBag::subscriptionProviderDomainWhitelist() const
{
    return strings("subscriptionProviderDomainWhitelist");
}

std::optional<std::vector<std::string>> TAVBag::subscriptionProviderBundleIdentifierWhitelist() const
{
    return strings("subscriptionProviderBundleIdentifierWhitelist");
}

std::optional<Url> TAVBag::urlForIdentifier(std::string_view identifier) const
{
    static constexpr std::string_view kPlaceholder = "{id}";
    const std::string* pattern = get("imageURL").asString();
    const std::size_t at = pattern ? pattern->find(kPlaceholder) : std::string::npos;
    if (at == std::string::npos) return std::nullopt;
    std::string text = *pattern;
    text.replace(at, kPlaceholder.size(), platform::percentEncodePathSegment(identifier));
    return httpUrlIn(Value(std::move(text)));
}

std::vector<std::string> TAVBag::problems() const
{
    std::vector<std::string> problems;
    findProblems(_rawBag, "", problems);
    if (const platform::Dictionary* clients = _rawBag["clients"].asDictionary()) {
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
