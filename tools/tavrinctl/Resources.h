#pragma once

#include <string>

#include "CoreTavrin/TAVClient.h"
#include "platform/values/Dictionary.h"

namespace tavrin::ctl {

/// Whether the file of a resource is to be had, and if not, why and what to do about it. `bag` is the bag of this
/// client. Empty for a file that is there.
[[nodiscard]] std::string whyNotThere(const std::string& identifier, const TAVResourceAnswer& answer,
                                      const TAVBagAnswer& bag);

/// {"identifier", "size", "modified", "created"} of a file that is there, else {"identifier", "error"}.
[[nodiscard]] platform::Dictionary describe(const std::string& identifier, const TAVResourceAnswer& answer,
                                            const TAVBagAnswer& bag);

/// Copies a file to a descriptor, from its start. A `Failure` where it can't be read or written; on a terminal also
/// where it has characters that would drive that.
void copyResource(const platform::FileHandle& file, int output, bool terminal);

} // namespace tavrin::ctl
