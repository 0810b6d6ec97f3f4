// syslog-sink: a stand-in for the system logger, for demonstrations and for
// engineers in the test sandbox. Binds the logger's datagram socket (or
// --socket PATH) and prints the text of every message it receives, one line
// each, flushed at once. SIGTERM or SIGINT stops it and removes the socket.
#include <poll.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstring>

#include "lib/log_sink.hpp"
#include "lib/quit.hpp"

int main(int argc, char** argv)
{
    const char* path = SYSLOG_SOCKET_PATH;
    for (int i = 1; i < argc; ++i) {
        if (std::strcmp(argv[i], "--socket") == 0 && i + 1 < argc) {
            path = argv[++i];
        } else {
            std::fprintf(stderr,
                         "usage: %s [--socket PATH]\n"
                         "Binds a datagram socket at PATH (default %s) and prints the text\n"
                         "of every syslog message it receives. SIGTERM or SIGINT stops it.\n",
                         argv[0], SYSLOG_SOCKET_PATH);
            return std::strcmp(argv[i], "--help") == 0 ? 0 : 2;
        }
    }
    if (!QuitInstall()) {
        std::fprintf(stderr, "syslog-sink: signals: %s\n", std::strerror(errno));
        return 1;
    }
    UnixFailure failed;
    const int fd = LogSinkOpen(&failed, path);
    if (fd < 0) {
        if (failed.step == UnixStep::Path) {
            std::fprintf(stderr, "syslog-sink: path too long: %s\n", path);
            return 2;
        }
        if (failed.step == UnixStep::Socket)
            std::fprintf(stderr, "syslog-sink: socket: %s\n", std::strerror(failed.error));
        else
            std::fprintf(stderr, "syslog-sink: bind %s: %s\n", path, std::strerror(failed.error));
        return 1;
    }
    std::setvbuf(stdout, nullptr, _IOLBF, 0);
    std::printf("syslog-sink: listening on %s\n", path);

    char buf[4096];
    for (;;) {
        pollfd fds[2] = {{QuitFd(), POLLIN, 0}, {fd, POLLIN, 0}};
        if (poll(fds, 2, -1) <= 0)
            continue;
        if (fds[0].revents != 0)
            break;
        if (LogSinkReceive(fd, buf, sizeof buf) < 0) {
            if (errno == EINTR)
                continue;
            std::fprintf(stderr, "syslog-sink: recv: %s\n", std::strerror(errno));
            break;
        }
        std::printf("%s\n", LogSinkText(buf));
    }
    close(fd);
    unlink(path);
    return 0;
}
