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

/// Fills the bytes with random data. Returns false and leaves them unspecified if the generator fails. Any thread.
using RandomBytes = std::function<bool(std::span<std::uint8_t>)>;
/// Uses the cryptographic generator of OpenSSL.
[[nodiscard]] bool systemRandomBytes(std::span<std::uint8_t> bytes);

/// Domain of the recorder's own errors.
inline constexpr std::string_view kPrivacyErrorDomain = "Privacy";
inline constexpr std::int64_t kPrivacyBudgetExhausted = 1;
inline constexpr std::int64_t kPrivacyNoRandomness = 2;

/// Records texts by randomised response: the reports of many devices together reveal frequencies, the reports of one
/// device reveal little (docs/privacy.md has the proof).
///
/// The directory has two files (mode 0600), each replaced atomically: "ledger", which must not leave the device, and
/// "reports.json", which may. Neither contains keys or texts: a report hashes both to one bit and hides it in noise.
/// Reports are kept for 30 days; this class sends them nowhere.
///
/// All keys share one budget. It is debited on disk before a report is written: a kill or a failure in between loses
/// the reports. While the ledger is damaged or unreadable, nothing is recorded. Deleting the ledger creates a new
/// secret and a new budget.
///
/// One thread at a time. The files are locked during `record`, which fails with EWOULDBLOCK if another process holds
/// the lock.
class PrivacyRecorder {
public:
    /// `files` and `clock` must outlive the recorder. `record` creates the directory.
    PrivacyRecorder(FileSystem& files, Clock& clock, std::filesystem::path directory,
                    RandomBytes random = systemRandomBytes);

    /// Records texts under a key and returns how many were recorded; picks at random if the budget doesn't cover all.
    /// Fails with `kPrivacyBudgetExhausted` if the budget is used up, with `kPrivacyNoRandomness` if the generator
    /// fails, or with the error of a file that could not be read or written.
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
