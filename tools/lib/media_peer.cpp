#include "lib/media_peer.hpp"

#include <sys/socket.h>

#include <cstring>

int MediaPeerOpen(UnixFailure* failed, const char* path)
{
    return UnixBind(path, SOCK_DGRAM, 0, failed);
}

ssize_t MediaPeerTake(int fd, std::uint32_t* code)
{
    // Larger than a key, so that an oversized datagram shows its true size.
    unsigned char buf[64];
    const ssize_t n = recv(fd, buf, sizeof buf, MSG_TRUNC | MSG_DONTWAIT);
    if (n == static_cast<ssize_t>(sizeof *code))
        std::memcpy(code, buf, sizeof *code);
    return n;
}
