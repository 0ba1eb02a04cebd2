#pragma once

#include <chrono>
#include <expected>
#include <filesystem>
#include <string>

#include "platform/base/Date.h"

namespace devserver {

/// The files of a self-signed certificate. Clients take `certificate` as their CA file.
struct CertificateFiles {
    std::filesystem::path certificate; ///< PEM
    std::filesystem::path key;         ///< PEM
    bool made = false;                 ///< new, not found
};

/// The certificate in `directory` (absolute), for localhost, 127.0.0.1, ::1 and `address`. One that is there is kept
/// while it is valid for another day, covers the address and fits its key; else a new one is made, valid for `lifetime`
/// from `now`. Directory 0700, files 0600. The error is a sentence.
[[nodiscard]] std::expected<CertificateFiles, std::string>
provideCertificate(const std::filesystem::path& directory, const std::string& address, platform::Date now,
                   std::chrono::hours lifetime = std::chrono::hours(24 * 365));

} // namespace devserver
