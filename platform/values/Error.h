#pragma once

#include <cstdint>
#include <expected>
#include <memory>
#include <string>
#include <string_view>

#include "platform/values/Value.h"

namespace platform {

/// Why something failed: a code, the domain that defines the code, and details under string keys. The key "reason" has
/// a short text, if there is one. A plain value: any thread may use a copy.
struct Error {
    std::string domain;
    std::int64_t code = 0;
    Value userInfo;                          ///< a dictionary, or null for no details
    std::shared_ptr<const Error> underlying; ///< the cause, or null

    Error() = default;
    Error(std::string domain_, std::int64_t code_, Value userInfo_ = {})
        : domain(std::move(domain_)), code(code_), userInfo(std::move(userInfo_))
    {}

    /// Returns an error with `reason` under "reason".
    static Error withReason(std::string_view domain, std::int64_t code, std::string reason);
    /// Returns the error of a system call: domain "POSIX", code `errnum`, reason "WHAT: TEXT" with the system's text.
    static Error posix(int errnum, std::string_view what = {});

    /// Returns the text under "reason", or the empty string.
    [[nodiscard]] std::string reason() const;
    /// Returns "domain code: reason", for logs.
    [[nodiscard]] std::string description() const;

    friend bool operator==(const Error& a, const Error& b)
    {
        return a.domain == b.domain && a.code == b.code && a.userInfo == b.userInfo;
    }
};

template <class T> using Result = std::expected<T, Error>;

/// The domain of parsing errors: JSON, property lists, archives, IPC messages.
inline constexpr std::string_view kFormatErrorDomain = "Format";
/// Code: the input is not of the format or exceeds a limit.
inline constexpr std::int64_t kFormatMalformed = 1;
/// Code: a record is of a class that the reader doesn't know.
inline constexpr std::int64_t kFormatUnknownClass = 2;
/// Returns an error of kFormatErrorDomain with code kFormatMalformed.
[[nodiscard]] std::unexpected<Error> malformed(std::string reason);
/// The domain of system call errors. Codes are `errno` values.
inline constexpr std::string_view kPosixErrorDomain = "POSIX";
/// Returns whether a system call failed because of the device or the process, so that it may succeed later: the disk is
/// full, read-only or failed, too many files are open, memory is short.
[[nodiscard]] bool mayPass(const Error& error);

} // namespace platform
