#pragma once

#include <map>
#include <memory>
#include <string>

namespace platform {

/// Counts named spans of work during which the process should not be stopped, for diagnostics. Any thread.
class Transactions {
public:
    /// Ends its transaction when destroyed. May outlive the `Transactions`.
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
    /// Opens a transaction; several may have the same name.
    Token begin(std::string name);
    /// Returns the number of open transactions by name, without zeros.
    [[nodiscard]] std::map<std::string, int> open() const;

private:
    struct State;
    std::shared_ptr<State> _state;
};

} // namespace platform
