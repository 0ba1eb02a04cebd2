#pragma once

#include <map>
#include <memory>
#include <string>

namespace platform {

/// Named spans of work during which the process would rather not be stopped. Counted, and visible in diagnostics; a
/// service manager that asks can see what is going on. Any thread.
class Transactions {
public:
    /// Ends its transaction when destroyed. May outlive the registry.
    class [[nodiscard]] Token {
    public:
        Token() = default;
        Token(Token&&) noexcept = default;
        Token& operator=(Token&&) noexcept = default;

    private:
        friend class Transactions;
        std::shared_ptr<void> _end;
    };

    Transactions();
    Token begin(std::string name);
    /// The open transactions, by name.
    [[nodiscard]] std::map<std::string, int> open() const;

private:
    struct State;
    std::shared_ptr<State> _state;
};

} // namespace platform
