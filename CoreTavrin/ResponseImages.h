#pragma once

#include <functional>
#include <set>
#include <string>
#include <string_view>
#include <vector>

#include "platform/net/Url.h"
#include "platform/values/Json.h"
#include "platform/values/Value.h"

/// Finds the images that an answer of the service refers to. The daemon prefetches them, and clients request them. Pure
/// functions, any thread. Answers may have any shape: the stack needed does not grow with their depth or length.
///
/// An image description is a dictionary with an optional "url" (an absolute URL) and an optional "id" (an identifier
/// that the bag maps to a URL). The key of its entry is its role.
namespace tavrin {

class TAVBag;

/// Returns the 19 keys whose values are image descriptions.
[[nodiscard]] const std::set<std::string_view>& imageRoleKeys();

/// Calls back for each image description in `object`, in document order. A dictionary under one of `keys` is a
/// description. So is each element, of any type, of an array under one of `keys`. Descriptions are not searched
/// further. Other values under `keys` are ignored, and values under other keys are searched.
void enumerateImagesInResponse(platform::JsonView object, const std::function<void(platform::JsonView image)>& callback,
                               const std::set<std::string_view>& keys = imageRoleKeys());

/// Returns the "url" and "id" of each image in the answer that has one of them, in document order.
/// `TAVEndpointXPC::loadImages` accepts the result.
[[nodiscard]] platform::Value::Array collectResponseImageIdentifiers(platform::JsonView response);

/// URLs of images, in the order in which to fetch them.
struct OrderedImages {
    std::set<std::string> hosts;          ///< of all URLs, including those seen before
    std::vector<platform::Url> primary;   ///< fetched first: each image's own URL, or the one made from its identifier
    std::vector<platform::Url> secondary; ///< fetched next: URLs made from the identifiers of images with a URL
};

/// Adds the URLs of one image description to `images`. Skips URLs that are in `seen`, and adds the others to it; if
/// `seen` is null, skips none. Ignores URLs without a host, and an `image` that isn't a dictionary.
void collectOrderedImages(const TAVBag& bag, const platform::Value& image, std::set<std::string>* seen,
                          OrderedImages& images);

} // namespace tavrin
