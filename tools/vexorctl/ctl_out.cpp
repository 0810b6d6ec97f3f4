#include "vexorctl/ctl_out.hpp"

#include <cstdarg>
#include <cstdio>
#include <cstring>

bool CtlVerbose = false;

int CtlUsageError(const char* fmt, ...)
{
    std::fprintf(stderr, "%s: ", CTL_PROGRAM);
    std::va_list ap;
    va_start(ap, fmt);
    std::vfprintf(stderr, fmt, ap);
    va_end(ap);
    std::fprintf(stderr, "\nTry '%s --help' or '%s --list'.\n", CTL_PROGRAM, CTL_PROGRAM);
    return CTL_EXIT_USAGE;
}

void CtlFail(const char* what, const char* subject, int error)
{
    std::fprintf(stderr, "%s: %s: %s (%s)\n", CTL_PROGRAM, subject, what, std::strerror(error));
}
