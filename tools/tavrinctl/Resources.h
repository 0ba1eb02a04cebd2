#pragma once

#include <string>

#include "CoreTavrin/TAVClient.h"
#include "platform/values/Dictionary.h"

namespace tavrin::ctl {

/// Explains why a resource has no file, and what to do about it. Returns an empty string if it has one. `bag` is this
/// client's bag.
[[nodiscard]] std::string whyNotThere(const std::string& identifier, const TAVResourceAnswer& answer,
                                      const TAVBagAnswer& bag);

/// Returns {"identifier", "size", "modified", "created"}, or {"identifier", "error"} if there is no file.
[[nodiscard]] platform::Dictionary describe(const std::string& identifier, const TAVResourceAnswer& answer,
                                            const TAVBagAnswer& bag);

/// Copies a file from its start to a descriptor. Throws `Failure` if reading or writing fails, or if `terminal` is set
/// and the file has control characters.
void copyResource(const platform::FileHandle& file, int output, bool terminal);

} // namespace tavrin::ctl
