#include "lib/log_sink.hpp"

#include <sys/socket.h>
#include <sys/stat.h>

#include <cstring>

int LogSinkOpen(UnixFailure* failed, const char* path)
{
    const int fd = UnixBind(path, SOCK_DGRAM, 0, failed);
    if (fd >= 0)
        chmod(path, 0666);
    return fd;
}

ssize_t LogSinkReceive(int fd, char* buf, std::size_t size)
{
    const ssize_t n = recv(fd, buf, size - 1, 0);
    if (n < 0)
        return -1;
    std::size_t len = static_cast<std::size_t>(n);
    while (len > 0 && (buf[len - 1] == '\n' || buf[len - 1] == '\0'))
        --len;
    buf[len] = '\0';
    return static_cast<ssize_t>(len);
}

const char* LogSinkText(const char* message)
{
    const char* p = message;
    if (*p == '<') {
        const char* gt = std::strchr(p, '>');
        if (gt != nullptr)
            p = gt + 1;
    }
    // The time stamp is 15 characters and holds colons of its own.
    if (std::strlen(p) > 16) {
        const char* colon = std::strstr(p + 16, ": ");
        if (colon != nullptr)
            return colon + 2;
    }
    return p;
}
