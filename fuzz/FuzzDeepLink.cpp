#include <algorithm>
#include <set>

#include "fuzz/Check.h"
#include "platform/text/Text.h"
#include "tavrind/DeepLinks.h"

namespace {

using namespace tavrin;

std::string normalized(std::string_view link)
{
    const auto components = deepLinkComponents(link);
    return components ? tavrin_normalizedURLStringForDeepLinkIngest(*components) : "";
}

/// Characters that may be in what is recorded.
bool isPlain(char c)
{
    return c > ' ' && c < 0x7f && !std::string_view("?#\"<>\\^`{|}").contains(c);
}

} // namespace

/// The input is a link. Where it leads doesn't depend on what isn't recorded of it, and is told in one way.
void runInput(std::string_view input)
{
    const auto components = deepLinkComponents(input);
    if (components) {
        const std::string text = normalized(input);
        check(std::ranges::all_of(text, isPlain) && !text.ends_with('/'), text);
        check(std::ranges::none_of(components->host, [](char c) { return c == '/' || c == '@'; }), components->host);

        const std::string_view place = input.substr(0, input.find_first_of("?#"));
        check(normalized(std::string(place) + "?q=1#f") == text, text);
        const std::string_view rest = place.substr(place.find(':') + 1);
        if (rest.starts_with("//")) {
            check(normalized("other://user:word@" + std::string(rest.substr(2))) == text, text);
            // What comes out goes in again, but for a second "www.".
            if (!text.starts_with('/') && !text.starts_with("www.")) check(normalized("https://" + text) == text, text);
        }
    }

    const std::string text(input);
    const auto filtered = DeepLinks::_normalizeAndFilterDeepLinks({{"App", {text}}, {"Other", {text}}}, {}, {"app"});
    check(filtered.submission.at("other") == std::set<std::string>{"other"});
    check(filtered.submission.contains("app") == (filtered.urls == 1));
    if (filtered.urls == 1) {
        const std::string& recorded = *filtered.submission.at("app").begin();
        check(!recorded.empty() && recorded == platform::lowerCased(recorded), recorded);
        check(DeepLinks::_normalizeAndFilterDeepLinks({{"app", {text}}}, {recorded}, {"app"}).whitelistedButDenied ==
              1);
    }
}
