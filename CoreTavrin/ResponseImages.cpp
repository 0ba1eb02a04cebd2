#include "CoreTavrin/ResponseImages.h"

#include <optional>
#include <utility>

#include "CoreTavrin/TAVBag.h"
#include "platform/values/Dictionary.h"

namespace tavrin {

using platform::Dictionary;
using platform::JsonView;
using platform::Url;
using platform::Value;

namespace {

/// An array or dictionary that is being searched, and the position of the search. Scalars in it are no images.
struct Level {
    std::vector<std::pair<std::string_view, JsonView>> containers;
    bool hasKeys = false;
    std::size_t next = 0;
};

} // namespace

const std::set<std::string_view>& imageRoleKeys()
{
    static const std::set<std::string_view> keys{
        "thumbnail",   "image",           "image_overlay",     "value_image",  "secondary_image",
        "icon",        "completion_icon", "more_icons",        "base_icon",    "glyph",
        "rt_glyph",    "title_glyph",     "more_glyphs",       "more_glyphs1", "more_glyphs2",
        "play_button", "posters",         "attribution_glyph", "badge_image"};
    return keys;
}

void enumerateImagesInResponse(JsonView object, const std::function<void(JsonView image)>& callback,
                               const std::set<std::string_view>& keys)
{
    std::vector<Level> levels;
    const auto enter = [&levels](JsonView value) {
        if (auto containers = value.containers(); !containers.empty())
            levels.push_back({.containers = std::move(containers), .hasKeys = value.isDictionary()});
    };
    enter(object);
    while (!levels.empty()) {
        Level& level = levels.back();
        if (level.next == level.containers.size()) {
            levels.pop_back();
            continue;
        }
        const auto [key, value] = level.containers[level.next++];
        if (!level.hasKeys || !keys.contains(key))
            enter(value);
        else if (value.isDictionary())
            callback(value);
        else
            for (const JsonView image : value.elements()) callback(image);
    }
}

Value::Array collectResponseImageIdentifiers(JsonView response)
{
    Value::Array identifiers;
    enumerateImagesInResponse(response, [&](JsonView image) {
        Dictionary identifier;
        for (const char* key : {"url", "id"})
            if (const auto text = image[key].asString()) identifier.set(key, *text);
        if (!identifier.empty()) identifiers.emplace_back(std::move(identifier));
    });
    return identifiers;
}

void collectOrderedImages(const TAVBag& bag, const Value& image, std::set<std::string>* seen, OrderedImages& images)
{
    const auto add = [&](const std::optional<Url>& url, std::vector<Url>& list) {
        if (!url || url->host().empty()) return;
        images.hosts.insert(url->host());
        if (!seen || seen->insert(url->string()).second) list.push_back(*url);
    };
    const std::string* url = image["url"].asString();
    if (url) add(Url::parse(*url), images.primary);
    if (const std::string* identifier = image["id"].asString())
        add(bag.urlForIdentifier(*identifier), url ? images.secondary : images.primary);
}

} // namespace tavrin
