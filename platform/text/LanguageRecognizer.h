#pragma once

#include <string>
#include <string_view>

namespace platform {

/// The language that a text is written in, as a BCP 47 tag ("de", "zh-Hant"), or "und" where the text is too short or
/// too mixed to tell. Looks at the first 4096 bytes. Any thread.
[[nodiscard]] std::string recognizedLanguage(std::string_view text);

} // namespace platform
