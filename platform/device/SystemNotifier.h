#pragma once

#include <string>

namespace platform {

/// Tells other processes of the user that something happened, by name: a signal on the session bus.
class SystemNotifier {
public:
    virtual ~SystemNotifier() = default;
    /// Posts `name` ("com.example.changed"); nothing where there is no session bus. Any thread.
    virtual void post(const std::string& name) = 0;
};

} // namespace platform
