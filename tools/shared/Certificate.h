#pragma once

#include <chrono>
#include <expected>
#include <filesystem>
#include <string>

#include "platform/base/Date.h"

namespace tavrin::tools {

/// The files of a self-signed certificate. `certificate` is also the CA file for clients.
struct CertificateFiles {
    std::filesystem::path certificate; ///< PEM
    std::filesystem::path key;         ///< PEM
    bool made = false;                 ///< newly created, not found
};

/// Returns a certificate for localhost, 127.0.0.1, ::1 and `address` in `directory` (absolute). Keeps an existing one
/// if it is valid for another day, covers the address and fits its key; otherwise makes a new one that is valid for
/// `lifetime` from `now`. Directory mode 0700, files 0600. The error is a message for the user.
[[nodiscard]] std::expected<CertificateFiles, std::string>
provideCertificate(const std::filesystem::path& directory, const std::string& address, platform::Date now,
                   std::chrono::hours lifetime = std::chrono::hours(24 * 365));

} // namespace tavrin::tools
