#pragma once

#include <filesystem>
#include <memory>
#include <string_view>

#include "platform/device/LocaleSource.h"

namespace platform {

class RunLoop;

/// The locale of an environment: `locale` as in LC_ALL, LC_* or LANG ("de_CH.UTF-8", "C"), and the colon-separated
/// LANGUAGE list. Unknown or empty: English of the United States.
[[nodiscard]] LocaleContext localeContext(std::string_view locale, std::string_view languages = {});

/// LC_ALL, LC_*, LANG and LANGUAGE, overridden by /etc/locale.conf or /etc/default/locale when these change while
/// the process runs; the time zone of TZ, else of /etc/localtime; the keyboard of /etc/default/keyboard. Changes are
/// seen by inotify. `etc` stands for /etc.
[[nodiscard]] std::unique_ptr<LocaleSource> makeLocaleSource(RunLoop& runLoop, std::filesystem::path etc = "/etc");

} // namespace platform
