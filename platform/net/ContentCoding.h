#pragma once

#include <functional>
#include <list>
#include <string>
#include <string_view>

#include <zlib.h>

namespace platform {

/// Undoes the content codings of an answer (RFC 9110, 8.4) while its bytes arrive: "gzip", also of several members,
/// and "deflate", with and without a zlib header. A coding that it doesn't know counts as none: servers send
/// "Content-Encoding: utf-8" and mean no coding. One thread at a time.
class ContentDecoder {
public:
    /// The codings it knows, for Accept-Encoding.
    static constexpr std::string_view kAccepted = "gzip, deflate";
    /// Takes decoded bytes; false ends the decoding.
    using Sink = std::function<bool(std::string_view)>;

    /// `codings` is the list of Content-Encoding, in the order in which the codings were applied.
    explicit ContentDecoder(std::string_view codings = {});

    /// False if there is nothing to undo: bytes go to the sink as they are.
    [[nodiscard]] bool decodes() const { return !_stages.empty(); }
    /// Decodes the next bytes. False if they aren't what the coding says, or if the sink returned false.
    [[nodiscard]] bool feed(std::string_view bytes, const Sink& sink);
    /// True if every coding has reached its own end, or nothing was fed: what was decoded is whole.
    [[nodiscard]] bool finished() const;

private:
    /// Undoes one coding. `z_stream` must not move.
    class Stage {
    public:
        explicit Stage(bool gzip) : _gzip(gzip) {}
        ~Stage() { inflateEnd(&_stream); }
        Stage(const Stage&) = delete;
        Stage& operator=(const Stage&) = delete;

        [[nodiscard]] bool feed(std::string_view bytes, const Sink& sink);
        [[nodiscard]] bool finished() const { return _state != State::Inside && (_anyEnded || _start.empty()); }

    private:
        /// Before: fewer bytes are there than tell what follows. Behind: what follows the end is ignored.
        enum class State { Before, Inside, Behind };

        [[nodiscard]] bool begin();

        z_stream _stream{};
        const bool _gzip;
        State _state = State::Before;
        bool _anyEnded = false; ///< a member, or the only stream
        std::string _start;     ///< the bytes seen in state Before
    };

    [[nodiscard]] bool feed(std::list<Stage>::iterator stage, std::string_view bytes, const Sink& sink);

    std::list<Stage> _stages; // the coding to undo first is the first
};

} // namespace platform
