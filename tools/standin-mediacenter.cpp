// standin-mediacenter: a stand-in for the media-center user interface.
//
// Binds the media-center datagram socket (or --socket PATH) and
// prints one flushed line per datagram: "key 0x0007002C" for a 4-byte key
// code in this machine's byte order, "bad datagram of N bytes" for anything
// else. Before the first datagram it prints "listening PATH", so that a
// caller knows when keys can reach it. With --frozen it binds but never
// reads (it prints "frozen PATH" instead): the queue fills up, as it does
// behind an interface that has hung. SIGTERM or SIGINT removes the socket
// and ends it with status 0.
#include <poll.h>
#include <unistd.h>

#include <cerrno>
#include <cstdint>
#include <cstdio>
#include <cstring>
#include <string>

#include "lib/media_peer.hpp"
#include "lib/quit.hpp"

namespace {

// The usage text: on standard output with status 0 when asked for, on
// standard error with status 2 after a bad option.
int Usage(const char* argv0, bool asked)
{
    std::fprintf(asked ? stdout : stderr,
                 "usage: %s [--frozen] [--socket PATH] [--help]\n"
                 "  Binds a datagram socket (default %s) and prints each key code\n"
                 "  received as \"key 0x%%08X\"; --frozen never reads from it.\n",
                 argv0, MEDIA_CENTER_SOCKET_PATH);
    return asked ? 0 : 2;
}

}  // namespace

int main(int argc, char** argv)
{
    bool frozen = false;
    std::string path = MEDIA_CENTER_SOCKET_PATH;
    for (int i = 1; i < argc; ++i) {
        const std::string arg = argv[i];
        if (arg == "--frozen")
            frozen = true;
        else if (arg == "--socket" && i + 1 < argc)
            path = argv[++i];
        else
            return Usage(argv[0], arg == "--help" || arg == "-h");
    }
    if (!QuitInstall()) {
        std::fprintf(stderr, "%s: signals: %s\n", argv[0], std::strerror(errno));
        return 1;
    }
    UnixFailure failed;
    const int fd = path.empty() ? -1 : MediaPeerOpen(&failed, path.c_str());
    if (path.empty() || failed.step == UnixStep::Path) {
        std::fprintf(stderr, "%s: socket path too long: %s\n", argv[0], path.c_str());
        return 2;
    }
    if (fd < 0) {
        if (failed.step == UnixStep::Socket)
            std::fprintf(stderr, "%s: socket: %s\n", argv[0], std::strerror(failed.error));
        else
            std::fprintf(stderr, "%s: bind %s: %s\n", argv[0], path.c_str(), std::strerror(failed.error));
        return 1;
    }
    std::printf("%s %s\n", frozen ? "frozen" : "listening", path.c_str());
    std::fflush(stdout);

    int status = 0;
    for (;;) {
        // Frozen, it waits for nothing but a quit signal.
        pollfd fds[2] = {{QuitFd(), POLLIN, 0}, {fd, POLLIN, 0}};
        if (poll(fds, frozen ? 1 : 2, -1) <= 0)
            continue;
        if (fds[0].revents != 0)
            break;
        std::uint32_t code = 0;
        const ssize_t n = MediaPeerTake(fd, &code);
        if (n < 0) {
            if (errno == EAGAIN || errno == EINTR)
                continue;
            std::fprintf(stderr, "%s: recv: %s\n", argv[0], std::strerror(errno));
            status = 1;
            break;
        }
        if (n == sizeof code)
            std::printf("key 0x%08X\n", static_cast<unsigned>(code));
        else
            std::printf("bad datagram of %zd bytes\n", n);
        std::fflush(stdout);
    }
    close(fd);
    unlink(path.c_str());
    return status;
}
