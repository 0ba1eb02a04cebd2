#pragma once

#include <filesystem>
#include <optional>
#include <string>
#include <sys/types.h>

#include "platform/base/FileHandle.h"
#include "platform/values/Error.h"

namespace platform::ipc {

/// A listening Unix stream socket. If it was bound here it owns its path, and removes it when it is destroyed.
class ListenSocket {
public:
    /// Binds `path` with mode 0600, in a directory that `preparePrivateDirectory` accepts. Replaces a
    /// socket that no process listens on; fails with EADDRINUSE if one does, and with EEXIST for any other file. A lock
    /// file beside the socket, held as long as the socket, decides between two processes that try at once.
    [[nodiscard]] static Result<ListenSocket> bindExclusive(const std::filesystem::path& path);
    /// Binds an unguessable name in `directory`: `prefix` and 128 random bits in hex.
    [[nodiscard]] static Result<ListenSocket> bindUnguessable(const std::filesystem::path& directory,
                                                              std::string_view prefix);
    /// The first listening Unix stream socket that the service manager passed to this process; nothing if it passed
    /// none. The manager keeps the path.
    [[nodiscard]] static std::optional<ListenSocket> fromServiceManager();

    ListenSocket(ListenSocket&& other) noexcept;
    ListenSocket& operator=(ListenSocket&&) = delete;
    ~ListenSocket();

    /// Non-blocking, closed on exec.
    [[nodiscard]] int fd() const { return _socket.fd(); }
    [[nodiscard]] const std::filesystem::path& path() const { return _path; }
    /// Removes the path, if this socket owns it; the socket stays open.
    void unlinkPath();

private:
    ListenSocket(FileHandle socket, std::filesystem::path path, bool owned, FileHandle lock = {});

    FileHandle _socket;
    FileHandle _lock;
    std::filesystem::path _path;
    bool _owned;
};

/// Makes a directory of mode 0700, and its missing parents. If it exists it must be a directory of this user, not a
/// link; its mode becomes 0700.
[[nodiscard]] Result<void> preparePrivateDirectory(const std::filesystem::path& directory);

/// Removes the sockets in `directory` whose names begin with `prefix` and that no process listens on.
void sweepDeadSockets(const std::filesystem::path& directory, std::string_view prefix);

/// The process that connected a socket, from the kernel.
struct PeerCredentials {
    pid_t pid = 0;
    uid_t uid = 0;
};
[[nodiscard]] std::optional<PeerCredentials> peerCredentials(int fd);

/// Whether a peer of user `peer` may connect to a service of user `own`: only if they are the same.
[[nodiscard]] constexpr bool mayConnect(uid_t peer, uid_t own)
{
    return peer == own;
}

/// The D-Bus address of a socket path: "unix:path=…", escaped where addresses demand it.
[[nodiscard]] std::string busAddress(const std::filesystem::path& path);

} // namespace platform::ipc
