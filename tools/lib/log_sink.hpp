// The stand-in system logger: a datagram socket where the C library's syslog
// sends its messages, and the text of each message.
#pragma once

#include <sys/types.h>

#include <cstddef>

#include "common/paths.hpp"
#include "lib/unix_socket.hpp"

// Binds the logger's datagram socket at path (whatever stood there removed
// first), writable by every user; the descriptor, or -1 with *failed filled in.
int LogSinkOpen(UnixFailure* failed, const char* path = SYSLOG_SOCKET_PATH);

// Waits for one message and copies it into buf, without the newlines and zero
// bytes that end it, zero-terminated (cut to size - 1 bytes). Its length, or
// -1 with errno (EINTR when a signal ended the wait).
ssize_t LogSinkReceive(int fd, char* buf, std::size_t size);

// The text of a message: what follows "<PRI>Mmm dd hh:mm:ss ident: ".
const char* LogSinkText(const char* message);
