// What a process holds open, read from /proc: how tests and benchmarks see
// that the daemon has opened or closed its receiver.
#pragma once

#include <sys/types.h>

// True when process pid holds a descriptor open on path.
bool ProcHoldsOpen(pid_t pid, const char* path);

// Waits up to timeoutMs until ProcHoldsOpen(pid, path) says open (or, with
// open false, no longer does); true when it came to that.
bool ProcWaitHoldsOpen(pid_t pid, const char* path, bool open, int timeoutMs);
