// Error logging to syslog at LOG_ERR; the daemon never calls openlog.
//
// Every message starts with the source file name of the module that logs it
// and a fixed line number that identifies the message (not __LINE__):
//   LogError(__FILE_NAME__, 304, "Got short read from device!")
//     -> "hw_raytac.cpp (304) Got short read from device!"
//   LogClientError(__FILE_NAME__, 27, "Failed to connect to %s. [%s]", ...)
//     -> "ctrl.cpp:27 Failed to connect to <the audio socket>. [...]"
#pragma once

// Longest message text after the prefix; longer texts are cut, never overrun.
inline constexpr int LOG_TEXT_MAX = 1280;

// Logs "<file> (<line>) <text>": the shape of the daemon, socket and driver modules.
void LogError(const char* file, int line, const char* fmt, ...)
    __attribute__((format(printf, 3, 4)));

// Logs "<file>:<line> <text>": the shape of the audio client modules.
void LogClientError(const char* file, int line, const char* fmt, ...)
    __attribute__((format(printf, 3, 4)));
