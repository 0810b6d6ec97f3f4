#include "unix_client.hpp"

#include <poll.h>
#include <sys/un.h>
#include <unistd.h>

#include <cstring>

namespace vt {

namespace {

// A socket of the given type and the address of path, or -1 when the path
// does not fit or no socket can be had.
int OpenFor(const std::string& path, int type, sockaddr_un& addr)
{
    std::memset(&addr, 0, sizeof addr);
    addr.sun_family = AF_UNIX;
    if (path.size() >= sizeof addr.sun_path)
        return -1;
    std::memcpy(addr.sun_path, path.c_str(), path.size());
    return socket(AF_UNIX, type | SOCK_CLOEXEC, 0);
}

}  // namespace

int ConnectUnix(const std::string& path, int type)
{
    sockaddr_un addr;
    const int fd = OpenFor(path, type, addr);
    if (fd >= 0 && connect(fd, reinterpret_cast<sockaddr*>(&addr), sizeof addr) != 0) {
        close(fd);
        return -1;
    }
    return fd;
}

int BindUnix(const std::string& path, int type)
{
    sockaddr_un addr;
    const int fd = OpenFor(path, type, addr);
    if (fd < 0)
        return -1;
    unlink(path.c_str());
    if (bind(fd, reinterpret_cast<sockaddr*>(&addr), sizeof addr) != 0 ||
        (type == SOCK_STREAM && listen(fd, 8) != 0)) {
        close(fd);
        return -1;
    }
    return fd;
}

int SendAction(std::int32_t code)
{
    const int fd = ConnectUnix("/tmp/vexoctrl");
    if (fd < 0)
        return -1;
    if (write(fd, &code, sizeof code) != static_cast<ssize_t>(sizeof code)) {
        close(fd);
        return -1;
    }
    return fd;
}

bool Readable(int fd, int timeoutMs)
{
    pollfd pfd {fd, POLLIN, 0};
    return poll(&pfd, 1, timeoutMs) == 1;
}

}  // namespace vt
