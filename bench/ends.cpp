#include "ends.hpp"

#include <signal.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>

#include "lib/proc_fds.hpp"
#include "vexorcd/dispatch.hpp"

namespace {

// The action whose command this record carries, or -1 when none matches
// (wrong code, wrong argument, or a byte that should be zero is not).
RcAction DecodeRecord(const AudioPeerRecord& seen)
{
    if (seen.bytes != sizeof seen.record)
        return -1;
    const AudioCmdRecord& rec = seen.record;
    const std::size_t used = strnlen(rec.arg, sizeof rec.arg);
    if (std::any_of(rec.arg + used, rec.arg + sizeof rec.arg, [](char c) { return c != 0; }))
        return -1;
    for (RcAction a = RC_ACT_UNMAPPED; a <= RC_ACT_LAST; ++a) {
        const RcActionCommand want = RcDispatchCommandOf(a);
        if (want.code == 0 || want.code != rec.code)
            continue;
        if (want.arg == 0 ? used == 0 : std::to_string(want.arg) == std::string(rec.arg, used))
            return a;
    }
    return -1;
}

}  // namespace

void Die(const char* what)
{
    std::fprintf(stderr, "vexobench: %s: %s\n", what, std::strerror(errno));
    std::exit(1);
}

std::vector<RcAction> CommandedActions()
{
    std::vector<RcAction> out;
    for (RcAction a = RC_ACT_UNMAPPED; a <= RC_ACT_LAST; ++a)
        if (RcDispatchCommandOf(a).code != 0)
            out.push_back(a);
    return out;
}

bool SendAction(RcAction action, const char* path)
{
    return ActionSend(action, ACTION_TAKE_TIMEOUT_MS, path).status == ActionSendStatus::Taken;
}

Recorder::Recorder()
{
    std::string error;
    if (!peer_.Listen(&error, 16)) {
        std::fprintf(stderr, "vexobench: %s\n", error.c_str());
        std::exit(1);
    }
    peer_.SetObserver([this](const AudioPeerRecord& seen) { Note(seen); });
    if (!peer_.Start())
        Die("audio peer");
}

bool Recorder::WaitFor(std::uint64_t total, int timeoutMs, std::int64_t* atNs)
{
    std::unique_lock<std::mutex> lock(mu_);
    const bool ok = cv_.wait_for(lock, std::chrono::milliseconds(timeoutMs),
                                 [&] { return received_ >= total; });
    if (atNs != nullptr)
        *atNs = lastAtNs_;
    return ok;
}

std::uint64_t Recorder::Received()
{
    const std::lock_guard<std::mutex> lock(mu_);
    return received_;
}

RcAction Recorder::LastAction()
{
    const std::lock_guard<std::mutex> lock(mu_);
    return lastAction_;
}

std::array<std::uint64_t, RC_ACT_LAST + 2> Recorder::Counts()
{
    const std::lock_guard<std::mutex> lock(mu_);
    return counts_;
}

void Recorder::Note(const AudioPeerRecord& seen)
{
    const RcAction action = DecodeRecord(seen);
    {
        const std::lock_guard<std::mutex> lock(mu_);
        ++received_;
        lastAtNs_ = seen.atNs;
        lastAction_ = action;
        ++counts_[action > 0 ? static_cast<std::size_t>(action) : RC_ACT_LAST + 1];
    }
    cv_.notify_all();
}

Receiver::Receiver(pid_t pid) : pid_(pid)
{
    unlink(RC_RAYTAC_DEVICE_PATH);
    std::string error;
    if (!fifo_.Open(RC_RAYTAC_DEVICE_PATH, &error)) {
        std::fprintf(stderr, "vexobench: %s\n", error.c_str());
        std::exit(1);
    }
    kill(pid_, SIGUSR1);
    if (!ProcWaitHoldsOpen(pid_, RC_RAYTAC_DEVICE_PATH, true, 5000)) {
        std::fprintf(stderr, "vexobench: the daemon did not open the receiver\n");
        std::exit(1);
    }
}

Receiver::~Receiver()
{
    kill(pid_, SIGUSR2);
    ProcWaitHoldsOpen(pid_, RC_RAYTAC_DEVICE_PATH, false, 5000);
    unlink(RC_RAYTAC_DEVICE_PATH);
}

void Receiver::Report(std::uint32_t usage, std::int32_t value, std::size_t length) const
{
    unsigned char bytes[sizeof(RaytacReport) + 8] = {};
    const RaytacReport report = ReceiverReport(usage, value);
    std::memcpy(bytes, &report, sizeof report);
    fifo_.Write(bytes, std::min(length, sizeof bytes));
    fifo_.Drain();
}
