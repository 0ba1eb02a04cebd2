#pragma once

#include <functional>
#include <memory>
#include <string_view>

namespace tavrin {

/// Compresses bytes as raw DEFLATE (RFC 1951, without a header). One thread at a time.
class Deflater {
public:
    /// Creates one that uses ISA-L, or zlib if this build has no ISA-L.
    [[nodiscard]] static std::unique_ptr<Deflater> make();
    [[nodiscard]] static std::unique_ptr<Deflater> makeWithZlib();
    virtual ~Deflater() = default;

    /// Receives compressed bytes, at most 4,096 at a time. Returns false to stop.
    using Take = std::function<bool(std::string_view)>;
    /// Compresses `bytes`, and passes on what is complete. The last call, which may have no bytes, passes on the rest.
    /// Returns false if `take` did; the deflater is then unusable.
    virtual bool write(std::string_view bytes, bool isLast, const Take& take) = 0;
};

} // namespace tavrin
