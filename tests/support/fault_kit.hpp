// Helpers for the fault-injection and soak tests: actions sent the way a
// well-behaved local program sends them, receiver reports written one at a
// time, a media-center interface that takes keys or is frozen, and a look at
// the descriptors a process holds.
#pragma once

#include <signal.h>
#include <sys/types.h>

#include <array>
#include <atomic>
#include <cstdint>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

#include "harness.hpp"
#include "remote.hpp"

namespace vt {

// Sends one action on its own connection to "/tmp/vexoctrl" and waits until
// the daemon has read it and closed the connection, so that the actions of
// one sender keep their order. False when it was not taken within timeoutMs.
bool InjectAction(std::int32_t action, int timeoutMs = 10000);

// A 72-byte receiver report in this machine's byte order: eight other
// keyboard usages, then the key's usage and value in the ninth event.
std::array<unsigned char, 72> KeyReport(std::uint32_t usage, std::int32_t value);

// Writes one report into the receiver's FIFO and waits until the daemon has
// read it. A write that finds no reader (the receiver is closed for a moment)
// is tried again until timeoutMs.
bool WriteReport(const ReceiverFifo& fifo, std::uint32_t usage, std::int32_t value,
                 int timeoutMs = 10000);

// The messages of log that begin with none of the prefixes.
std::vector<std::string> LinesOtherThan(const SyslogSink& log,
                                        const std::vector<std::string>& prefixes);

// Where the descriptors of process pid point ("socket:[123]", "/dev/null", ...).
std::vector<std::string> DescriptorTargets(pid_t pid);

// A storm of hot-plug signals at pid for its whole life: SIGUSR2 (close the
// receiver), then SIGUSR1 (open it) a moment later, about 500 times a second.
// The last signal sent is always SIGUSR1.
class HotplugStorm {
public:
    explicit HotplugStorm(pid_t pid);
    ~HotplugStorm();
    HotplugStorm(const HotplugStorm&) = delete;
    HotplugStorm& operator=(const HotplugStorm&) = delete;

private:
    std::atomic<bool> stop_ {false};
    std::thread thread_;
};

// A storm of SIGUSR1 at the thread that makes it, about every 2 ms, for its
// whole life; the signal is caught by a handler that does nothing, installed
// as the daemon installs its own (SA_RESTART).
class ThreadSignalStorm {
public:
    ThreadSignalStorm();
    ~ThreadSignalStorm();
    ThreadSignalStorm(const ThreadSignalStorm&) = delete;
    ThreadSignalStorm& operator=(const ThreadSignalStorm&) = delete;

private:
    struct sigaction saved_ {};
    std::atomic<bool> stop_ {false};
    std::thread thread_;
};

// A media-center interface on "/tmp/MediaCenter.sock": it reads and keeps the
// key codes offered to it, or, frozen, never reads.
class MediaCenterUi {
public:
    explicit MediaCenterUi(bool reading);
    ~MediaCenterUi();
    MediaCenterUi(const MediaCenterUi&) = delete;
    MediaCenterUi& operator=(const MediaCenterUi&) = delete;

    std::vector<std::uint32_t> Codes();
    // Frozen: takes the datagrams that wait in the queue, and reads from now on.
    void Thaw();

private:
    void Run();
    int fd_ = -1;
    std::atomic<bool> stop_ {false};
    std::mutex mu_;
    std::vector<std::uint32_t> codes_;
    std::thread thread_;
};

}  // namespace vt
