#include "platform/privacy/PrivacyRecorder.h"

#include <algorithm>
#include <cerrno>
#include <iterator>
#include <limits>

#include <fmt/format.h>
#include <openssl/rand.h>

#include "platform/base/Log.h"
#include "platform/files/Files.h"
#include "platform/run/Clock.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Json.h"
#include "platform/values/Value.h"

namespace platform {

namespace {

constexpr std::size_t kMaximumFile = 256u << 10;
constexpr auto kKeptFor = std::chrono::days(30);

std::unexpected<Error> failure(std::int64_t code, std::string reason)
{
    return std::unexpected(Error::withReason(std::string(kPrivacyErrorDomain), code, std::move(reason)));
}

/// Random numbers for the standard library's choices.
class Generator {
public:
    using result_type = std::uint64_t;
    explicit Generator(const RandomBytes& random) : _random(random) {}
    static constexpr result_type min() { return 0; }
    static constexpr result_type max() { return std::numeric_limits<result_type>::max(); }
    result_type operator()()
    {
        std::array<std::uint8_t, sizeof(result_type)> bytes{};
        _failed |= !_random(bytes);
        result_type number = 0;
        for (const std::uint8_t byte : bytes) number = number << 8 | byte;
        return _failed ? _drawn++ : number; // nobody uses what is chosen then, but choosing must end
    }
    [[nodiscard]] bool failed() const { return _failed; }

private:
    const RandomBytes& _random;
    bool _failed = false;
    result_type _drawn = 0;
};

/// "2026-01-31", UTC. Such texts compare as the days do.
std::string dayOf(Date date)
{
    const std::chrono::year_month_day day(std::chrono::floor<std::chrono::days>(date));
    return fmt::format("{:04}-{:02}-{:02}", static_cast<int>(day.year()), static_cast<unsigned>(day.month()),
                       static_cast<unsigned>(day.day()));
}

std::string textAt(const Value& report, std::string_view name)
{
    const std::string* text = report[name].asString();
    return text ? *text : "";
}

} // namespace

bool systemRandomBytes(std::span<std::uint8_t> bytes)
{
    return RAND_bytes(bytes.data(), static_cast<int>(bytes.size())) == 1;
}

PrivacyRecorder::PrivacyRecorder(FileSystem& files, Clock& clock, std::filesystem::path directory, RandomBytes random)
    : _files(files), _clock(clock), _directory(std::move(directory)), _random(std::move(random))
{}

Result<void> PrivacyRecorder::record(std::string_view key, const std::set<std::string>& texts)
{
    if (texts.empty()) return {};
    if (auto made = _files.createDirectories(_directory); !made) return made;
    const auto lock = _files.lock(_directory / "lock");
    if (!lock) return std::unexpected(lock.error());
    auto ledger = readLedger();
    if (!ledger) return std::unexpected(std::move(ledger.error()));
    const Date now = _clock.wallNow();
    const int left = ledger->left(now);
    if (left == 0) return failure(kPrivacyBudgetExhausted, "the privacy budget of the day is used up");

    // Made before they are paid for, so that a failure to make them costs nothing.
    const auto reports = privatise(ledger->secret, key, texts, left);
    if (!reports) return std::unexpected(reports.error());
    ledger->debit(static_cast<int>(reports->size()), now);
    if (auto debited = _files.writeAtomically(_directory / "ledger", ledger->text()); !debited) return debited;
    return addReports(*reports);
}

Result<PrivacyLedger> PrivacyRecorder::readLedger() const
{
    const auto bytes = _files.read(_directory / "ledger", kMaximumFile);
    if (bytes) return PrivacyLedger::parse(bytes->view());
    if (bytes.error().code != ENOENT) return std::unexpected(bytes.error());
    PrivacyLedger ledger;
    if (!_random(ledger.secret)) return failure(kPrivacyNoRandomness, "no randomness for a secret");
    return ledger;
}

Result<std::vector<PrivacyReport>> PrivacyRecorder::privatise(const DeviceSecret& secret, std::string_view key,
                                                              const std::set<std::string>& texts, int count) const
{
    Generator generator(_random);
    std::vector<std::string_view> chosen;
    std::ranges::sample(texts, std::back_inserter(chosen), count, generator);
    std::vector<PrivacyReport> reports;
    bool failed = generator.failed();
    for (const std::string_view text : chosen) {
        PrivacyRandom random{};
        failed |= !_random(random);
        reports.push_back(privatised(secret, key, text, random));
    }
    if (failed) return failure(kPrivacyNoRandomness, "no randomness for reports");
    return reports;
}

Result<void> PrivacyRecorder::addReports(const std::vector<PrivacyReport>& reports)
{
    const auto path = _directory / "reports.json";
    Value::Array all;
    if (const auto bytes = _files.read(path, kMaximumFile)) {
        const auto earlier = parseJson(bytes->view(), kMaximumFile);
        if (earlier && earlier->asArray())
            all = *earlier->asArray();
        else
            defaultLog().error("privacy reports in {} are broken and forgotten", path.string());
    } else if (bytes.error().code != ENOENT) {
        defaultLog().error("privacy reports can't be read and are forgotten: {}", bytes.error().description());
    }

    const Date now = _clock.wallNow();
    std::erase_if(all,
                  [oldest = dayOf(now - kKeptFor)](const Value& report) { return textAt(report, "day") < oldest; });
    for (const PrivacyReport& report : reports)
        all.push_back(Dictionary{{"day", dayOf(now)}, {"cohort", report.cohort}, {"bits", hexText(report.bits)}});
    // In an order that doesn't tell which was first.
    std::ranges::sort(all, {},
                      [](const Value& report) { return std::pair(textAt(report, "day"), textAt(report, "bits")); });
    return _files.writeAtomically(path, toJson(all));
}

} // namespace platform
