#pragma once

#include <filesystem>
#include <functional>
#include <set>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include "platform/privacy/PrivacyLedger.h"
#include "platform/privacy/RandomizedResponse.h"
#include "platform/values/Error.h"

namespace platform {

class Clock;
class FileSystem;

/// Fills the bytes with randomness; returns false, and leaves them unspecified, if there is none. Any thread.
using RandomBytes = std::function<bool(std::span<std::uint8_t>)>;
/// The cryptographic generator of OpenSSL.
[[nodiscard]] bool systemRandomBytes(std::span<std::uint8_t> bytes);

/// Domain of the recorder's own errors.
inline constexpr std::string_view kPrivacyErrorDomain = "Privacy";
inline constexpr std::int64_t kPrivacyBudgetExhausted = 1;
inline constexpr std::int64_t kPrivacyNoRandomness = 2;

/// Records texts by randomised response: many devices' reports together tell much, one device's little
/// (docs/privacy.md).
///
/// Its directory has two files (0600), each replaced whole: "ledger", which must not leave the device, and
/// "reports.json", which may. Neither has keys or texts: a report is noise around one bit, to which both are hashed.
/// The reports of 30 days are kept; nothing here sends them anywhere.
///
/// There is one budget for the device, whatever the keys. It is debited on disk before a report is written: a kill or a
/// failure in between loses the reports. While the ledger is damaged or unreadable nothing is recorded. Removing it
/// makes the device a new one: a new secret and a new budget.
///
/// One thread at a time. One process records at a time; `record` fails in the others meanwhile (EWOULDBLOCK).
class PrivacyRecorder {
public:
    PrivacyRecorder(FileSystem& files, Clock& clock, std::filesystem::path directory,
                    RandomBytes random = systemRandomBytes);

    /// Records texts under a key and returns how many of them: if the budget doesn't suffice for all, a random choice.
    /// Fails if the budget is used up (`kPrivacyBudgetExhausted`), if there is no randomness (`kPrivacyNoRandomness`),
    /// or with the error of the file that couldn't be read or written.
    [[nodiscard]] Result<std::size_t> record(std::string_view key, const std::set<std::string>& texts);

private:
    struct Drawn;
    [[nodiscard]] Result<Drawn> draw(std::size_t texts) const;
    [[nodiscard]] Result<PrivacyLedger> readLedger(const DeviceSecret& newSecret) const;
    [[nodiscard]] Result<void> writeLedger(const PrivacyLedger& ledger);
    [[nodiscard]] Result<void> addReports(const std::vector<PrivacyReport>& reports);

    FileSystem& _files;
    Clock& _clock;
    const std::filesystem::path _directory;
    const RandomBytes _random;
};

} // namespace platform
