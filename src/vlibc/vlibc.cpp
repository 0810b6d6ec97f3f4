#include "vlibc/vlibc.hpp"

#include <cerrno>
#include <climits>
#include <csignal>
#include <cstring>
#include <fcntl.h>
#include <unistd.h>

namespace {

// Longest pid file we read: a pid and some white space.
constexpr int PID_FILE_MAX = 32;

bool IsSpace(char c)
{
    return c == ' ' || c == '\t' || c == '\n' || c == '\r';
}

}  // namespace

int VLIBCReadPidFile(const char* path)
{
    if (path == nullptr)
        return 0;
    const int fd = open(path, O_RDONLY | O_CLOEXEC | O_NOFOLLOW);
    if (fd < 0)
        return 0;
    char text[PID_FILE_MAX + 1];
    ssize_t got;
    do {
        got = read(fd, text, sizeof text);
    } while (got < 0 && errno == EINTR);
    close(fd);
    // A file that fills the whole buffer is not a pid file.
    if (got <= 0 || got > PID_FILE_MAX)
        return 0;

    int i = 0;
    const int n = static_cast<int>(got);
    while (i < n && IsSpace(text[i]))
        ++i;
    long long pid = 0;
    int digits = 0;
    while (i < n && text[i] >= '0' && text[i] <= '9') {
        pid = pid * 10 + (text[i] - '0');
        if (pid > INT_MAX)
            return 0;
        ++i;
        ++digits;
    }
    while (i < n && IsSpace(text[i]))
        ++i;
    if (digits == 0 || i != n || pid <= 0)
        return 0;
    return static_cast<int>(pid);
}

int VLIBCProcAlive(int pid)
{
    // kill() with 0 or a negative pid would address process groups.
    if (pid <= 0)
        return 0;
    if (kill(pid, 0) == 0)
        return 1;
    return errno == EPERM ? 1 : 0;
}

namespace {

// White space of the C locale.
bool IsTrimSpace(char c)
{
    return c == ' ' || c == '\t' || c == '\n' || c == '\r' || c == '\v' || c == '\f';
}

}  // namespace

int VLIBCStrTrimSpace(char* text, int flags)
{
    if (text == nullptr || flags != 0)
        return -1;
    std::size_t begin = 0;
    while (IsTrimSpace(text[begin]))
        ++begin;
    std::size_t end = begin + std::strlen(text + begin);
    while (end > begin && IsTrimSpace(text[end - 1]))
        --end;
    const std::size_t n = end - begin;
    std::memmove(text, text + begin, n);
    text[n] = '\0';
    return static_cast<int>(n);
}
