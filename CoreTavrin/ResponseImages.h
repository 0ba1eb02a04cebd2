#pragma once

#include <functional>
#include <set>
#include <string>
#include <string_view>
#include <vector>

#include "platform/net/Url.h"
#include "platform/values/Value.h"

/// Which images an answer of the service names, and where they are; for the daemon, which fetches them ahead, and for
/// clients, which ask for them. Pure functions, for answers of any shape: neither depth nor number costs stack.
///
/// An image description is a dictionary with an optional "url" (an absolute URL) and an optional "id" (an identifier,
/// which the bag turns into a URL). It stands under a key that tells its role.
namespace tavrin {

class TAVBag;

/// The keys under which image descriptions stand: 19 of them.
[[nodiscard]] const std::set<std::string_view>& imageRoleKeys();

/// Calls back for each image description anywhere in `object`, in the order of the text: for a dictionary under one of
/// the keys, and for each element of an array there, whatever it is. Neither is looked into any further. Anything else
/// under such a key is ignored; what is under other keys is searched.
void enumerateImagesInResponse(const platform::Value& object,
                               const std::function<void(const platform::Value& image)>& callback,
                               const std::set<std::string_view>& keys = imageRoleKeys());

/// What identifies the images of an answer, in order: dictionaries with the "url" and "id" of each that has one. This
/// is what `TAVEndpointXPC::loadImages` takes.
[[nodiscard]] platform::Value::Array collectResponseImageIdentifiers(const platform::Value& response);

/// Where images are, in the order in which they are to be fetched.
struct OrderedImages {
    std::set<std::string> hosts;          ///< of all URLs, those seen before included
    std::vector<platform::Url> primary;   ///< first: the URLs that images have themselves, and those of images without
    std::vector<platform::Url> secondary; ///< then: where else images with a URL are, by their identifiers
};

/// Adds where one image is. A URL that is in `seen` is not added again, one that is added becomes part of it; null
/// takes every URL. Anything but a dictionary is ignored, and so are URLs without a host.
void collectOrderedImages(const TAVBag& bag, const platform::Value& image, std::set<std::string>* seen,
                          OrderedImages& images);

} // namespace tavrin
