#pragma once

#include <filesystem>
#include <optional>
#include <string>
#include <sys/types.h>

#include "platform/base/FileHandle.h"
#include "platform/values/Error.h"

namespace platform::ipc {

/// A listening Unix stream socket. Owns its path if it bound it, and removes it on destruction. One thread at a time.
class ListenSocket {
public:
    /// Binds `path` with mode 0600, in a directory that `preparePrivateDirectory` accepts. Replaces a socket that no
    /// process listens on; fails with EADDRINUSE if one does, and with EEXIST for any other file. Holds a lock on
    /// "PATH.lock" until destroyed, so that only one of two processes that try at once succeeds.
    [[nodiscard]] static Result<ListenSocket> bindExclusive(const std::filesystem::path& path);
    /// Binds an unguessable name in `directory`: `prefix` and 128 random bits in hex.
    [[nodiscard]] static Result<ListenSocket> bindUnguessable(const std::filesystem::path& directory,
                                                              std::string_view prefix);
    /// Returns the first listening Unix stream socket that the service manager passed (sd_listen_fds), or nothing. The
    /// manager owns the path.
    [[nodiscard]] static std::optional<ListenSocket> fromServiceManager();

    ListenSocket(ListenSocket&& other) noexcept;
    ListenSocket& operator=(ListenSocket&&) = delete;
    ~ListenSocket();

    /// Returns the descriptor: non-blocking, close-on-exec.
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

/// Creates a directory and its missing parents, mode 0700. An existing one gets mode 0700; fails with EPERM if another
/// user owns it, and with ENOTDIR if it is a file or a symbolic link.
[[nodiscard]] Result<void> preparePrivateDirectory(const std::filesystem::path& directory);

/// Removes the sockets in `directory` whose names begin with `prefix` and that no process listens on.
void sweepDeadSockets(const std::filesystem::path& directory, std::string_view prefix);

/// The process that connected a socket, as the kernel reports it (SO_PEERCRED).
struct PeerCredentials {
    pid_t pid = 0;
    uid_t uid = 0;
};
[[nodiscard]] std::optional<PeerCredentials> peerCredentials(int fd);

/// Returns true if a peer of user `peer` may connect to a service of user `own`: only the same user may.
[[nodiscard]] constexpr bool mayConnect(uid_t peer, uid_t own)
{
    return peer == own;
}

/// Returns the D-Bus address of a socket path, "unix:path=…", escaped as D-Bus addresses require.
[[nodiscard]] std::string busAddress(const std::filesystem::path& path);

} // namespace platform::ipc
