// The one way an action reaches the daemon: connect to its control socket,
// write the 4 bytes of the code in this machine's byte order, and wait until
// the daemon has read them and hung up. The hang-up is the proof that the
// daemon took the action; it reads each connection once and closes it.
#pragma once

#include <cstddef>

#include "common/actions.hpp"
#include "common/paths.hpp"

// How long the daemon may take to accept a connection and to read it: one
// poll of the receiver plus one audio exchange take well under a second, so
// this only ends a wait on a daemon that has stopped serving.
inline constexpr int ACTION_TAKE_TIMEOUT_MS = 5000;

// What became of one send.
enum class ActionSendStatus {
    Taken,         // the daemon read the connection and hung up
    NoSocket,      // no socket could be created
    NoTimeout,     // the send time-out could not be set on the socket
    NotRunning,    // nobody listens at the path (nothing there, or refused)
    NotAccepting,  // the connect failed otherwise, or ran out of time
    SendFailed,    // the bytes did not all go out
    TimedOut,      // no hang-up within the time-out; the daemon may still act
    Replied,       // the daemon wrote something back, which it never does
    NoAnswer,      // the wait for the hang-up failed
};

struct ActionSendResult {
    ActionSendStatus status;
    int error;  // errno of the call that failed; 0 when taken
};

// Sends one action and waits up to timeoutMs for the daemon to take it.
ActionSendResult ActionSend(RcAction action, int timeoutMs = ACTION_TAKE_TIMEOUT_MS,
                            const char* path = RC_CTRL_SOCKET_PATH);

// Sends size bytes of anything on one connection, for clients that write
// more or less than an action, then waits like ActionSend. With no bytes
// the connection is shut for writing at once: the daemon reads end of stream.
ActionSendResult ActionSendBytes(const void* bytes, std::size_t size,
                                 int timeoutMs = ACTION_TAKE_TIMEOUT_MS,
                                 const char* path = RC_CTRL_SOCKET_PATH);
