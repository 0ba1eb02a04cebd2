#include "platform/ipc/ListenSocket.h"

#include <cerrno>
#include <cstring>
#include <fcntl.h>
#include <sys/file.h>
#include <sys/random.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

#include <fmt/format.h>
#include <systemd/sd-daemon.h>

#include "platform/ipc/IpcLog.h"

namespace platform::ipc {

namespace {

std::unexpected<Error> failure(int errnum, const std::filesystem::path& path)
{
    return std::unexpected(Error::posix(errnum, path.native()));
}

Result<sockaddr_un> addressOf(const std::filesystem::path& path)
{
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    if (path.native().size() >= sizeof(address.sun_path)) return failure(ENAMETOOLONG, path);
    std::strcpy(address.sun_path, path.c_str());
    return address;
}

const sockaddr* asSockaddr(const sockaddr_un& address)
{
    return reinterpret_cast<const sockaddr*>(&address);
}

FileHandle streamSocket()
{
    return FileHandle(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
}

enum class Occupant { None, Dead, Alive, NotASocket };

/// Returns what is at a socket path. A listener with a full backlog counts as alive.
Result<Occupant> occupantOf(const std::filesystem::path& path)
{
    struct stat status{};
    if (lstat(path.c_str(), &status) != 0) {
        if (errno == ENOENT) return Occupant::None;
        return failure(errno, path);
    }
    if (!S_ISSOCK(status.st_mode)) return Occupant::NotASocket;

    auto address = addressOf(path);
    if (!address) return std::unexpected(std::move(address.error()));
    const FileHandle probe = streamSocket();
    if (!probe) return failure(errno, path);
    if (connect(probe.fd(), asSockaddr(*address), sizeof(*address)) == 0 || errno == EAGAIN) return Occupant::Alive;
    if (errno == ECONNREFUSED) return Occupant::Dead;
    if (errno == ENOENT) return Occupant::None;
    return failure(errno, path);
}

Result<FileHandle> bindAndListen(const std::filesystem::path& path)
{
    auto address = addressOf(path);
    if (!address) return std::unexpected(std::move(address.error()));
    FileHandle socket = streamSocket();
    // bind creates the file with the socket's mode, so the file never has a wider one.
    if (!socket || fchmod(socket.fd(), 0600) != 0 || bind(socket.fd(), asSockaddr(*address), sizeof(*address)) != 0 ||
        listen(socket.fd(), SOMAXCONN) != 0)
        return failure(errno, path);
    return socket;
}

} // namespace

ListenSocket::ListenSocket(FileHandle socket, std::filesystem::path path, bool owned, FileHandle lock)
    : _socket(std::move(socket)), _lock(std::move(lock)), _path(std::move(path)), _owned(owned)
{}

ListenSocket::ListenSocket(ListenSocket&& other) noexcept
    : _socket(std::move(other._socket)), _lock(std::move(other._lock)), _path(std::move(other._path)),
      _owned(std::exchange(other._owned, false))
{}

ListenSocket::~ListenSocket()
{
    unlinkPath();
}

void ListenSocket::unlinkPath()
{
    if (std::exchange(_owned, false)) unlink(_path.c_str());
}

Result<ListenSocket> ListenSocket::bindExclusive(const std::filesystem::path& path)
{
    if (auto prepared = preparePrivateDirectory(path.parent_path()); !prepared)
        return std::unexpected(std::move(prepared.error()));

    std::filesystem::path lockPath = path;
    lockPath += ".lock";
    FileHandle lock(open(lockPath.c_str(), O_RDWR | O_CREAT | O_CLOEXEC | O_NOFOLLOW, 0600));
    if (!lock) return failure(errno, lockPath);
    if (flock(lock.fd(), LOCK_EX | LOCK_NB) != 0) return failure(errno == EWOULDBLOCK ? EADDRINUSE : errno, path);

    const auto occupant = occupantOf(path);
    if (!occupant) return std::unexpected(occupant.error());
    switch (*occupant) {
    case Occupant::Alive: return failure(EADDRINUSE, path);
    case Occupant::NotASocket: return failure(EEXIST, path);
    case Occupant::Dead: unlink(path.c_str()); break;
    case Occupant::None: break;
    }
    auto socket = bindAndListen(path);
    if (!socket) return std::unexpected(std::move(socket.error()));
    return ListenSocket(std::move(*socket), path, true, std::move(lock));
}

Result<ListenSocket> ListenSocket::bindUnguessable(const std::filesystem::path& directory, std::string_view prefix)
{
    if (auto prepared = preparePrivateDirectory(directory); !prepared)
        return std::unexpected(std::move(prepared.error()));

    std::uint64_t random[2];
    if (getrandom(random, sizeof(random), 0) != sizeof(random)) return failure(errno, directory);
    const auto path = directory / fmt::format("{}{:016x}{:016x}", prefix, random[0], random[1]);
    auto socket = bindAndListen(path);
    if (!socket) return std::unexpected(std::move(socket.error()));
    return ListenSocket(std::move(*socket), path, true);
}

std::optional<ListenSocket> ListenSocket::fromServiceManager()
{
    const int count = sd_listen_fds(0);
    for (int fd = SD_LISTEN_FDS_START; fd < SD_LISTEN_FDS_START + count; ++fd) {
        if (sd_is_socket_unix(fd, SOCK_STREAM, 1, nullptr, 0) <= 0) continue;
        FileHandle socket(fd);
        fcntl(fd, F_SETFL, fcntl(fd, F_GETFL) | O_NONBLOCK);
        sockaddr_un address{};
        socklen_t length = sizeof(address) - 1; // the kernel may not terminate the path
        if (getsockname(fd, reinterpret_cast<sockaddr*>(&address), &length) != 0) continue;
        return ListenSocket(std::move(socket), address.sun_path, false);
    }
    return std::nullopt;
}

Result<void> preparePrivateDirectory(const std::filesystem::path& directory)
{
    if (directory.has_parent_path() && directory.has_relative_path()) {
        std::error_code ignored;
        if (!std::filesystem::exists(directory.parent_path(), ignored))
            if (auto parent = preparePrivateDirectory(directory.parent_path()); !parent) return parent;
    }
    if (mkdir(directory.c_str(), 0700) != 0 && errno != EEXIST) return failure(errno, directory);

    const FileHandle handle(open(directory.c_str(), O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
    struct stat status{};
    if (!handle || fstat(handle.fd(), &status) != 0) return failure(errno, directory);
    if (status.st_uid != geteuid()) return failure(EPERM, directory);
    if ((status.st_mode & 0077) != 0 && fchmod(handle.fd(), 0700) != 0) return failure(errno, directory);
    return {};
}

void sweepDeadSockets(const std::filesystem::path& directory, std::string_view prefix)
{
    std::error_code error;
    for (std::filesystem::directory_iterator entry(directory, error), end; !error && entry != end;
         entry.increment(error)) {
        if (!entry->path().filename().native().starts_with(prefix)) continue;
        if (occupantOf(entry->path()) != Occupant::Dead) continue;
        kLog.info("removing {}, the socket of a dead process", entry->path().native());
        unlink(entry->path().c_str());
    }
}

std::optional<PeerCredentials> peerCredentials(int fd)
{
    ucred credentials{};
    socklen_t length = sizeof(credentials);
    if (getsockopt(fd, SOL_SOCKET, SO_PEERCRED, &credentials, &length) != 0) return std::nullopt;
    return PeerCredentials{credentials.pid, credentials.uid};
}

std::string busAddress(const std::filesystem::path& path)
{
    std::string address = "unix:path=";
    for (const char c : path.native()) {
        const bool plain = (c >= '0' && c <= '9') || (c >= 'A' && c <= 'Z') || (c >= 'a' && c <= 'z') ||
                           std::strchr("-_/.\\*", c) != nullptr;
        if (plain)
            address += c;
        else
            address += fmt::format("%{:02x}", static_cast<unsigned char>(c));
    }
    return address;
}

} // namespace platform::ipc
