#pragma once

#include <filesystem>
#include <memory>
#include <string_view>

#include "platform/device/LocaleSource.h"

namespace platform {

class RunLoop;

/// Returns the locale of an environment: `locale` is the value of LC_ALL, LC_* or LANG ("de_CH.UTF-8", "C"),
/// `languages` that of LANGUAGE, separated by colons. Unknown or empty names mean English of the United States.
[[nodiscard]] LocaleContext localeContext(std::string_view locale, std::string_view languages = {});

/// Reads LC_ALL, LC_*, LANG and LANGUAGE, which /etc/locale.conf or /etc/default/locale override if they change while
/// the process runs; the time zone from TZ or else /etc/localtime; the keyboard from /etc/default/keyboard. Sees
/// changes by inotify. `etc` replaces /etc. Destroyed on the run loop's thread; the run loop must outlive it.
[[nodiscard]] std::unique_ptr<LocaleSource> makeLocaleSource(RunLoop& runLoop, std::filesystem::path etc = "/etc");

} // namespace platform
