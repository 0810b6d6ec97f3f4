#include "lib/action_send.hpp"

#include <poll.h>
#include <sys/socket.h>
#include <unistd.h>

#include <cerrno>

#include "lib/unix_socket.hpp"

namespace {

ActionSendStatus ConnectStatus(const UnixFailure& failed)
{
    switch (failed.step) {
    case UnixStep::Path:
    case UnixStep::Socket:
        return ActionSendStatus::NoSocket;
    case UnixStep::Option:
        return ActionSendStatus::NoTimeout;
    default:
        return failed.error == ENOENT || failed.error == ECONNREFUSED ? ActionSendStatus::NotRunning
                                                                      : ActionSendStatus::NotAccepting;
    }
}

// Waits for the daemon to hang up on fd: end of stream (or a reset, when it
// closed with bytes of ours unread) says that it read the connection.
ActionSendResult AwaitHangUp(int fd, int timeoutMs)
{
    pollfd pfd {fd, POLLIN, 0};
    int ready;
    do
        ready = poll(&pfd, 1, timeoutMs);
    while (ready < 0 && errno == EINTR);
    if (ready == 0)
        return {ActionSendStatus::TimedOut, ETIMEDOUT};
    if (ready < 0)
        return {ActionSendStatus::NoAnswer, errno};
    char byte;
    const ssize_t got = recv(fd, &byte, 1, 0);
    if (got == 0 || (got < 0 && errno == ECONNRESET))
        return {ActionSendStatus::Taken, 0};
    if (got > 0)
        return {ActionSendStatus::Replied, 0};
    return {ActionSendStatus::NoAnswer, errno};
}

}  // namespace

ActionSendResult ActionSend(RcAction action, int timeoutMs, const char* path)
{
    return ActionSendBytes(&action, sizeof action, timeoutMs, path);
}

ActionSendResult ActionSendBytes(const void* bytes, std::size_t size, int timeoutMs, const char* path)
{
    // The time-out also bounds the connect: a daemon whose listening queue
    // is full would otherwise hold it for good.
    UnixFailure failed;
    const int fd = UnixConnect(path, SOCK_STREAM, timeoutMs, &failed);
    if (fd < 0)
        return {ConnectStatus(failed), failed.error};
    ActionSendResult result;
    if (size == 0 ? shutdown(fd, SHUT_WR) != 0
                  : send(fd, bytes, size, MSG_NOSIGNAL) != static_cast<ssize_t>(size))
        result = {ActionSendStatus::SendFailed, errno};
    else
        result = AwaitHangUp(fd, timeoutMs);
    close(fd);
    return result;
}
