#include "platform/privacy/RandomizedResponse.h"

#include <cstdlib>
#include <string>

#include <openssl/evp.h>
#include <openssl/hmac.h>

namespace platform {

namespace {

using Sha256 = std::array<std::uint8_t, 32>;
using Sha512 = std::array<std::uint8_t, 64>;

/// Aborts if OpenSSL can't compute the digest (it is out of memory): without it nothing would be hidden.
Sha256 sha256(std::string_view message)
{
    Sha256 digest{};
    if (EVP_Digest(message.data(), message.size(), digest.data(), nullptr, EVP_sha256(), nullptr) != 1) std::abort();
    return digest;
}

Sha512 hmacSha512(const DeviceSecret& secret, std::string_view message)
{
    Sha512 code{};
    if (!HMAC(EVP_sha512(), secret.data(), static_cast<int>(secret.size()),
              reinterpret_cast<const unsigned char*>(message.data()), message.size(), code.data(), nullptr))
        std::abort();
    return code;
}

/// Joins its arguments injectively: the key's length separates key and text.
std::string message(char purpose, std::string_view key, std::string_view text)
{
    std::string bytes(1, purpose);
    for (int shift = 24; shift >= 0; shift -= 8) bytes += static_cast<char>(key.size() >> shift);
    return bytes.append(key).append(text);
}

} // namespace

unsigned privacyCohort(const DeviceSecret& secret)
{
    return hmacSha512(secret, "c")[0] % kPrivacyCohorts;
}

unsigned privacyBit(unsigned cohort, std::string_view key, std::string_view text)
{
    static_assert(kPrivacyBits == 256, "a byte of the digest is the bit's number");
    return sha256(message(static_cast<char>(cohort), key, text))[0];
}

PrivacyBits permanentFlips(const DeviceSecret& secret, std::string_view key, std::string_view text)
{
    return flips(hmacSha512(secret, message('p', key, text)));
}

PrivacyBits flips(std::span<const std::uint8_t, 64> random)
{
    static_assert(kPrivacyFlip == 1.0 / 4, "where two random bits are set");
    PrivacyBits bits;
    for (std::size_t i = 0; i < bits.size(); ++i) bits[i] = random[i] & random[bits.size() + i];
    return bits;
}

PrivacyReport privatised(const DeviceSecret& secret, std::string_view key, std::string_view text,
                         const PrivacyRandom& random)
{
    PrivacyReport report{.cohort = privacyCohort(secret)};
    const unsigned bit = privacyBit(report.cohort, key, text);
    report.bits[bit / 8] |= static_cast<std::uint8_t>(1u << bit % 8);
    const PrivacyBits permanent = permanentFlips(secret, key, text);
    const PrivacyBits instantaneous = flips(random);
    for (std::size_t i = 0; i < report.bits.size(); ++i) report.bits[i] ^= permanent[i] ^ instantaneous[i];
    return report;
}

} // namespace platform
