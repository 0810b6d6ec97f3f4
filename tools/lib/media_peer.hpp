// The stand-in media-center user interface: a datagram socket bound where the
// daemon offers each remote key, and the taking of one offered key.
#pragma once

#include <sys/types.h>

#include <cstdint>

#include "common/paths.hpp"
#include "lib/unix_socket.hpp"

// Binds the datagram socket at path (whatever stood there removed first);
// the descriptor, or -1 with *failed filled in.
int MediaPeerOpen(UnixFailure* failed, const char* path = MEDIA_CENTER_SOCKET_PATH);

// Takes one waiting datagram without blocking. Returns its true size (a key
// is 4 bytes, read into *code in this machine's byte order), or -1 with
// errno (EAGAIN when none waits).
ssize_t MediaPeerTake(int fd, std::uint32_t* code);
