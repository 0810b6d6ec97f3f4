#include "common/log.hpp"

#include <cerrno>
#include <cstdarg>
#include <cstdio>
#include <syslog.h>

namespace {

// Formats the text first, so that callers' arguments never reach syslog's own
// format parser; errno is kept for the caller. colon picks "%s:%d " over "%s (%d) ".
void LogWrite(bool colon, const char* file, int line, const char* fmt, va_list ap)
    __attribute__((format(printf, 4, 0)));

void LogWrite(bool colon, const char* file, int line, const char* fmt, va_list ap)
{
    const int savedErrno = errno;
    char text[LOG_TEXT_MAX];
    std::vsnprintf(text, sizeof text, fmt, ap);
    if (colon)
        syslog(LOG_ERR, "%s:%d %s", file, line, text);
    else
        syslog(LOG_ERR, "%s (%d) %s", file, line, text);
    errno = savedErrno;
}

}  // namespace

void LogError(const char* file, int line, const char* fmt, ...)
{
    va_list ap;
    va_start(ap, fmt);
    LogWrite(false, file, line, fmt, ap);
    va_end(ap);
}

void LogClientError(const char* file, int line, const char* fmt, ...)
{
    va_list ap;
    va_start(ap, fmt);
    LogWrite(true, file, line, fmt, ap);
    va_end(ap);
}
