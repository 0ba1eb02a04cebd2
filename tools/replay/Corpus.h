#pragma once

#include <chrono>
#include <string>
#include <string_view>
#include <vector>

#include "platform/values/Error.h"

/// What users typed, key by key, as a text file: a line for each query,
///
///     WANTED <tab> PAUSE:KEY PAUSE:KEY …
///
/// where WANTED is what the user had in mind, for readers of the file; PAUSE is the time since the key before, in
/// milliseconds; and KEY the character that was typed: "␣" for a blank, "⌫" where the last one was taken back. Every
/// query begins with an empty line of input. Lines that begin with "#" are comments.
namespace tavrin::replay {

struct Keystroke {
    std::chrono::milliseconds pause{0};
    std::string text; ///< all that stands in the line of input after this key; may be empty
};

struct TypedQuery {
    std::string wanted;
    std::vector<Keystroke> keys;
};

/// The error names the line and what is wrong with it.
[[nodiscard]] platform::Result<std::vector<TypedQuery>> parseCorpus(std::string_view text);

} // namespace tavrin::replay
