#include "platform/privacy/PrivacyLedger.h"

#include <algorithm>
#include <array>
#include <cstdlib>

#include <fmt/format.h>
#include <openssl/evp.h>

#include "platform/values/Dictionary.h"
#include "platform/values/Json.h"
#include "platform/values/Value.h"

namespace platform {

namespace {

constexpr std::int64_t kDay = 24 * 60 * 60;             // seconds
constexpr std::int64_t kLatest = std::int64_t(1) << 40; // seconds

std::int64_t secondsOf(Duration lived)
{
    return std::chrono::floor<std::chrono::seconds>(lived).count();
}

std::string digestOf(std::string_view text)
{
    std::array<std::uint8_t, 32> digest{};
    if (EVP_Digest(text.data(), text.size(), digest.data(), nullptr, EVP_sha256(), nullptr) != 1) std::abort();
    return hexText(digest);
}

/// Reads the debits; returns false if they are out of range or out of order.
bool readDebits(const Value& value, std::vector<PrivacyLedger::Debit>& debits)
{
    if (!value.asArray()) return false;
    for (const Value& entry : *value.asArray()) {
        const auto at = entry[0].asInt();
        const auto reports = entry[1].asInt();
        const std::int64_t earliest = debits.empty() ? 0 : debits.back().at;
        if (!at || *at < earliest || *at > kLatest || !reports || *reports < 1 ||
            *reports > PrivacyLedger::kReportsADay)
            return false;
        debits.push_back({*at, static_cast<int>(*reports)});
    }
    return true;
}

/// Reads the time; returns false if a debit is later than it, or if there are debits without a time.
bool readTime(const Value& value, PrivacyLedger& ledger)
{
    if (const std::string* text = value["time"].asString()) ledger.time = LivedTime::Mark::parse(*text);
    return ledger.debits.empty() || (ledger.time && ledger.debits.back().at <= secondsOf(ledger.time->lived));
}

} // namespace

int PrivacyLedger::left(Duration lived) const
{
    const std::int64_t now = secondsOf(lived);
    int left = kReportsADay;
    for (const Debit& debit : debits)
        if (debit.at > now - kDay) left -= debit.reports;
    return std::max(left, 0);
}

void PrivacyLedger::debit(int reports, Duration lived)
{
    const std::int64_t at = secondsOf(lived);
    std::erase_if(debits, [&](const Debit& debit) { return debit.at <= at - kDay; });
    debits.push_back({at, reports});
}

std::string PrivacyLedger::text() const
{
    Value::Array booked;
    for (const Debit& debit : debits) booked.push_back(Value::Array{debit.at, debit.reports});
    Dictionary ledger{{"secret", hexText(secret)}, {"debits", std::move(booked)}};
    if (time) ledger.set("time", time->text());
    const std::string contents = toJson(ledger);
    return contents + "\n" + digestOf(contents) + "\n";
}

Result<PrivacyLedger> PrivacyLedger::parse(std::string_view text)
{
    const std::string_view contents = text.substr(0, text.find('\n'));
    PrivacyLedger ledger;
    const auto value = parseJson(contents);
    const std::string* secret = value ? (*value)["secret"].asString() : nullptr;
    if (text.substr(contents.size()) != "\n" + digestOf(contents) + "\n" || !secret ||
        !readHex(*secret, ledger.secret) || !readDebits((*value)["debits"], ledger.debits) || !readTime(*value, ledger))
        return malformed("the privacy ledger is damaged");
    return ledger;
}

std::string hexText(std::span<const std::uint8_t> bytes)
{
    return fmt::format("{:02x}", fmt::join(bytes, ""));
}

bool readHex(std::string_view text, std::span<std::uint8_t> bytes)
{
    constexpr std::string_view kDigits = "0123456789abcdef";
    if (text.size() != 2 * bytes.size()) return false;
    for (std::size_t i = 0; i < bytes.size(); ++i) {
        const std::size_t high = kDigits.find(text[2 * i]);
        const std::size_t low = kDigits.find(text[2 * i + 1]);
        if (high == std::string_view::npos || low == std::string_view::npos) return false;
        bytes[i] = static_cast<std::uint8_t>(high << 4 | low);
    }
    return true;
}

} // namespace platform
