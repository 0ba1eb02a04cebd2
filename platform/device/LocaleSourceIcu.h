#pragma once

#include <filesystem>
#include <memory>
#include <string_view>

#include "platform/device/LocaleSource.h"

namespace platform {

class RunLoop;

/// Returns the locale of an environment: `locale` is the value of LC_ALL, LC_MESSAGES or LANG ("de_CH.UTF-8", "C"),
/// `languages` that of LANGUAGE, separated by colons. An unknown or empty name selects "en_US". Any thread.
[[nodiscard]] LocaleContext localeContext(std::string_view locale, std::string_view languages = {});

/// Returns a source that reads the locale from LC_ALL, LC_MESSAGES, LANG and LANGUAGE, the time zone from TZ or else
/// /etc/localtime or /etc/timezone, and the keyboard from /etc/default/keyboard. After /etc/locale.conf or
/// /etc/default/locale has changed while the process runs, these files override the environment. Observes changes by
/// inotify. `etc` replaces /etc. Destroy it on the run loop's thread; the run loop must outlive it.
[[nodiscard]] std::unique_ptr<LocaleSource> makeLocaleSource(RunLoop& runLoop, std::filesystem::path etc = "/etc");

} // namespace platform
