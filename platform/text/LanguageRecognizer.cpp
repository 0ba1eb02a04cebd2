#include "platform/text/LanguageRecognizer.h"

#include <cld2/public/compact_lang_det.h>

#include "platform/text/Text.h"

namespace platform {

std::string recognizedLanguage(std::string_view text)
{
    constexpr std::size_t kEnough = 4096;
    text = cut(text, kEnough); // the recogniser refuses a text that ends within a character
    bool reliable = false;
    int textBytes = 0;
    int validPrefix = 0;
    int percent[3];
    double score[3];
    CLD2::Language languages[3];
    const CLD2::CLDHints noHints{nullptr, nullptr, 0, CLD2::UNKNOWN_LANGUAGE};
    const CLD2::Language best = CLD2::ExtDetectLanguageSummaryCheckUTF8(text.data(), static_cast<int>(text.size()),
                                                                        true, &noHints, 0, languages, percent, score,
                                                                        nullptr, &textBytes, &reliable, &validPrefix);
    if (!reliable || best == CLD2::UNKNOWN_LANGUAGE) return "und";
    return CLD2::LanguageCode(best);
}

} // namespace platform
