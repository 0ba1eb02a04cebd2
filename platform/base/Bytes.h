#pragma once

#include <cstddef>
#include <memory>
#include <string>
#include <string_view>

namespace platform {

/// An immutable run of bytes: a response body, a mapped file, an upload.
///
/// Copies share the bytes and their owner (a string, a mapping); the last of them releases it. Any thread.
class Bytes {
public:
    Bytes() = default;

    /// Takes over the string's contents.
    explicit Bytes(std::string contents)
    {
        auto owned = std::make_shared<const std::string>(std::move(contents));
        _view = *owned;
        _owner = std::move(owned);
    }

    /// Refers to the bytes at `view`, which `owner` keeps alive.
    Bytes(std::shared_ptr<const void> owner, std::string_view view) : _owner(std::move(owner)), _view(view) {}

    [[nodiscard]] std::string_view view() const { return _view; }
    [[nodiscard]] const char* data() const { return _view.data(); }
    [[nodiscard]] std::size_t size() const { return _view.size(); }
    [[nodiscard]] bool empty() const { return _view.empty(); }

    friend bool operator==(const Bytes& a, const Bytes& b) { return a._view == b._view; }

private:
    std::shared_ptr<const void> _owner;
    std::string_view _view;
};

} // namespace platform
