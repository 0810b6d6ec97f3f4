// The daemon's lifecycle: start-up, the main loop and shutdown.
#pragma once

#include <csignal>

#include "common/paths.hpp"
#include "common/rc_types.hpp"

// Pause at the top of every loop turn, in microseconds.
inline constexpr unsigned RC_LOOP_PAUSE_US = 100;

// Set to 1 by SIGTERM or SIGINT; the loop ends at the top of its next turn.
extern volatile std::sig_atomic_t RcQuitRequested;

// Handler for SIGTERM and SIGINT: stores the quit flag and nothing else.
void RcOnQuitSignal(int sig);

// One turn of the main loop after its pause: carries out pending hot-plug
// requests, polls the drivers and hands an action 1..25 to dispatch.
// Returns the polled value.
std::int32_t RcLoopTurn(RcDriver* const* table, std::int32_t (*dispatch)(RcAction));

// The whole program: usage, single-instance guard, detach, pid file, drivers,
// signals, loop, shutdown. Returns the exit status: 1 when it cannot detach,
// else 0 (a refused start included).
int RcDaemonMain(int argc, char** argv);
