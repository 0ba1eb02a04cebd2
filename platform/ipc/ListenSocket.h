#pragma once

#include <filesystem>
#include <optional>
#include <string>
#include <sys/types.h>

#include "platform/base/FileHandle.h"
#include "platform/values/Error.h"

namespace platform::ipc {

/// A listening Unix stream socket. One that was bound here owns its path: both go with it.
class ListenSocket {
public:
    /// Binds `path` with mode 0600, in a directory that `preparePrivateDirectory` accepts. A socket that nobody answers
    /// is replaced; one that somebody does is EADDRINUSE; anything else at that path is left alone (EEXIST). Two
    /// processes that try at once are told apart by a lock file beside the socket, held as long as the socket.
    [[nodiscard]] static Result<ListenSocket> bindExclusive(const std::filesystem::path& path);
    /// Binds a name in `directory` that nobody can guess: `prefix` and 128 random bits in hex.
    [[nodiscard]] static Result<ListenSocket> bindUnguessable(const std::filesystem::path& directory,
                                                              std::string_view prefix);
    /// The first listening Unix stream socket that the service manager passed to this process. Its path stays the
    /// manager's. Nothing if there is none.
    [[nodiscard]] static std::optional<ListenSocket> fromServiceManager();

    ListenSocket(ListenSocket&& other) noexcept;
    ListenSocket& operator=(ListenSocket&&) = delete;
    ~ListenSocket();

    /// Non-blocking, closed on exec.
    [[nodiscard]] int fd() const { return _socket.fd(); }
    [[nodiscard]] const std::filesystem::path& path() const { return _path; }
    /// Removes the path, where it is ours; the socket stays open.
    void unlinkPath();

private:
    ListenSocket(FileHandle socket, std::filesystem::path path, bool owned, FileHandle lock = {});

    FileHandle _socket;
    FileHandle _lock;
    std::filesystem::path _path;
    bool _owned;
};

/// Makes a directory of mode 0700, and what is missing above it. One that is there must be a directory of this user; it
/// is closed to others.
[[nodiscard]] Result<void> preparePrivateDirectory(const std::filesystem::path& directory);

/// Removes the sockets in `directory` whose names begin with `prefix` and that nobody answers any more.
void sweepDeadSockets(const std::filesystem::path& directory, std::string_view prefix);

/// The process at the other end of a connected socket, as the kernel knows it.
struct PeerCredentials {
    pid_t pid = 0;
    uid_t uid = 0;
};
[[nodiscard]] std::optional<PeerCredentials> peerCredentials(int fd);

/// Whether a peer may talk to a service of user `own`: only that user's own processes.
[[nodiscard]] constexpr bool mayConnect(uid_t peer, uid_t own)
{
    return peer == own;
}

/// The D-Bus address of a socket path: "unix:path=…", escaped where addresses demand it.
[[nodiscard]] std::string busAddress(const std::filesystem::path& path);

} // namespace platform::ipc
