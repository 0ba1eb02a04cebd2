#pragma once

#include <functional>
#include <list>
#include <string>
#include <string_view>

#include <zlib.h>

namespace platform {

/// Decodes the content codings of a response (RFC 9110, 8.4) as its bytes arrive: "gzip", also with several members,
/// and "deflate", with or without a zlib header. Ignores unknown codings: some servers send "Content-Encoding: utf-8"
/// with a plain body. Refuses a body whose codings pass on more than `kMaximumBetween`: a few bytes with several
/// codings could keep a thread busy for hours, and yield nothing. One thread at a time.
class ContentDecoder {
public:
    /// The supported codings, for Accept-Encoding.
    static constexpr std::string_view kAccepted = "gzip, deflate";
    /// Limit, in bytes, of what the codings of a body pass to each other, in all.
    static constexpr std::size_t kMaximumBetween = 64u << 20;
    /// Receives decoded bytes; returns false to stop decoding.
    using Sink = std::function<bool(std::string_view)>;

    /// `codings` is the value of Content-Encoding: the codings in the order in which they were applied.
    explicit ContentDecoder(std::string_view codings = {});

    /// Returns false if there is no coding: `feed` passes bytes unchanged.
    [[nodiscard]] bool decodes() const { return !_stages.empty(); }
    /// Decodes the next bytes. Returns false if they don't fit the coding, are too many between two codings, or if
    /// the sink returned false.
    [[nodiscard]] bool feed(std::string_view bytes, const Sink& sink);
    /// Returns true if every coding has reached its end, or nothing was fed: the decoded body is complete.
    [[nodiscard]] bool finished() const;

private:
    /// Decodes one coding. `z_stream` must not move.
    class Stage {
    public:
        explicit Stage(bool gzip) : _gzip(gzip) {}
        ~Stage() { inflateEnd(&_stream); }
        Stage(const Stage&) = delete;
        Stage& operator=(const Stage&) = delete;

        [[nodiscard]] bool feed(std::string_view bytes, const Sink& sink);
        [[nodiscard]] bool finished() const { return _state != State::Inside && (_anyEnded || _start.empty()); }

    private:
        /// Before: too few bytes to know the format. After: the coding has ended; further bytes are ignored.
        enum class State { Before, Inside, After };

        [[nodiscard]] bool begin();

        z_stream _stream{};
        const bool _gzip;
        State _state = State::Before;
        bool _anyEnded = false; ///< a gzip member, or the deflate stream, has ended
        std::string _start;     ///< the bytes of state Before
    };

    [[nodiscard]] bool feed(std::list<Stage>::iterator stage, std::string_view bytes, const Sink& sink);

    std::size_t _between = 0; // bytes that stages have passed to each other
    std::list<Stage> _stages; // in decoding order: the coding applied last comes first
};

} // namespace platform
