// The radio receiver's stand-in: a FIFO at the receiver's device path, with
// a writer held open on it, into which key reports are written the way
// hiddev delivers them. remote-sim drives it from a script; tests and
// benchmarks write reports of their own.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string>

#include "drivers/hw_raytac.hpp"

// One key report: the eight events before the key stand for the keyboard's
// modifier usages (Left Control .. Right GUI), none pressed; the ninth
// carries usage and value, all in this machine's byte order.
RaytacReport ReceiverReport(std::uint32_t usage, std::int32_t value);

class ReceiverFifo {
public:
    // drainMs: the longest wait, before each write, for the reader to take
    // the previous one.
    explicit ReceiverFifo(int drainMs) : drainMs_(drainMs) {}
    ~ReceiverFifo();
    ReceiverFifo(const ReceiverFifo&) = delete;
    ReceiverFifo& operator=(const ReceiverFifo&) = delete;

    // Makes the FIFO at path, or takes the FIFO that stands there, and opens
    // its writer without waiting for a reader. False with the reason in
    // *error ("mkfifo PATH: ...", "PATH exists and is not a FIFO", "open PATH: ...").
    bool Open(const std::string& path, std::string* error);

    // Waits until the reader has taken everything written, at most drainMs.
    void Drain() const;

    // Writes bytes in one piece once the previous write has been read, so
    // that every read sees exactly one write. The bytes written, or -1 with
    // errno (EPIPE when nobody reads the device).
    long Write(const void* bytes, std::size_t size) const;

    // The writer's descriptor; -1 until opened.
    int Fd() const { return fd_; }

private:
    int fd_ = -1;
    int drainMs_;
};
