#pragma once

#include <functional>
#include <memory>
#include <string>

namespace platform {
struct Error;
}

namespace tavrin {

struct Assembly;
struct TavrinFeedback;
class ClientSession;
class TavrinUserGUIDController;

/// Where feedback goes: it decides when a session begins and ends. It keeps no feedback, so there is no session. Any
/// thread.
class ClientSessionManager {
public:
    /// `identifier` is used in log lines.
    ClientSessionManager(Assembly& assembly, std::shared_ptr<TavrinUserGUIDController> guidController,
                         std::string identifier);
    virtual ~ClientSessionManager() = default;

    virtual void addTavrinFeedback(std::shared_ptr<TavrinFeedback> feedback);
    /// The current session; null for none.
    [[nodiscard]] std::shared_ptr<ClientSession> session() const { return nullptr; }
    /// Ends the session, then calls back.
    void flushSession(std::move_only_function<void()> callback);
    /// A connection has gone. With a shared session that ends nothing and the callback gets false; else the session is
    /// flushed, then it gets true.
    void flushSessionInvalidation(const std::string& userAgent, std::move_only_function<void(bool flushed)> callback);

    /// The daemon's own user agent, "tavrind/VERSION".
    [[nodiscard]] static const std::string& tavrindUserAgent();
    /// An error of the daemon's as a feedback record of the current user.
    [[nodiscard]] static std::shared_ptr<TavrinFeedback> errorFeedback(const platform::Error& error,
                                                                       Assembly& assembly);
    /// Hands that record to the assembly's session manager, if there is one yet.
    static void reportErrorAsTavrindFeedback(const platform::Error& error, Assembly& assembly);

private:
    Assembly& _assembly;
    std::shared_ptr<TavrinUserGUIDController> _guidController;
    std::string _identifier;
};

} // namespace tavrin
