// Control-socket driver: local programs inject actions on RC_CTRL_SOCKET_PATH,
// one 4-byte action code in native byte order per connection.
#pragma once

#include "common/rc_types.hpp"

// Connections held at once; further ones wait in the listening queue.
inline constexpr std::int32_t CTRL_SOCK_SLOTS = 4;

// The driver record, second in the registry.
extern RcDriver vexoctrl;

// Client connections accepted and not yet read; -1 marks a free slot.
extern std::int32_t CtrlSockClients[CTRL_SOCK_SLOTS];

// Listens on the record's path unless already listening; 0, or -1 (logged).
std::int32_t CtrlSockOpen();

// Takes at most one connection and one message without waiting; returns the
// value the client sent, unchanged, or 0 when no message was taken.
std::int32_t CtrlSockRead();

// Stops listening, drops the connections not yet read and removes the socket
// path (also when the open failed); returns 0.
std::int32_t CtrlSockClose();
