#include "lib/receiver_fifo.hpp"

#include <fcntl.h>
#include <sys/ioctl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <cstring>
#include <thread>

RaytacReport ReceiverReport(std::uint32_t usage, std::int32_t value)
{
    RaytacReport r {};
    for (int i = 0; i < RAYTAC_KEY_EVENT; ++i)
        r.events[i] = hiddev_event {0x000700E0u + static_cast<unsigned>(i), 0};
    r.events[RAYTAC_KEY_EVENT] = hiddev_event {usage, value};
    return r;
}

ReceiverFifo::~ReceiverFifo()
{
    if (fd_ >= 0)
        close(fd_);
}

bool ReceiverFifo::Open(const std::string& path, std::string* error)
{
    struct stat st {};
    if (stat(path.c_str(), &st) != 0) {
        if (mkfifo(path.c_str(), 0644) != 0) {
            *error = "mkfifo " + path + ": " + std::strerror(errno);
            return false;
        }
    } else if (!S_ISFIFO(st.st_mode)) {
        *error = path + " exists and is not a FIFO";
        return false;
    }
    // A writer can only be opened without waiting while a reader exists:
    // hold one of our own for that moment.
    const int reader = open(path.c_str(), O_RDONLY | O_NONBLOCK | O_CLOEXEC);
    if (reader >= 0)
        fd_ = open(path.c_str(), O_WRONLY | O_NONBLOCK | O_CLOEXEC);
    const int openErrno = errno;
    if (reader >= 0)
        close(reader);
    if (fd_ < 0) {
        *error = "open " + path + ": " + std::strerror(openErrno);
        return false;
    }
    return true;
}

void ReceiverFifo::Drain() const
{
    const auto end = std::chrono::steady_clock::now() + std::chrono::milliseconds(drainMs_);
    for (;;) {
        int queued = 0;
        if (ioctl(fd_, FIONREAD, &queued) != 0 || queued == 0)
            return;
        if (std::chrono::steady_clock::now() >= end)
            return;
        std::this_thread::sleep_for(std::chrono::milliseconds(1));
    }
}

long ReceiverFifo::Write(const void* bytes, std::size_t size) const
{
    Drain();
    return static_cast<long>(write(fd_, bytes, size));
}
