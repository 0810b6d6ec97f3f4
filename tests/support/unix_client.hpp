// Small Unix-socket helpers for tests that play the daemon's peers: a local
// program on "/tmp/vexoctrl", or a media-center interface.
#pragma once

#include <sys/socket.h>

#include <cstdint>
#include <string>

namespace vt {

// A socket of the given type connected to path, or -1.
int ConnectUnix(const std::string& path, int type = SOCK_STREAM);

// A socket of the given type bound to path (whatever stood there removed
// first), listening when it is a stream socket; -1 on failure.
int BindUnix(const std::string& path, int type = SOCK_STREAM);

// Connects to "/tmp/vexoctrl", writes the 4 bytes of code in this machine's
// byte order and returns the connection (or -1); the caller closes it.
int SendAction(std::int32_t code);

// Whether fd has data (or end of stream) to read right now.
bool Readable(int fd, int timeoutMs = 0);

}  // namespace vt
