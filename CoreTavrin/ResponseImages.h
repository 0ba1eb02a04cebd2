#pragma once

#include <functional>
#include <set>
#include <string>
#include <string_view>
#include <vector>

#include "platform/net/Url.h"
#include "platform/values/Value.h"

/// Finds the images in an answer of the service: for the daemon, which fetches them ahead, and for clients, which ask
/// for them. Pure functions, any thread. Answers may have any shape: deep or long ones take no more stack.
///
/// An image description is a dictionary with an optional "url" (an absolute URL) and an optional "id" (an identifier,
/// which the bag turns into a URL). The key that it stands under is its role.
namespace tavrin {

class TAVBag;

/// The keys under which image descriptions stand: 19 of them.
[[nodiscard]] const std::set<std::string_view>& imageRoleKeys();

/// Calls back for each image description in `object`, in the order of the text: for a dictionary under one of `keys`,
/// and for each element, of any type, of an array under one. These are not searched further. A value of another type
/// under one of `keys` is ignored; values under other keys are searched.
void enumerateImagesInResponse(const platform::Value& object,
                               const std::function<void(const platform::Value& image)>& callback,
                               const std::set<std::string_view>& keys = imageRoleKeys());

/// The images of an answer, in order, as dictionaries of the "url" and "id" of each that has one of them:
/// `TAVEndpointXPC::loadImages` takes these.
[[nodiscard]] platform::Value::Array collectResponseImageIdentifiers(const platform::Value& response);

/// URLs of images, in the order in which to fetch them.
struct OrderedImages {
    std::set<std::string> hosts;          ///< of all URLs, including those seen before
    std::vector<platform::Url> primary;   ///< fetched first: each image's own URL, else the one made of its identifier
    std::vector<platform::Url> secondary; ///< fetched then: URLs made of the identifiers of images with a URL
};

/// Adds the URLs of one image description. A URL in `seen` is skipped, others are added to `seen`; if `seen` is null,
/// nothing is skipped. Ignores URLs without a host, and an `image` that isn't a dictionary.
void collectOrderedImages(const TAVBag& bag, const platform::Value& image, std::set<std::string>* seen,
                          OrderedImages& images);

} // namespace tavrin
