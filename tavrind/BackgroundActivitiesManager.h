#pragma once

#include <functional>

namespace tavrin {

struct Assembly;

/// Uploads closed sessions from time to time, or on demand. There are none. Any thread.
class BackgroundActivitiesManager {
public:
    explicit BackgroundActivitiesManager(Assembly& assembly) : _assembly(assembly) {}
    /// Runs one pass, then calls back.
    void insertFlushActivity(std::move_only_function<void()> callback)
    {
        if (callback) callback();
    }

private:
    [[maybe_unused]] Assembly& _assembly;
};

} // namespace tavrin
