#include "platform/values/Error.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <system_error>

#include <fmt/format.h>

namespace platform {

Error Error::withReason(std::string_view domain, std::int64_t code, std::string reason)
{
    return {std::string(domain), code, Value::dictionaryOf({{"reason", std::move(reason)}})};
}

Error Error::posix(int errnum, std::string_view what)
{
    const std::string text = std::generic_category().message(errnum);
    return withReason(kPosixErrorDomain, errnum, what.empty() ? text : fmt::format("{}: {}", what, text));
}

std::string Error::reason() const
{
    const std::string* text = userInfo["reason"].asString();
    return text ? *text : std::string();
}

std::string Error::description() const
{
    const std::string text = reason();
    return text.empty() ? fmt::format("{} {}", domain, code) : fmt::format("{} {}: {}", domain, code, text);
}

std::unexpected<Error> malformed(std::string reason)
{
    return std::unexpected(Error::withReason(kFormatErrorDomain, kFormatMalformed, std::move(reason)));
}

bool mayPass(const Error& error)
{
    constexpr std::array kCodes{ENOSPC, EDQUOT, EROFS, EIO, EMFILE, ENFILE, ENOMEM};
    return error.domain == kPosixErrorDomain && std::ranges::find(kCodes, error.code) != kCodes.end();
}

} // namespace platform
