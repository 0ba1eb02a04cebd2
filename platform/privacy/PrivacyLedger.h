#pragma once

#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

#include "platform/base/Date.h"
#include "platform/privacy/RandomizedResponse.h"
#include "platform/values/Error.h"

namespace platform {

/// What a device has told of its user in the last day, and the secret that hides it: a value, as it is kept on disk
/// (docs/formats.md).
///
/// The ledger's time is the clock's, but never earlier than its last debit: a clock that was set back brings no new
/// budget.
struct PrivacyLedger {
    /// In any 24 hours of the ledger's time.
    static constexpr int kReportsADay = 8;

    struct Debit {
        std::int64_t at = 0; ///< seconds since 1970
        int reports = 0;
        friend bool operator==(const Debit&, const Debit&) = default;
    };

    DeviceSecret secret{};
    std::vector<Debit> debits; ///< in order of time; those that no longer count may be missing

    /// Reports that may still be made; 0 at least.
    [[nodiscard]] int left(Date now) const;
    /// Books reports, as many as are left at most.
    void debit(int reports, Date now);

    /// With a digest, so that damage shows.
    [[nodiscard]] std::string text() const;
    /// An error for anything that `text` didn't make.
    [[nodiscard]] static Result<PrivacyLedger> parse(std::string_view text);
};

/// Bytes as small hexadecimal digits, and back. False where the text isn't so many bytes, which are then undefined.
[[nodiscard]] std::string hexText(std::span<const std::uint8_t> bytes);
[[nodiscard]] bool readHex(std::string_view text, std::span<std::uint8_t> bytes);

} // namespace platform
