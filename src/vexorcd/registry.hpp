// The driver registry: the fixed, ordered list of the daemon's input drivers.
//
// Every walk takes the table to use, so that tests can run the registry over
// drivers of their own; the daemon uses the built-in RcDriverTable.
#pragma once

#include <csignal>
#include <cstdio>

#include "common/rc_types.hpp"

// The daemon's drivers in poll order (raytac, then vexoctrl), ended by nullptr.
extern RcDriver* const RcDriverTable[];

// Opens every driver in table order; -1 if any open failed, else 0.
std::int32_t RcDriversOpenAll(RcDriver* const* table = RcDriverTable);

// Reads the drivers in order and returns the first result above 0, else 0.
std::int32_t RcDriversPoll(RcDriver* const* table = RcDriverTable);

// Closes every driver in table order; -1 if any close failed, else 0.
std::int32_t RcDriversCloseAll(RcDriver* const* table = RcDriverTable);

// Writes "Supported drivers:" and one tab-indented driver name per line.
void RcDriversList(std::FILE* stream, RcDriver* const* table = RcDriverTable);

// Returns the first driver of the table with exactly this name, or nullptr.
RcDriver* RcDriversFind(const char* name, RcDriver* const* table = RcDriverTable);

// Handler for SIGUSR1 (open the receiver) and SIGUSR2 (close it). It only
// records the request; RcDriversServiceHotplug carries it out.
void RcOnHotplugSignal(int sig);

// Carries out the hot-plug requests recorded since the last call on the
// driver named "raytac": a close first if one was asked for, then an open if
// the latest request was an open. Costs nothing when no request is pending.
void RcDriversServiceHotplug(RcDriver* const* table = RcDriverTable);

// Name of the driver that SIGUSR1 and SIGUSR2 open and close.
inline constexpr const char RC_HOTPLUG_DRIVER[] = "raytac";
