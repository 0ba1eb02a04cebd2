#pragma once

#include <chrono>
#include <string>
#include <string_view>
#include <vector>

#include "platform/values/Error.h"

/// A text file of what users typed, key by key, with a line for each query:
///
///     WANTED <tab> PAUSE:KEY PAUSE:KEY …
///
/// WANTED is the user's intention, for readers only. PAUSE is the time since the previous key in milliseconds. KEY is
/// the typed character: "␣" for a blank, "⌫" for Backspace. Every query starts with empty input. Lines that begin with
/// "#" are comments.
namespace tavrin::replay {

struct Keystroke {
    std::chrono::milliseconds pause{0};
    std::string text; ///< the complete input after this key; may be empty
};

struct TypedQuery {
    std::string wanted;
    std::vector<Keystroke> keys;
};

/// Parses a corpus. The error names the line and the problem.
[[nodiscard]] platform::Result<std::vector<TypedQuery>> parseCorpus(std::string_view text);

} // namespace tavrin::replay
