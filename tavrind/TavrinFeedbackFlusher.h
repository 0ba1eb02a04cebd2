#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <string_view>

namespace tavrin {

struct Assembly;
struct ZRFeedback;

/// "crowdsourcing" for 0, "Feedbacks" for 1, else the empty text.
[[nodiscard]] std::string_view convertIdentifierToString(std::uint64_t identifier);

/// Sends feedback to the service. It keeps nothing. Any thread.
class TavrinFeedbackFlusher {
public:
    TavrinFeedbackFlusher(Assembly& assembly, std::uint64_t identifier) : _assembly(assembly), _identifier(identifier)
    {}

    [[nodiscard]] std::uint64_t identifier() const { return _identifier; }
    /// Takes a record, then calls back.
    void flush(std::shared_ptr<ZRFeedback> record, std::move_only_function<void()> callback);

private:
    [[maybe_unused]] Assembly& _assembly;
    std::uint64_t _identifier;
};

} // namespace tavrin
