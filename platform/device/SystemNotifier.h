#pragma once

#include <string>

namespace platform {

/// Tells other processes of the user that something happened, by name. Any thread.
class SystemNotifier {
public:
    virtual ~SystemNotifier() = default;
    /// Posts `name` ("com.example.changed") later, if anything can receive it.
    virtual void post(const std::string& name) = 0;
};

} // namespace platform
