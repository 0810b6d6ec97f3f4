// standin-mediacenter: a stand-in for the media-center user interface.
//
// Binds the datagram socket "/tmp/MediaCenter.sock" (or --socket PATH) and
// prints one flushed line per datagram: "key 0x0007002C" for a 4-byte key
// code in this machine's byte order, "bad datagram of N bytes" for anything
// else. Before the first datagram it prints "listening PATH", so that a
// caller knows when keys can reach it. With --frozen it binds but never
// reads (it prints "frozen PATH" instead): the queue fills up, as it does
// behind an interface that has hung. SIGTERM or SIGINT removes the socket
// and ends it with status 0.
#include <poll.h>
#include <signal.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <cerrno>
#include <cstdint>
#include <cstdio>
#include <cstring>
#include <string>

#include "common/socket.hpp"

namespace {

volatile sig_atomic_t quitRequested = 0;

void OnQuit(int /*sig*/) { quitRequested = 1; }

int Usage(const char* argv0)
{
    std::fprintf(stderr,
                 "usage: %s [--frozen] [--socket PATH]\n"
                 "  Binds a datagram socket (default %s) and prints each key code\n"
                 "  received as \"key 0x%%08X\"; --frozen never reads from it.\n",
                 argv0, MEDIA_CENTER_SOCKET_PATH);
    return 2;
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
            return Usage(argv[0]);
    }
    sockaddr_un addr {};
    if (path.empty() || path.size() >= sizeof addr.sun_path) {
        std::fprintf(stderr, "%s: socket path too long: %s\n", argv[0], path.c_str());
        return 2;
    }
    addr.sun_family = AF_UNIX;
    std::memcpy(addr.sun_path, path.c_str(), path.size() + 1);

    // The quit signals stay blocked except inside the wait, so that one
    // arriving between the check of the flag and the wait is not lost.
    struct sigaction sa {};
    sa.sa_handler = OnQuit;
    sigemptyset(&sa.sa_mask);
    sigset_t quitSignals;
    sigemptyset(&quitSignals);
    for (const int sig : {SIGTERM, SIGINT}) {
        sigaction(sig, &sa, nullptr);
        sigaddset(&quitSignals, sig);
    }
    sigset_t waitMask;
    sigprocmask(SIG_BLOCK, &quitSignals, &waitMask);

    const int fd = socket(AF_UNIX, SOCK_DGRAM, 0);
    if (fd < 0) {
        std::fprintf(stderr, "%s: socket: %s\n", argv[0], std::strerror(errno));
        return 1;
    }
    unlink(path.c_str());
    if (bind(fd, reinterpret_cast<const sockaddr*>(&addr), sizeof addr) != 0) {
        std::fprintf(stderr, "%s: bind %s: %s\n", argv[0], path.c_str(), std::strerror(errno));
        close(fd);
        return 1;
    }
    std::printf("%s %s\n", frozen ? "frozen" : "listening", path.c_str());
    std::fflush(stdout);

    int status = 0;
    while (quitRequested == 0) {
        // Frozen, it waits for nothing but a signal.
        pollfd pfd {fd, POLLIN, 0};
        if (ppoll(&pfd, frozen ? 0 : 1, nullptr, &waitMask) <= 0)
            continue;
        // Larger than a key, so that an oversized datagram shows its true size.
        unsigned char buf[64];
        const ssize_t n = recv(fd, buf, sizeof buf, MSG_TRUNC | MSG_DONTWAIT);
        if (n < 0) {
            if (errno == EAGAIN || errno == EINTR)
                continue;
            std::fprintf(stderr, "%s: recv: %s\n", argv[0], std::strerror(errno));
            status = 1;
            break;
        }
        if (n == sizeof(std::uint32_t)) {
            std::uint32_t code = 0;
            std::memcpy(&code, buf, sizeof code);
            std::printf("key 0x%08X\n", static_cast<unsigned>(code));
        } else {
            std::printf("bad datagram of %zd bytes\n", n);
        }
        std::fflush(stdout);
    }
    close(fd);
    unlink(path.c_str());
    return status;
}
