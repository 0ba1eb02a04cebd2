#pragma once

#include <string>
#include <string_view>

namespace platform {

/// Returns the language of a UTF-8 text as a BCP 47 tag ("de", "zh-Hant"), or "und" if CLD2 is not confident: the text
/// is too short or mixes languages. Reads the first 4096 bytes. Any thread.
[[nodiscard]] std::string recognizedLanguage(std::string_view text);

} // namespace platform
