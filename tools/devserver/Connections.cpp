#include "tools/devserver/Connections.h"

#include <arpa/inet.h>
#include <charconv>
#include <filesystem>
#include <netinet/in.h>
#include <string>
#include <sys/socket.h>
#include <system_error>
#include <vector>

namespace devserver {
namespace {

using NameOf = int (*)(int, sockaddr*, socklen_t*) noexcept;

/// The port of one end of a TCP connection; -1 for anything else.
int portOf(int fd, NameOf nameOf)
{
    sockaddr_storage address{};
    socklen_t length = sizeof address;
    if (nameOf(fd, reinterpret_cast<sockaddr*>(&address), &length) != 0) return -1;
    if (address.ss_family == AF_INET) return ntohs(reinterpret_cast<const sockaddr_in&>(address).sin_port);
    if (address.ss_family == AF_INET6) return ntohs(reinterpret_cast<const sockaddr_in6&>(address).sin6_port);
    return -1;
}

std::vector<int> openDescriptors()
{
    std::vector<int> descriptors;
    std::error_code error;
    for (std::filesystem::directory_iterator entry("/proc/self/fd", error), end; !error && entry != end;
         entry.increment(error)) {
        const std::string name = entry->path().filename();
        int fd = -1;
        if (std::from_chars(name.data(), name.data() + name.size(), fd).ec == std::errc()) descriptors.push_back(fd);
    }
    return descriptors;
}

} // namespace

int connectionBetween(int localPort, int remotePort)
{
    for (const int fd : openDescriptors())
        if (portOf(fd, getsockname) == localPort && portOf(fd, getpeername) == remotePort) return fd;
    return -1;
}

void shutDownConnections(int localPort)
{
    for (const int fd : openDescriptors())
        if (portOf(fd, getsockname) == localPort && portOf(fd, getpeername) > 0) shutdown(fd, SHUT_RDWR);
}

} // namespace devserver
