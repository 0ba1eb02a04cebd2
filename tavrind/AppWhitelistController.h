#pragma once

#include <string>

namespace tavrin {

struct Assembly;

/// The signature of the installed applications that the allow-list names. Without a list there is none. Any thread.
class AppWhitelistController {
public:
    explicit AppWhitelistController(Assembly& assembly) : _assembly(assembly) {}
    /// Empty for no signature.
    [[nodiscard]] std::string signature() const { return {}; }

private:
    [[maybe_unused]] Assembly& _assembly;
};

} // namespace tavrin
