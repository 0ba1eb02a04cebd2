#pragma once

#include <cstdint>
#include <expected>
#include <memory>
#include <string>
#include <string_view>

#include "platform/values/Value.h"

namespace platform {

/// Why something failed, as a value: where the code comes from, the code, and details under string keys.
///
/// The details hold a short text under "reason" wherever the maker has one.
struct Error {
    std::string domain;
    std::int64_t code = 0;
    Value userInfo;                          ///< a dictionary, or null for no details
    std::shared_ptr<const Error> underlying; ///< what caused it, if that is known

    Error() = default;
    Error(std::string domain_, std::int64_t code_, Value userInfo_ = {})
        : domain(std::move(domain_)), code(code_), userInfo(std::move(userInfo_))
    {}

    /// An error with a "reason".
    static Error withReason(std::string domain, std::int64_t code, std::string reason);
    /// A system call's error: domain "POSIX", code `errnum`, the system's text and `what` as the reason.
    static Error posix(int errnum, std::string_view what = {});

    /// The text under "reason", or the empty string.
    [[nodiscard]] std::string reason() const;
    /// For logs: "domain code: reason".
    [[nodiscard]] std::string description() const;

    friend bool operator==(const Error& a, const Error& b)
    {
        return a.domain == b.domain && a.code == b.code && a.userInfo == b.userInfo;
    }
};

template <class T> using Result = std::expected<T, Error>;

/// Domain of errors of the device layer's own readers (JSON, property lists, archives, IPC messages).
inline constexpr std::string_view kFormatErrorDomain = "Format";
/// Codes in it: not of the format, or beyond a limit; a record of a class that the reader doesn't know.
inline constexpr std::int64_t kFormatMalformed = 1;
inline constexpr std::int64_t kFormatUnknownClass = 2;
/// Domain of system call errors; codes are `errno`.
inline constexpr std::string_view kPosixErrorDomain = "POSIX";

} // namespace platform
