#include <algorithm>
#include <cmath>

#include "CoreTavrin/TAVBag.h"
#include "fuzz/Check.h"
#include "platform/values/Json.h"

using namespace tavrin;

namespace {

void checkUrl(const std::optional<platform::Url>& url)
{
    if (!url) return;
    check(url->scheme() == "http" || url->scheme() == "https", url->string());
    check(!url->host().empty() && platform::Url::parse(url->string()) == url, url->string());
}

void checkRanges(const TAVBag& bag)
{
    for (const auto& url : {bag.searchURL(), bag.warmURL(), bag.flightURL(), bag.feedbackURL(), bag.crowdsourcingURL(),
                            bag.urlForIdentifier("a/../b?c=d#{id}")})
        checkUrl(url);
    for (const std::string_view resource : kTAVResourceIdentifiers) checkUrl(bag.resourceURL(resource));
    if (const auto timeout = bag.timeoutIntervalForRequest()) check(std::isfinite(*timeout) && *timeout > 0);
    check(std::isfinite(bag.subscriptionTTL()) && bag.subscriptionTTL() > 0);
}

/// At the top level a key has an effect exactly if it is there and `problems` has nothing to say of it.
void checkProblems(const TAVBag& bag)
{
    const auto problems = bag.problems();
    const auto isGood = [&](std::string_view key) {
        const std::string prefix = std::string(key) + ": ";
        return !bag.rawBag()[key].isNull() &&
               std::ranges::none_of(problems, [&](const std::string& text) { return text.starts_with(prefix); });
    };
    check(bag.searchURL().has_value() == isGood("searchURL"));
    check(bag.feedbackURL().has_value() == isGood("feedbackURL"));
    check(bag.timeoutIntervalForRequest().has_value() == isGood("timeoutIntervalForRequest"));
    check(bag.hashtagImagesVisible().has_value() == isGood("hashtagImagesVisible"));
    check(bag.subscriptionProviderDomainWhitelist().has_value() == isGood("subscriptionProviderDomainWhitelist"));
    if (!isGood("version")) check(bag.version().empty(), bag.version());
    if (!isGood("isEnabled")) check(bag.isEnabled());
    if (!isGood("feedbackEnabled")) check(bag.feedbackEnabled());
    if (!isGood("minimumQueryLength")) check(bag.minimumQueryLength() == 1);
    if (!isGood("subscriptionTTL")) check(bag.subscriptionTTL() == 86400);
    if (!isGood("sendGeoEnvironmentHeader")) check(!bag.sendGeoEnvironmentHeader());
    if (!isGood("supportedGeoLocationSources")) check(bag.supportedGeoLocationSources().empty());
}

} // namespace

/// Any JSON document as a raw bag: its values are in range, wrong ones read as defaults and are named, and every
/// client's view survives the way over IPC.
void runInput(std::string_view input)
{
    const auto raw = platform::parseJson(input);
    if (!raw) return;
    checkProblems(TAVBag(*raw, ""));
    for (const char* userAgent : {"", "Vistrel/4.2", "news/1"}) {
        const TAVBag bag(*raw, userAgent);
        checkRanges(bag);
        const auto received = TAVBagRecord(bag).bag();
        check(received != nullptr, platform::toJson(*raw));
        check(platform::toJson(received->rawBag()) == platform::toJson(bag.rawBag()));
        check(received->searchURL() == bag.searchURL() && received->isEnabled() == bag.isEnabled());
        check(received->minimumQueryLength() == bag.minimumQueryLength() && received->version() == bag.version());
    }
}
