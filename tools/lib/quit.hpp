// How the stand-in programs stop: SIGTERM and SIGINT make a descriptor
// readable for good, so that every wait that also watches it ends, whenever
// the signal comes.
#pragma once

// Installs the SIGTERM and SIGINT handlers and ignores SIGPIPE (a peer that
// goes away makes writes fail instead). False, with errno, when the pipe or a
// handler could not be set up.
bool QuitInstall();

// The descriptor that becomes readable at the first quit signal; -1 before
// QuitInstall.
int QuitFd();

// True once a quit signal has come.
bool QuitRequested();
