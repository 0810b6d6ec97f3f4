#include "lib/proc_fds.hpp"

#include <dirent.h>
#include <unistd.h>

#include <chrono>
#include <climits>
#include <cstdio>
#include <cstring>
#include <thread>

bool ProcHoldsOpen(pid_t pid, const char* path)
{
    char dir[64];
    std::snprintf(dir, sizeof dir, "/proc/%ld/fd", static_cast<long>(pid));
    DIR* d = opendir(dir);
    if (d == nullptr)
        return false;
    bool found = false;
    while (const dirent* e = readdir(d)) {
        if (e->d_name[0] == '.')
            continue;
        char link[PATH_MAX];
        char target[PATH_MAX] = {};
        std::snprintf(link, sizeof link, "%s/%s", dir, e->d_name);
        const ssize_t n = readlink(link, target, sizeof target - 1);
        if (n > 0 && std::strcmp(target, path) == 0) {
            found = true;
            break;
        }
    }
    closedir(d);
    return found;
}

bool ProcWaitHoldsOpen(pid_t pid, const char* path, bool open, int timeoutMs)
{
    const auto end = std::chrono::steady_clock::now() + std::chrono::milliseconds(timeoutMs);
    for (;;) {
        if (ProcHoldsOpen(pid, path) == open)
            return true;
        if (std::chrono::steady_clock::now() >= end)
            return false;
        std::this_thread::sleep_for(std::chrono::milliseconds(5));
    }
}
