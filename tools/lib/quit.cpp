#include "lib/quit.hpp"

#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <unistd.h>

#include <cerrno>

namespace {

// The read end is watched; the write end is written by the handler.
int quitPipe[2] = {-1, -1};

void OnQuit(int /*sig*/)
{
    const int saved = errno;
    const char byte = 'q';
    // The pipe is never read: one byte keeps it readable, and a full pipe
    // (never reached) would only refuse the write.
    [[maybe_unused]] const ssize_t n = write(quitPipe[1], &byte, 1);
    errno = saved;
}

}  // namespace

bool QuitInstall()
{
    if (quitPipe[0] < 0 && pipe2(quitPipe, O_CLOEXEC | O_NONBLOCK) != 0)
        return false;
    struct sigaction sa {};
    sa.sa_handler = OnQuit;
    sigemptyset(&sa.sa_mask);
    struct sigaction ignore {};
    ignore.sa_handler = SIG_IGN;
    sigemptyset(&ignore.sa_mask);
    return sigaction(SIGTERM, &sa, nullptr) == 0 && sigaction(SIGINT, &sa, nullptr) == 0 &&
           sigaction(SIGPIPE, &ignore, nullptr) == 0;
}

int QuitFd()
{
    return quitPipe[0];
}

bool QuitRequested()
{
    if (quitPipe[0] < 0)
        return false;
    pollfd pfd {quitPipe[0], POLLIN, 0};
    return poll(&pfd, 1, 0) == 1;
}
