#pragma once

#include <string>

namespace platform {

/// Posts named events to the user's other processes. Any thread.
class SystemNotifier {
public:
    virtual ~SystemNotifier() = default;
    /// Posts `name` ("com.example.changed") asynchronously. A failure is logged only.
    virtual void post(const std::string& name) = 0;
};

} // namespace platform
