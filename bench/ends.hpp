// The two ends of the daemon as the benchmarks play them: the tools' action
// sender, the tools' stand-in audio daemon counting what arrives, and the
// tools' receiver FIFO.
#pragma once

#include <sys/types.h>

#include <array>
#include <condition_variable>
#include <cstdint>
#include <mutex>
#include <vector>

#include "lib/action_send.hpp"
#include "lib/audio_peer.hpp"
#include "lib/receiver_fifo.hpp"

// Reports what failed with errno and ends the program.
[[noreturn]] void Die(const char* what);

// The actions that make the daemon send a command, in the order the load cycles through.
std::vector<RcAction> CommandedActions();

// Sends an action to path; true when the daemon took it.
bool SendAction(RcAction action, const char* path = RC_CTRL_SOCKET_PATH);

// The stand-in audio daemon on a thread of its own, noting when the last
// byte of each record arrived and which action it carries.
class Recorder {
public:
    Recorder();
    Recorder(const Recorder&) = delete;
    Recorder& operator=(const Recorder&) = delete;

    void SetMode(AudioPeerMode mode) { peer_.SetMode(mode); }

    // Waits until `total` records have arrived; the arrival time of the last
    // one in *atNs. False after timeoutMs without it.
    bool WaitFor(std::uint64_t total, int timeoutMs, std::int64_t* atNs = nullptr);

    std::uint64_t Received();
    RcAction LastAction();
    // Records per action; the last index counts records that match no action.
    std::array<std::uint64_t, RC_ACT_LAST + 2> Counts();

private:
    void Note(const AudioPeerRecord& seen);

    std::mutex mu_;
    std::condition_variable cv_;
    std::uint64_t received_ = 0;
    std::int64_t lastAtNs_ = 0;
    RcAction lastAction_ = 0;
    std::array<std::uint64_t, RC_ACT_LAST + 2> counts_ {};
    AudioPeer peer_;  // last: its thread stops before the counters go
};

// The receiver FIFO with its writer held open, so that the daemon's wait on
// it runs its whole 200 ms; opened by SIGUSR1, closed by SIGUSR2 when the
// object goes.
class Receiver {
public:
    explicit Receiver(pid_t pid);
    ~Receiver();
    Receiver(const Receiver&) = delete;
    Receiver& operator=(const Receiver&) = delete;

    // Writes one report whose key event is (usage, value), cut or padded
    // with zeros to length, and waits until the daemon has read it: two
    // reports in the pipe at once would be read as one of the wrong size.
    void Report(std::uint32_t usage, std::int32_t value, std::size_t length = sizeof(RaytacReport)) const;

private:
    pid_t pid_;
    ReceiverFifo fifo_ {1000};
};
