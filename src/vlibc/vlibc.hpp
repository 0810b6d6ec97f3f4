// Stand-in for the appliance's closed system library: process helpers.
#pragma once

// Returns the pid stored in a pid file, or 0 when there is none: a file that
// is missing, empty, not a decimal number, negative, zero or out of range.
int VLIBCReadPidFile(const char* path);

// Returns 1 when a process with this pid exists, else 0. Probes with signal 0,
// never with a signal the process could react to.
int VLIBCProcAlive(int pid);
