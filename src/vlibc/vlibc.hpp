// Stand-in for the appliance's closed system library: process and text helpers.
#pragma once

// Returns the pid stored in a pid file, or 0 when there is none: a file that
// is missing, empty, not a decimal number, negative, zero or out of range.
int VLIBCReadPidFile(const char* path);

// Returns 1 when a process with this pid exists, else 0. Probes with signal 0,
// never with a signal the process could react to.
int VLIBCProcAlive(int pid);

// Removes the white space (space, tab, newline, carriage return, vertical tab,
// form feed) at both ends of text, in place. flags must be 0. Returns the
// length of the trimmed text, or -1 for a missing text or unknown flags.
int VLIBCStrTrimSpace(char* text, int flags);
