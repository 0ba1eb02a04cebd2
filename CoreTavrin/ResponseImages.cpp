#include "CoreTavrin/ResponseImages.h"

#include "CoreTavrin/TAVBag.h"
#include "platform/values/Dictionary.h"

namespace tavrin {

using platform::Dictionary;
using platform::Url;
using platform::Value;

namespace {

/// An array or dictionary that is being searched, and the position of the search.
struct Level {
    const Value::Array* array;
    const Dictionary* dictionary;
    std::size_t next = 0;

    [[nodiscard]] std::size_t count() const { return array ? array->size() : dictionary->size(); }
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

void enumerateImagesInResponse(const Value& object, const std::function<void(const Value& image)>& callback,
                               const std::set<std::string_view>& keys)
{
    std::vector<Level> levels;
    const auto enter = [&levels](const Value& value) {
        if (value.count() > 0) levels.push_back({value.asArray(), value.asDictionary()});
    };
    enter(object);
    while (!levels.empty()) {
        Level& level = levels.back();
        if (level.next == level.count()) {
            levels.pop_back();
            continue;
        }
        const std::size_t index = level.next++;
        if (level.array) {
            enter((*level.array)[index]);
            continue;
        }
        const auto& [key, value] = level.dictionary->begin()[static_cast<std::ptrdiff_t>(index)];
        if (!keys.contains(key))
            enter(value);
        else if (value.asDictionary())
            callback(value);
        else if (const Value::Array* images = value.asArray())
            for (const Value& image : *images) callback(image);
    }
}

Value::Array collectResponseImageIdentifiers(const Value& response)
{
    Value::Array identifiers;
    enumerateImagesInResponse(response, [&](const Value& image) {
        Dictionary identifier;
        for (const char* key : {"url", "id"})
            if (image[key].asString()) identifier.set(key, image[key]);
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
