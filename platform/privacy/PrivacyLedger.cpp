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

constexpr std::int64_t kDay = 24 * 60 * 60; // seconds
constexpr std::int64_t kLatest = std::int64_t(1) << 40;

std::int64_t timeOf(const std::vector<PrivacyLedger::Debit>& debits, Date now)
{
    const std::int64_t clock = std::chrono::floor<std::chrono::seconds>(now).time_since_epoch().count();
    return debits.empty() ? clock : std::max(clock, debits.back().at);
}

std::string digestOf(std::string_view text)
{
    std::array<std::uint8_t, 32> digest{};
    if (EVP_Digest(text.data(), text.size(), digest.data(), nullptr, EVP_sha256(), nullptr) != 1) std::abort();
    return hexText(digest);
}

/// The debits in a value, which must be as the ledger keeps them.
bool readDebits(const Value& value, std::vector<PrivacyLedger::Debit>& debits)
{
    if (!value.asArray()) return false;
    for (const Value& entry : *value.asArray()) {
        const auto at = entry[0].asInt();
        const auto reports = entry[1].asInt();
        const std::int64_t earliest = debits.empty() ? -kLatest : debits.back().at;
        if (!at || *at < earliest || *at > kLatest || !reports || *reports < 1 ||
            *reports > PrivacyLedger::kReportsADay)
            return false;
        debits.push_back({*at, static_cast<int>(*reports)});
    }
    return true;
}

} // namespace

int PrivacyLedger::left(Date now) const
{
    const std::int64_t time = timeOf(debits, now);
    int left = kReportsADay;
    for (const Debit& debit : debits)
        if (debit.at > time - kDay) left -= debit.reports;
    return std::max(left, 0);
}

void PrivacyLedger::debit(int reports, Date now)
{
    const std::int64_t time = timeOf(debits, now);
    std::erase_if(debits, [&](const Debit& debit) { return debit.at <= time - kDay; });
    debits.push_back({time, reports});
}

std::string PrivacyLedger::text() const
{
    Value::Array booked;
    for (const Debit& debit : debits) booked.push_back(Value::Array{debit.at, debit.reports});
    const std::string contents = toJson(Dictionary{{"secret", hexText(secret)}, {"debits", std::move(booked)}});
    return contents + "\n" + digestOf(contents) + "\n";
}

Result<PrivacyLedger> PrivacyLedger::parse(std::string_view text)
{
    const std::string_view contents = text.substr(0, text.find('\n'));
    PrivacyLedger ledger;
    const auto value = parseJson(contents);
    const std::string* secret = value ? (*value)["secret"].asString() : nullptr;
    if (text.substr(contents.size()) != "\n" + digestOf(contents) + "\n" || !secret ||
        !readHex(*secret, ledger.secret) || !readDebits((*value)["debits"], ledger.debits))
        return std::unexpected(
            Error::withReason(std::string(kFormatErrorDomain), kFormatMalformed, "the privacy ledger is damaged"));
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
