// What vexorctl tells its user: the exit statuses, usage errors, failures,
// and the -v switch shared by its commands.
#pragma once

inline constexpr char CTL_PROGRAM[] = "vexorctl";

// Exit statuses, as the usage text documents them.
inline constexpr int CTL_EXIT_DONE = 0;
inline constexpr int CTL_EXIT_FAILED = 1;
inline constexpr int CTL_EXIT_USAGE = 2;

// -v: one line on standard output for each command carried out.
extern bool CtlVerbose;

// Reports a usage error on standard error, with the hint to --help and
// --list; returns CTL_EXIT_USAGE.
int CtlUsageError(const char* fmt, ...) __attribute__((format(printf, 1, 2)));

// Reports "vexorctl: SUBJECT: WHAT (strerror(error))" on standard error.
void CtlFail(const char* what, const char* subject, int error);
