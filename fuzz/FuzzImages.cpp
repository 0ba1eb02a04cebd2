#include <string>

#include "CoreTavrin/ResponseImages.h"
#include "CoreTavrin/TAVBag.h"
#include "fuzz/Check.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Json.h"

using platform::Value;

namespace {

/// The same rules in the shortest form: JSON is no deeper than recursion bears.
std::size_t imagesIn(const Value& object)
{
    std::size_t count = 0;
    if (const Value::Array* array = object.asArray())
        for (const Value& element : *array) count += imagesIn(element);
    if (const platform::Dictionary* dictionary = object.asDictionary())
        for (const auto& [key, value] : *dictionary)
            count += !tavrin::imageRoleKeys().contains(key) ? imagesIn(value)
                     : value.asDictionary()                 ? 1
                     : value.asArray()                      ? value.count()
                                                            : 0;
    return count;
}

} // namespace

/// The input is a decoded answer's JSON. Every image is found once; each contributes two URLs at most, none twice, and
/// all of hosts that are listed.
void runInput(std::string_view input)
{
    const auto document = platform::JsonDocument::parse(input);
    if (!document) return;
    const platform::JsonView response = document->root();
    static const tavrin::TAVBag bag(Value::dictionaryOf({{"imageURL", "https://images.example/{id}?size=1"}}),
                                    "Fuzz/1");

    std::size_t count = 0;
    std::set<std::string> seen;
    tavrin::OrderedImages images, unseen;
    tavrin::enumerateImagesInResponse(response, [&](platform::JsonView view) {
        const Value image = view.value();
        ++count;
        tavrin::collectOrderedImages(bag, image, &seen, images);
        tavrin::collectOrderedImages(bag, image, nullptr, unseen);
    });
    check(count == imagesIn(response.value()));
    check(seen.size() == images.primary.size() + images.secondary.size());
    check(unseen.primary.size() + unseen.secondary.size() <= 2 * count);
    check(unseen.hosts == images.hosts);
    for (const auto* list : {&images.primary, &images.secondary})
        for (const platform::Url& url : *list) check(seen.contains(url.string()) && images.hosts.contains(url.host()));
    check(tavrin::collectResponseImageIdentifiers(response).size() <= count);
}
