#pragma once

#include <string>
#include <string_view>

#include "platform/values/Error.h"

namespace tavrin {

/// The domain of errors that the daemon itself detects.
inline constexpr std::string_view TAVErrorDomain = "TAVErrorDomain";

/// Codes in `TAVErrorDomain`.
enum TAVErrorCode : std::int64_t {
    TAVErrorTimeout = 1,           ///< no bag within a second ("timeout"), or no user agent yet ("no UserAgent")
    TAVErrorBagFetch = 2,          ///< the bag could not be fetched
    TAVErrorNotFound = 404,        ///< no such resource
    TAVErrorInvalidResponse = 500, ///< an invalid answer or configuration, or a request that can't be made
};

/// Creates an error in `TAVErrorDomain` with this "reason".
[[nodiscard]] inline platform::Error makeTAVError(std::int64_t code, std::string reason)
{
    return platform::Error::withReason(TAVErrorDomain, code, std::move(reason));
}

} // namespace tavrin
