// Unix-domain sockets for the tools: a socket bound (and listening) at a path,
// and a socket connected to one. Addresses come from SocketFillAddress, so a
// path that does not fit is refused, never cut.
#pragma once

#include <cstdint>

// The step at which UnixBind or UnixConnect failed, and the errno it met.
enum class UnixStep : std::uint8_t { None, Path, Socket, Option, Bind, Listen, Connect };
struct UnixFailure {
    UnixStep step = UnixStep::None;
    int error = 0;
};

// A socket of type (SOCK_STREAM or SOCK_DGRAM, flags such as SOCK_NONBLOCK
// allowed) bound at path, whatever stood there removed first, and listening
// with backlog when it is a stream socket. The descriptor (close-on-exec), or
// -1 with *failed filled in.
int UnixBind(const char* path, int type, int backlog, UnixFailure* failed);

// A socket of type connected to path; the descriptor (close-on-exec), or -1
// with *failed filled in (failed may be null). With sendTimeoutMs above 0,
// sends and the connect itself (to a listener whose queue is full) give up
// after that long.
int UnixConnect(const char* path, int type, int sendTimeoutMs, UnixFailure* failed);

// True when a connect to the stream socket at path is answered: someone listens.
bool UnixSomeoneListens(const char* path);
