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

/// The number of reports that this device made in the last day, and the secret that hides their contents. A plain
/// value; docs/formats.md describes the file.
///
/// Times are lived time (`LivedTime`): setting the clock back brings no new budget, and a debit made while the clock
/// was years ahead doesn't use up the budget of those years. One thread at a time.
struct PrivacyLedger {
    /// The budget: reports in any 24 hours of lived time.
    static constexpr int kReportsADay = 8;

    struct Debit {
        std::int64_t at = 0; ///< seconds of lived time
        int reports = 0;
        friend bool operator==(const Debit&, const Debit&) = default;
    };

    DeviceSecret secret{};
    std::optional<LivedTime::Mark> time; ///< of the last write; empty before the first
    std::vector<Debit> debits;           ///< in order of time; expired ones may be missing

    /// Returns how many reports may still be made at `lived`; at least 0.
    [[nodiscard]] int left(Duration lived) const;
    /// Books reports; doesn't check the budget.
    void debit(int reports, Duration lived);

    /// Returns the file's contents, with a SHA-256 digest that reveals damage.
    [[nodiscard]] std::string text() const;
    /// Parses what `text` returned. Returns an error of domain "Format" for anything else.
    [[nodiscard]] static Result<PrivacyLedger> parse(std::string_view text);
};

/// Returns the bytes as lower-case hexadecimal digits.
[[nodiscard]] std::string hexText(std::span<const std::uint8_t> bytes);
/// Reads lower-case hexadecimal digits. Returns false, and leaves `bytes` unspecified, for any other text and for one
/// of another length.
[[nodiscard]] bool readHex(std::string_view text, std::span<std::uint8_t> bytes);

} // namespace platform
