// Helpers shared by the fuzz targets. Every target runs inside
// tests/sandbox.sh (fuzz/run.sh sees to it): they write the daemon's
// built-in paths, which must never be the host's.
#pragma once

#include <fcntl.h>
#include <unistd.h>

#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>

namespace fz {

// Aborts unless the process runs in the private namespace of tests/sandbox.sh.
inline void RequireSandbox()
{
    const char* in = std::getenv("VEXO_IN_SANDBOX");
    if (in == nullptr || std::strcmp(in, "1") != 0) {
        std::fprintf(stderr, "fuzz targets run only inside tests/sandbox.sh (fuzz/run.sh)\n");
        std::abort();
    }
}

// Replaces the file at path with exactly these bytes; aborts on failure, which
// would be a fault of the sandbox, not of the code under test.
inline void WriteWholeFile(const char* path, const std::uint8_t* data, std::size_t size)
{
    const int fd = open(path, O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0644);
    if (fd < 0)
        std::abort();
    std::size_t done = 0;
    while (done < size) {
        const ssize_t n = write(fd, data + done, size - done);
        if (n <= 0)
            std::abort();
        done += static_cast<std::size_t>(n);
    }
    close(fd);
}

// Takes the input apart from its front: small numbers first, then pieces.
class Reader {
public:
    Reader(const std::uint8_t* data, std::size_t size) : data_(data), size_(size) {}

    bool Empty() const { return size_ == 0; }
    std::size_t Left() const { return size_; }

    // One byte, 0 when the input is used up.
    std::uint8_t Byte()
    {
        if (size_ == 0)
            return 0;
        const std::uint8_t b = *data_;
        ++data_;
        --size_;
        return b;
    }

    // Four bytes in this machine's byte order (as the daemon's peers send
    // integers), missing bytes zero.
    std::uint32_t Word()
    {
        std::uint8_t b[4] = {Byte(), Byte(), Byte(), Byte()};
        std::uint32_t v;
        std::memcpy(&v, b, sizeof v);
        return v;
    }

    // The next n bytes (fewer at the end of the input); *got says how many.
    const std::uint8_t* Take(std::size_t n, std::size_t* got)
    {
        *got = n < size_ ? n : size_;
        const std::uint8_t* p = data_;
        data_ += *got;
        size_ -= *got;
        return p;
    }

private:
    const std::uint8_t* data_;
    std::size_t size_;
};

// Stops the fuzzer with a message; libFuzzer keeps the input as a crash.
[[noreturn]] inline void Fail(const char* what)
{
    std::fprintf(stderr, "fuzz check failed: %s\n", what);
    std::abort();
}

}  // namespace fz
