#pragma once

#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include "platform/base/Date.h"
#include "platform/privacy/RandomizedResponse.h"
#include "platform/run/LivedTime.h"
#include "platform/values/Error.h"

namespace platform {

/// How many reports a device has made in the last day, and the secret that hides their contents: a value, as it is kept
/// on disk (docs/formats.md).
///
/// The ledger counts lived time (`LivedTime`). So a clock that was set back brings no new budget, and a debit that was
/// made while the clock ran years ahead doesn't use up the budget of those years.
struct PrivacyLedger {
    /// In any 24 hours of lived time.
    static constexpr int kReportsADay = 8;

    struct Debit {
        std::int64_t at = 0; ///< seconds of lived time
        int reports = 0;
        friend bool operator==(const Debit&, const Debit&) = default;
    };

    DeviceSecret secret{};
    std::optional<LivedTime::Mark> time; ///< when it was last written; nothing before the first time
    std::vector<Debit> debits;           ///< in order of time; those that no longer count may be missing

    /// Returns how many reports may still be made; never less than 0.
    [[nodiscard]] int left(Duration lived) const;
    /// Books reports. The caller has asked `left` first.
    void debit(int reports, Duration lived);

    /// The file's contents, with a digest that shows damage.
    [[nodiscard]] std::string text() const;
    /// Fails for anything that `text` didn't make.
    [[nodiscard]] static Result<PrivacyLedger> parse(std::string_view text);
};

/// Bytes as lower-case hexadecimal digits, and back. `readHex` returns false if the text isn't exactly that many bytes;
/// `bytes` are undefined then.
[[nodiscard]] std::string hexText(std::span<const std::uint8_t> bytes);
[[nodiscard]] bool readHex(std::string_view text, std::span<std::uint8_t> bytes);

} // namespace platform
