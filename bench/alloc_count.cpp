// Counts the heap allocations of a process, loaded with LD_PRELOAD in front of
// the C library's allocator. The daemon's start-up ends at its first pause of
// the main loop (the first usleep); allocations before and after it are
// counted apart. At exit the counts go to the file named by
// VEXO_ALLOC_REPORT as "startup_allocs=N", "startup_bytes=N",
// "loop_allocs=N", "loop_bytes=N" lines. With VEXO_ALLOC_TRACE naming a file,
// the call stacks of the first allocations after start-up are written there.
#include <dlfcn.h>
#include <execinfo.h>
#include <fcntl.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <cstddef>
#include <cstdio>
#include <cstdlib>
#include <cstring>

extern "C" {
void* __libc_malloc(std::size_t size);
void* __libc_calloc(std::size_t n, std::size_t size);
void* __libc_realloc(void* p, std::size_t size);
void* __libc_memalign(std::size_t align, std::size_t size);
void* __libc_valloc(std::size_t size);
void* __libc_pvalloc(std::size_t size);
void __libc_free(void* p);
}

namespace {

using UsleepFn = int (*)(useconds_t);

std::atomic<bool> looping {false};
std::atomic<unsigned long long> counts[2] {};
std::atomic<unsigned long long> bytes[2] {};
UsleepFn realUsleep = nullptr;
int traceFd = -1;
std::atomic<int> traced {0};
thread_local bool inTrace = false;

constexpr int TRACE_MAX = 8;

void Note(std::size_t size)
{
    const int phase = looping.load(std::memory_order_relaxed) ? 1 : 0;
    counts[phase].fetch_add(1, std::memory_order_relaxed);
    bytes[phase].fetch_add(size, std::memory_order_relaxed);
    if (phase == 1 && traceFd >= 0 && !inTrace && traced.fetch_add(1) < TRACE_MAX) {
        inTrace = true;
        void* frames[24];
        const int n = backtrace(frames, 24);
        char head[64];
        const int len = std::snprintf(head, sizeof head, "--- allocation of %zu bytes\n", size);
        (void)!write(traceFd, head, static_cast<std::size_t>(len));
        backtrace_symbols_fd(frames, n, traceFd);
        inTrace = false;
    }
}

__attribute__((constructor)) void Start()
{
    realUsleep = reinterpret_cast<UsleepFn>(dlsym(RTLD_NEXT, "usleep"));
    if (const char* path = std::getenv("VEXO_ALLOC_TRACE")) {
        traceFd = open(path, O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0644);
        // The first backtrace loads its unwinder, with allocations of its own.
        void* frame[1];
        inTrace = true;
        backtrace(frame, 1);
        inTrace = false;
    }
}

__attribute__((destructor)) void Report()
{
    const char* path = std::getenv("VEXO_ALLOC_REPORT");
    if (path == nullptr)
        return;
    const int fd = open(path, O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0644);
    if (fd < 0)
        return;
    char text[256];
    const int len = std::snprintf(
        text, sizeof text, "startup_allocs=%llu\nstartup_bytes=%llu\nloop_allocs=%llu\nloop_bytes=%llu\n",
        counts[0].load(), bytes[0].load(), counts[1].load(), bytes[1].load());
    (void)!write(fd, text, static_cast<std::size_t>(len));
    close(fd);
}

}  // namespace

extern "C" {

int usleep(useconds_t us)
{
    looping.store(true, std::memory_order_relaxed);
    return realUsleep != nullptr ? realUsleep(us) : 0;
}

void* malloc(std::size_t size)
{
    Note(size);
    return __libc_malloc(size);
}

void* calloc(std::size_t n, std::size_t size)
{
    Note(n * size);
    return __libc_calloc(n, size);
}

void* realloc(void* p, std::size_t size)
{
    Note(size);
    return __libc_realloc(p, size);
}

void free(void* p)
{
    __libc_free(p);
}

void* memalign(std::size_t align, std::size_t size)
{
    Note(size);
    return __libc_memalign(align, size);
}

void* aligned_alloc(std::size_t align, std::size_t size)
{
    Note(size);
    return __libc_memalign(align, size);
}

int posix_memalign(void** out, std::size_t align, std::size_t size)
{
    Note(size);
    void* p = __libc_memalign(align, size);
    if (p == nullptr)
        return ENOMEM;
    *out = p;
    return 0;
}

void* valloc(std::size_t size)
{
    Note(size);
    return __libc_valloc(size);
}

void* pvalloc(std::size_t size)
{
    Note(size);
    return __libc_pvalloc(size);
}

}  // extern "C"
