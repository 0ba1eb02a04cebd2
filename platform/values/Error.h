#pragma once

#include <cstdint>
#include <expected>
#include <memory>
#include <string>
#include <string_view>

#include "platform/values/Value.h"

namespace platform {

/// Why something failed: a code, the domain that defines it, and details under string keys. The details hold a short
/// text under "reason" if its maker had one.
struct Error {
    std::string domain;
    std::int64_t code = 0;
    Value userInfo;                          ///< a dictionary, or null for no details
    std::shared_ptr<const Error> underlying; ///< the cause, or null

    Error() = default;
    Error(std::string domain_, std::int64_t code_, Value userInfo_ = {})
        : domain(std::move(domain_)), code(code_), userInfo(std::move(userInfo_))
    {}

    /// An error with a "reason".
    static Error withReason(std::string domain, std::int64_t code, std::string reason);
    /// The error of a system call: domain "POSIX", code `errnum`. The reason is the system's text after `what`.
    static Error posix(int errnum, std::string_view what = {});

    /// The text under "reason", or the empty string.
    [[nodiscard]] std::string reason() const;
    /// Returns "domain code: reason", for logs.
    [[nodiscard]] std::string description() const;

    friend bool operator==(const Error& a, const Error& b)
    {
        return a.domain == b.domain && a.code == b.code && a.userInfo == b.userInfo;
    }
};

template <class T> using Result = std::expected<T, Error>;

/// The domain of errors of readers: JSON, property lists, archives, IPC messages.
inline constexpr std::string_view kFormatErrorDomain = "Format";
/// Its code for input that is not of the format or exceeds a limit.
inline constexpr std::int64_t kFormatMalformed = 1;
/// Its code for a record of a class that the reader doesn't know.
inline constexpr std::int64_t kFormatUnknownClass = 2;
/// The domain of system call errors, whose codes are `errno` values.
inline constexpr std::string_view kPosixErrorDomain = "POSIX";

} // namespace platform
