#include "tools/devserver/Resources.h"

#include <algorithm>

#include <fmt/format.h>
#include <fmt/ranges.h>

#include "CoreTavrin/TAVBag.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Json.h"
#include "tools/devserver/Catalogue.h"

namespace devserver {

using platform::Value;

namespace {

/// Returns bundle identifiers with their encoding ids. The inner document is JSON text in a string of the outer one.
std::string appAllowList(std::string_view version)
{
    platform::Dictionary apps;
    int encodingId = 0;
    for (const Section& section : sections())
        apps.set(std::string(section.bundleIdentifier),
                 Value::Array{Value::dictionaryOf({{"encoding_id", encodingId++}})});
    for (const char* installed : {"org.gnome.Terminal", "org.kde.konsole", "firefox-esr", "libreoffice-writer", "vim"})
        apps.set(installed, Value::Array{Value::dictionaryOf({{"encoding_id", encodingId++}})});
    const Value inner =
        Value::dictionaryOf({{"version", fmt::format("{:0>4}", version)}, {"apps", Value(std::move(apps))}});
    return platform::toJson(
        Value::dictionaryOf({{"apps", platform::toJson(inner)}, {"compression", "RLE"}, {"encoding", "bitmap"}}));
}

std::string wordList(std::string_view name, std::string_view version)
{
    Value::Array words;
    for (const Section& section : sections()) words.push_back(section.host);
    return platform::toJson(
        Value::dictionaryOf({{"resource", name}, {"version", version}, {"entries", std::move(words)}}));
}

/// Versions go into file contents and headers, so only short strings of digits are valid.
bool isVersion(std::string_view text)
{
    return !text.empty() && text.size() <= 4 && std::ranges::all_of(text, [](char c) { return c >= '0' && c <= '9'; });
}

Answer file(std::string_view name, std::string_view version, const std::string& tag, const Request& request)
{
    const std::string quoted = '"' + tag + '"';
    Answer answer;
    answer.headers = {{"ETag", quoted}, {"Cache-Control", "max-age=300"}};
    const std::string* atHand = findHeader(request.headers, "If-None-Match");
    if (atHand && (*atHand == tag || *atHand == quoted)) {
        answer.status = 304;
        return answer;
    }
    answer.body = name == "TAVInstalledAppWhitelist" ? appAllowList(version) : wordList(name, version);
    return answer;
}

} // namespace

const std::vector<std::string_view>& resourceNames()
{
    return tavrin::kTAVResourceIdentifiers;
}

std::string resourceUrl(std::string_view base, std::string_view name, std::int64_t version)
{
    return fmt::format("{}/resources/{}?version={}", base, name, version);
}

Answer resourceAnswer(std::string_view base, std::string_view path, const Request& request)
{
    const auto known = [](std::string_view name) {
        return std::ranges::find(resourceNames(), name) != resourceNames().end();
    };
    const bool hints = path.starts_with("TAVLookupHints");
    if (known(path)) {
        const std::string version = request.item("version").value_or("1");
        if (!isVersion(version)) return errorAnswer(400, "the version is one to four digits");
        if (!hints) return file(path, version, version, request);
        Answer answer{.status = 302};
        answer.headers.emplace_back("Location", fmt::format("{0}/resources/hints/{1}/{2}", base, version, path));
        return answer;
    }
    // Clients derive the version "VERSION-NAME-hints" from the path hints/VERSION/NAME.
    if (path.starts_with("hints/")) {
        const std::string_view rest = path.substr(6);
        const std::string_view version = rest.substr(0, rest.find('/'));
        const std::string_view name = rest.substr(std::min(rest.size(), version.size() + 1));
        if (isVersion(version) && name.starts_with("TAVLookupHints") && known(name))
            return file(name, version, fmt::format("{}-{}-hints", version, name), request);
    }
    return errorAnswer(404, fmt::format("no resource of that name; there are {}", fmt::join(resourceNames(), ", ")));
}

} // namespace devserver
