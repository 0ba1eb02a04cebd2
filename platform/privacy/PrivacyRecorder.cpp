#include "platform/privacy/PrivacyRecorder.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <span>

#include <fmt/format.h>
#include <openssl/rand.h>

#include "platform/base/Log.h"
#include "platform/files/Files.h"
#include "platform/run/Clock.h"
#include "platform/run/LivedTime.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Json.h"
#include "platform/values/Value.h"

namespace platform {

namespace {

constexpr std::size_t kMaximumFile = 256u << 10;
constexpr auto kKeptFor = std::chrono::days(30);

std::unexpected<Error> failure(std::int64_t code, std::string reason)
{
    return std::unexpected(Error::withReason(kPrivacyErrorDomain, code, std::move(reason)));
}

/// Returns the UTC day as "2026-01-31". Such texts sort by day.
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

/// The random numbers of one call, all drawn at its start: nothing can fail halfway for lack of them.
struct PrivacyRecorder::Drawn {
    DeviceSecret newSecret{};
    std::array<PrivacyRandom, PrivacyLedger::kReportsADay> noise{};
    std::vector<std::uint64_t> ranks; ///< one for each text; the texts with the lowest are recorded
};

Result<PrivacyRecorder::Drawn> PrivacyRecorder::draw(std::size_t texts) const
{
    const auto bytesOf = [](auto& value) {
        return std::span(reinterpret_cast<std::uint8_t*>(value.data()), value.size() * sizeof(value[0]));
    };
    Drawn drawn;
    drawn.ranks.resize(texts);
    if (_random(bytesOf(drawn.newSecret)) && _random(bytesOf(drawn.noise)) && _random(bytesOf(drawn.ranks)))
        return drawn;
    return failure(kPrivacyNoRandomness, "no randomness for reports");
}

Result<std::size_t> PrivacyRecorder::record(std::string_view key, const std::set<std::string>& texts)
{
    if (texts.empty()) return 0;
    const auto drawn = draw(texts.size());
    if (!drawn) return std::unexpected(drawn.error());
    if (auto made = _files.createDirectories(_directory); !made) return std::unexpected(std::move(made.error()));
    const auto lock = _files.lock(_directory / "lock");
    if (!lock) return std::unexpected(lock.error());
    auto ledger = readLedger(drawn->newSecret);
    if (!ledger) return std::unexpected(std::move(ledger.error()));
    const LivedTime::Mark now = LivedTime(_clock, ledger->time).mark();
    ledger->time = now; // always written: lived time continues from here if the clock was set back
    const std::size_t count = std::min(texts.size(), static_cast<std::size_t>(ledger->left(now.lived)));
    if (count == 0) {
        if (auto written = writeLedger(*ledger); !written) return std::unexpected(std::move(written.error()));
        return failure(kPrivacyBudgetExhausted, "the privacy budget of the day is used up");
    }

    std::vector<std::pair<std::uint64_t, std::string_view>> chosen;
    chosen.reserve(texts.size());
    for (const std::string& text : texts) chosen.emplace_back(drawn->ranks[chosen.size()], text);
    std::ranges::partial_sort(chosen, chosen.begin() + static_cast<std::ptrdiff_t>(count));
    std::vector<PrivacyReport> reports;
    reports.reserve(count);
    for (std::size_t i = 0; i < count; ++i)
        reports.push_back(privatised(ledger->secret, key, chosen[i].second, drawn->noise[i]));

    ledger->debit(static_cast<int>(count), now.lived);
    if (auto debited = writeLedger(*ledger); !debited) return std::unexpected(std::move(debited.error()));
    if (auto added = addReports(reports); !added) return std::unexpected(std::move(added.error()));
    return count;
}

Result<PrivacyLedger> PrivacyRecorder::readLedger(const DeviceSecret& newSecret) const
{
    const auto bytes = _files.read(_directory / "ledger", kMaximumFile);
    if (bytes) return PrivacyLedger::parse(bytes->view());
    if (bytes.error().code != ENOENT) return std::unexpected(bytes.error());
    return PrivacyLedger{.secret = newSecret};
}

Result<void> PrivacyRecorder::writeLedger(const PrivacyLedger& ledger)
{
    return _files.writeAtomically(_directory / "ledger", ledger.text());
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
            defaultLog().error("privacy reports in {} are damaged and will be replaced", path.string());
    } else if (bytes.error().code != ENOENT) {
        defaultLog().error("privacy reports can't be read and will be replaced: {}", bytes.error().description());
    }

    const Date now = _clock.wallNow();
    std::erase_if(all,
                  [oldest = dayOf(now - kKeptFor)](const Value& report) { return textAt(report, "day") < oldest; });
    for (const PrivacyReport& report : reports)
        all.push_back(Dictionary{{"day", dayOf(now)}, {"cohort", report.cohort}, {"bits", hexText(report.bits)}});
    // Sorted, so that the order of a day's reports doesn't reveal the order of events.
    std::ranges::sort(all, {},
                      [](const Value& report) { return std::pair(textAt(report, "day"), textAt(report, "bits")); });
    return _files.writeAtomically(path, toJson(all));
}

} // namespace platform
