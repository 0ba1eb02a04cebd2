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

/// Computes the signature of those installed applications that are on the allow-list, the resource
/// "TAVInstalledAppWhitelist".
///
/// The signature is stored in the user defaults. It is computed at start-up if none is stored, and whenever an
/// application is installed or removed; a new allow-list alone does not trigger it. One computation runs at a time, on
/// a background queue; requests during a computation are dropped. Any thread.
class AppWhitelistController : public std::enable_shared_from_this<AppWhitelistController> {
public:
    static std::shared_ptr<AppWhitelistController> make(Assembly& assembly);
    explicit AppWhitelistController(Assembly& assembly);

    /// Returns the signature as base64 text; empty before the first computation and after a failed one.
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

/// Returns the signature of the installed applications by an allow-list (JSON, at most 32 MiB); nothing if the text is
/// not an allow-list in the known encoding, or if none of its applications is installed. Reads the applications only if
/// the list is valid. Slow: call it on background queues only.
[[nodiscard]] std::optional<std::string> processWhitelist(std::string_view whitelist,
                                                          platform::InstalledApplications& installed);

} // namespace tavrin
