// syslog-sink: a stand-in for the system logger, for demonstrations and for
// engineers in the test sandbox. Binds a datagram socket at /dev/log (or
// --socket PATH) and prints the text of every message it receives, one line
// each, flushed at once. SIGTERM or SIGINT stops it and removes the socket.
#include <signal.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstring>

namespace {

volatile sig_atomic_t quitRequested = 0;

void OnQuit(int /*sig*/)
{
    quitRequested = 1;
}

// The message text: what follows "<PRI>Mmm dd hh:mm:ss ident: ".
const char* MessageText(const char* msg)
{
    const char* p = msg;
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

}  // namespace

int main(int argc, char** argv)
{
    const char* path = "/dev/log";
    for (int i = 1; i < argc; ++i) {
        if (std::strcmp(argv[i], "--socket") == 0 && i + 1 < argc) {
            path = argv[++i];
        } else {
            std::fprintf(stderr,
                         "usage: %s [--socket PATH]\n"
                         "Binds a datagram socket at PATH (default /dev/log) and prints the text\n"
                         "of every syslog message it receives. SIGTERM or SIGINT stops it.\n",
                         argv[0]);
            return std::strcmp(argv[i], "--help") == 0 ? 0 : 2;
        }
    }
    sockaddr_un addr {};
    addr.sun_family = AF_UNIX;
    if (std::strlen(path) >= sizeof addr.sun_path) {
        std::fprintf(stderr, "syslog-sink: path too long: %s\n", path);
        return 2;
    }
    std::memcpy(addr.sun_path, path, std::strlen(path) + 1);

    struct sigaction sa {};
    sa.sa_handler = OnQuit;
    sigemptyset(&sa.sa_mask);
    sigaction(SIGTERM, &sa, nullptr);  // no SA_RESTART: recv returns at once
    sigaction(SIGINT, &sa, nullptr);

    const int fd = socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0);
    if (fd < 0) {
        std::fprintf(stderr, "syslog-sink: socket: %s\n", std::strerror(errno));
        return 1;
    }
    unlink(path);
    if (bind(fd, reinterpret_cast<sockaddr*>(&addr), sizeof addr) != 0) {
        std::fprintf(stderr, "syslog-sink: bind %s: %s\n", path, std::strerror(errno));
        close(fd);
        return 1;
    }
    chmod(path, 0666);
    std::setvbuf(stdout, nullptr, _IOLBF, 0);
    std::printf("syslog-sink: listening on %s\n", path);

    char buf[4096];
    while (quitRequested == 0) {
        const ssize_t n = recv(fd, buf, sizeof buf - 1, 0);
        if (n < 0) {
            if (errno == EINTR)
                continue;
            std::fprintf(stderr, "syslog-sink: recv: %s\n", std::strerror(errno));
            break;
        }
        std::size_t len = static_cast<std::size_t>(n);
        while (len > 0 && (buf[len - 1] == '\n' || buf[len - 1] == '\0'))
            --len;
        buf[len] = '\0';
        std::printf("%s\n", MessageText(buf));
    }
    close(fd);
    unlink(path);
    return 0;
}
