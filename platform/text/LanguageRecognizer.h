#pragma once

#include <string>
#include <string_view>

namespace platform {

/// Returns the language of a text as a BCP 47 tag ("de", "zh-Hant"), or "und" if the text is too short or too mixed to
/// tell. Reads the first 4096 bytes. Any thread.
[[nodiscard]] std::string recognizedLanguage(std::string_view text);

} // namespace platform
