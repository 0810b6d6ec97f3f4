#include "lib/unix_socket.hpp"

#include <sys/socket.h>
#include <sys/time.h>
#include <sys/un.h>
#include <unistd.h>

#include <cerrno>

#include "common/socket.hpp"

namespace {

int Fail(UnixFailure* failed, UnixStep step, int error)
{
    if (failed != nullptr)
        *failed = UnixFailure {step, error};
    return -1;
}

// Closes fd and reports the step that failed with the errno it met.
int CloseAndFail(int fd, UnixFailure* failed, UnixStep step)
{
    const int error = errno;
    close(fd);
    return Fail(failed, step, error);
}

// Fills addr for path and creates a socket of type; the descriptor, or -1
// with *failed filled in.
int NewSocket(const char* path, int type, sockaddr_un& addr, UnixFailure* failed)
{
    if (!SocketFillAddress(addr, path))
        return Fail(failed, UnixStep::Path, ENAMETOOLONG);
    const int fd = socket(AF_UNIX, type | SOCK_CLOEXEC, 0);
    return fd >= 0 ? fd : Fail(failed, UnixStep::Socket, errno);
}

}  // namespace

int UnixBind(const char* path, int type, int backlog, UnixFailure* failed)
{
    sockaddr_un addr;
    const int fd = NewSocket(path, type, addr, failed);
    if (fd < 0)
        return -1;
    unlink(path);
    if (bind(fd, reinterpret_cast<const sockaddr*>(&addr), SOCKET_ADDRESS_LENGTH) != 0)
        return CloseAndFail(fd, failed, UnixStep::Bind);
    const int base = type & ~(SOCK_NONBLOCK | SOCK_CLOEXEC);
    if (base == SOCK_STREAM && listen(fd, backlog) != 0) {
        CloseAndFail(fd, failed, UnixStep::Listen);
        unlink(path);
        return -1;
    }
    return fd;
}

int UnixConnect(const char* path, int type, int sendTimeoutMs, UnixFailure* failed)
{
    sockaddr_un addr;
    const int fd = NewSocket(path, type, addr, failed);
    if (fd < 0)
        return -1;
    if (sendTimeoutMs > 0) {
        const timeval limit {sendTimeoutMs / 1000, static_cast<suseconds_t>(sendTimeoutMs % 1000) * 1000};
        if (setsockopt(fd, SOL_SOCKET, SO_SNDTIMEO, &limit, sizeof limit) != 0)
            return CloseAndFail(fd, failed, UnixStep::Option);
    }
    if (connect(fd, reinterpret_cast<const sockaddr*>(&addr), SOCKET_ADDRESS_LENGTH) != 0)
        return CloseAndFail(fd, failed, UnixStep::Connect);
    return fd;
}

bool UnixSomeoneListens(const char* path)
{
    const int fd = UnixConnect(path, SOCK_STREAM, 0, nullptr);
    if (fd < 0)
        return false;
    close(fd);
    return true;
}
