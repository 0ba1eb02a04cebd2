#include "tavrind/DownloadResource.h"

#include <algorithm>
#include <vector>

#include "CoreTavrin/TAVBag.h"
#include "platform/values/Dictionary.h"
#include "tavrind/TavrinLogging.h"

namespace tavrin {

using platform::Url;
using platform::Value;

namespace {

constexpr const char* kUrl = "url";
constexpr const char* kRedirectUrl = "redirect_url";

std::optional<Url> urlIn(const Value& value)
{
    return value.asString() ? Url::parse(*value.asString()) : std::nullopt;
}

} // namespace

Value valueOf(const DownloadResources& resources)
{
    platform::Dictionary table;
    for (const auto& [identifier, resource] : resources) {
        platform::Dictionary entry;
        if (resource.url) entry.set(kUrl, resource.url->string());
        if (resource.redirectUrl) entry.set(kRedirectUrl, resource.redirectUrl->string());
        table.set(identifier, std::move(entry));
    }
    return table;
}

DownloadResources resourcesIn(const Value& value)
{
    DownloadResources resources;
    if (const platform::Dictionary* table = value.asDictionary())
        for (const auto& [identifier, entry] : *table)
            if (isResource(identifier) && entry.asDictionary())
                resources[identifier] = {identifier, urlIn(entry[kUrl]), urlIn(entry[kRedirectUrl])};
    return resources;
}

bool isResource(std::string_view identifier)
{
    return std::ranges::find(kTAVResourceIdentifiers, identifier) != kTAVResourceIdentifiers.end();
}

bool isLookupResource(std::string_view identifier)
{
    return identifier == kTAVLookupHintsWeekly || identifier == kTAVLookupHintsMonthly;
}

std::optional<std::string> signatureFromURL(const Url& url)
{
    const std::string path = url.path();
    std::vector<std::string_view> elements;
    for (std::size_t begin = 0; begin <= path.size();) {
        const std::size_t end = std::min(path.find('/', begin), path.size());
        elements.push_back(std::string_view(path).substr(begin, end - begin));
        begin = end + 1;
    }
    if (elements.size() <= 4) {
        log(kLogLookUp).error("invalid lookup hints url when processing signature: {}", url.string());
        return std::nullopt;
    }
    return fmt::format("{}-{}-{}", elements[3], elements[4], elements[2]);
}

std::optional<std::string_view> downloadReason(const DownloadResource& resource, const Url& url, bool fileExists)
{
    if (resource.url != url) return "update";
    if (!fileExists) return "missing";
    if (isLookupResource(resource.identifier)) return "lookup";
    return std::nullopt;
}

} // namespace tavrin
