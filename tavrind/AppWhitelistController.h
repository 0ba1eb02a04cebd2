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

/// The signature of those installed applications that the allow-list names, the resource "TAVInstalledAppWhitelist".
///
/// A signature is kept in the user defaults. It is computed when there is none at start-up, and whenever applications
/// come or go; a new allow-list alone is not a reason. One computation runs at a time, on a background queue; a reason
/// that comes up meanwhile is dropped. Any thread.
class AppWhitelistController : public std::enable_shared_from_this<AppWhitelistController> {
public:
    static std::shared_ptr<AppWhitelistController> make(Assembly& assembly);
    explicit AppWhitelistController(Assembly& assembly);

    /// Base64 text; empty for none.
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

/// The signature that an allow-list (JSON, 32 MiB at most) gives for the applications installed. None where it isn't an
/// allow-list of the known encoding, or none of its applications is installed. The applications are read only for a
/// list that is sound.
[[nodiscard]] std::optional<std::string> processWhitelist(std::string_view whitelist,
                                                          platform::InstalledApplications& installed);

} // namespace tavrin
