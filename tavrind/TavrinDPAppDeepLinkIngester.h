#pragma once

namespace tavrin {

struct Assembly;

/// Feeds deep links of applications to the privacy recorder, now and then. There is nothing to feed. Any thread.
class TavrinDPAppDeepLinkIngester {
public:
    explicit TavrinDPAppDeepLinkIngester(Assembly& assembly) : _assembly(assembly) {}
    /// Registers the periodic tasks.
    void scheduleMaintenance() {}

private:
    [[maybe_unused]] Assembly& _assembly;
};

} // namespace tavrin
