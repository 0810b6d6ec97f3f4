#include "unix_client.hpp"

#include <poll.h>
#include <sys/un.h>
#include <unistd.h>

#include <cstring>

namespace vt {

namespace {

bool Fill(sockaddr_un& addr, const std::string& path)
{
    std::memset(&addr, 0, sizeof addr);
    addr.sun_family = AF_UNIX;
    if (path.size() >= sizeof addr.sun_path)
        return false;
    std::memcpy(addr.sun_path, path.c_str(), path.size());
    return true;
}

}  // namespace

int ConnectUnix(const std::string& path, int type)
{
    sockaddr_un addr;
    if (!Fill(addr, path))
        return -1;
    const int fd = socket(AF_UNIX, type | SOCK_CLOEXEC, 0);
    if (fd < 0)
        return -1;
    if (connect(fd, reinterpret_cast<sockaddr*>(&addr), sizeof addr) != 0) {
        close(fd);
        return -1;
    }
    return fd;
}

int BindUnix(const std::string& path, int type)
{
    sockaddr_un addr;
    if (!Fill(addr, path))
        return -1;
    const int fd = socket(AF_UNIX, type | SOCK_CLOEXEC, 0);
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
