#pragma once

#include <atomic>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

namespace platform {
class InstalledApplications;
class Queue;
} // namespace platform

namespace tavrin {

struct Assembly;

/// Computes the signature of the installed applications that the allow-list, the resource "TAVInstalledAppWhitelist",
/// names.
///
/// The signature is kept in the user defaults. It is computed at start-up if none is stored, and whenever applications
/// come or go; a new allow-list alone is no reason. One computation runs at a time, on a background queue; requests in
/// the meantime are dropped. Any thread.
class AppWhitelistController : public std::enable_shared_from_this<AppWhitelistController> {
public:
    static std::shared_ptr<AppWhitelistController> make(Assembly& assembly);
    explicit AppWhitelistController(Assembly& assembly);

    /// Returns the base64 text, or the empty string.
    [[nodiscard]] std::string whitelistSignature() const;

private:
    void _generateSoon();
    void _generateWhitelistSignature();
    [[nodiscard]] std::optional<std::string> _generate();

    Assembly& _assembly;
    const std::shared_ptr<platform::Queue> _queue; // guards the signature
    std::string _whitelistSignature;
    std::atomic<bool> _generating = false;
};

/// Returns the signature of the installed applications by an allow-list (JSON, at most 32 MiB); nothing if that is no
/// allow-list of the known encoding or none of its applications is installed. Reads the applications only if the list
/// is valid. Takes time: background queues only.
[[nodiscard]] std::optional<std::string> processWhitelist(std::string_view whitelist,
                                                          platform::InstalledApplications& installed);

} // namespace tavrin
