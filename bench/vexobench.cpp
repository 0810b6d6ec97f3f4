// Load generator and measuring peer for the daemon's benchmarks. One process
// plays both ends of the daemon: the local program that sends actions to its
// control socket and the audio daemon that takes the 8196-byte records, so
// one monotonic clock times the whole road. Both ends are the tools' own
// (bench/ends: the action sender, the stand-in audio daemon, the receiver
// FIFO). It runs inside tests/sandbox.sh, with the daemon's built-in paths.
//
//   vexobench paths                      the built-in paths, as shell assignments
//   vexobench wait-open PID [closed]     waits until PID holds the receiver open (or not)
//   vexobench latency N [PID]            N actions one after another; with PID, the
//                                        receiver is opened on a FIFO first
//   vexobench baseline N                 the same road through a minimal relay loop
//   vexobench throughput SENDERS N       SENDERS threads send N actions each
//   vexobench exercise PID               every road of the daemon, for the allocation count
//
// Results are printed as "key=value" lines for bench/measure.sh.
#include <poll.h>
#include <signal.h>
#include <sys/socket.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <atomic>
#include <chrono>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <random>
#include <string>
#include <thread>
#include <vector>

#include "ends.hpp"
#include "lib/media_peer.hpp"
#include "lib/proc_fds.hpp"
#include "lib/unix_socket.hpp"
#include "vexorcd/dispatch.hpp"

namespace {

constexpr char RELAY_PATH[] = "/tmp/vexobench-relay.sock";
// Random waits before each timed action: over several loop turns (one turn
// is the 100 µs pause plus the polls), or over the receiver's 200 ms wait.
constexpr int LOOP_JITTER_US = 1000;
constexpr int RECEIVER_WAIT_US = 200000;

// ---- Figures ---------------------------------------------------------------

struct Summary {
    double medianUs;
    double p99Us;
    double maxUs;
};

Summary Summarise(std::vector<std::int64_t> ns)
{
    std::sort(ns.begin(), ns.end());
    const std::size_t n = ns.size();
    const std::size_t p99 = (n * 99 + 99) / 100 - 1;
    return {static_cast<double>(ns[n / 2]) / 1000.0, static_cast<double>(ns[p99]) / 1000.0,
            static_cast<double>(ns[n - 1]) / 1000.0};
}

// Sends n actions to path one after another, each once the previous record
// has arrived, and times each from the connect to the record's last byte.
// Before each send it waits a random time below maxJitterUs, so that actions
// land at every point of the daemon's loop rather than right after its
// previous exchange.
int MeasureLatency(const char* label, const char* path, int n, int maxJitterUs)
{
    Recorder peer;
    const std::vector<RcAction> actions = CommandedActions();
    std::vector<std::int64_t> samples;
    samples.reserve(static_cast<std::size_t>(n));
    std::mt19937 rng(12345);
    std::uniform_int_distribution<int> jitter(0, std::max(0, maxJitterUs - 1));
    int wrong = 0;
    int lost = 0;
    for (int i = 0; i < n; ++i) {
        const RcAction action = actions[static_cast<std::size_t>(i) % actions.size()];
        std::this_thread::sleep_for(std::chrono::microseconds(jitter(rng)));
        const std::uint64_t before = peer.Received();
        const std::int64_t t0 = AudioPeerNowNs();
        if (!SendAction(action, path)) {
            ++lost;
            continue;
        }
        std::int64_t t1 = 0;
        if (!peer.WaitFor(before + 1, 2000, &t1)) {
            ++lost;
            continue;
        }
        if (peer.LastAction() != action)
            ++wrong;
        samples.push_back(t1 - t0);
    }
    if (samples.empty()) {
        std::printf("%s.n=0\n%s.lost=%d\n", label, label, lost);
        return 1;
    }
    const Summary s = Summarise(samples);
    std::printf("%s.n=%zu\n%s.median_us=%.1f\n%s.p99_us=%.1f\n%s.max_us=%.1f\n"
                "%s.lost=%d\n%s.wrong=%d\n",
                label, samples.size(), label, s.medianUs, label, s.p99Us, label, s.maxUs, label,
                lost, label, wrong);
    return lost == 0 && wrong == 0 ? 0 : 1;
}

// The least a relay must do for one action: a blocking accept on a stream
// socket, one read of 4 bytes, then the daemon's own dispatch of the action
// (one exchange with the audio daemon). No pause, no polling.
[[noreturn]] void RunRelay(int listenFd)
{
    for (;;) {
        const int client = accept(listenFd, nullptr, nullptr);
        if (client < 0)
            continue;
        RcAction action = 0;
        const ssize_t r = read(client, &action, sizeof action);
        close(client);
        if (r == static_cast<ssize_t>(sizeof action))
            RcDispatchAction(action);
    }
}

int Baseline(int n)
{
    const int listenFd = UnixBind(RELAY_PATH, SOCK_STREAM, 4, nullptr);
    if (listenFd < 0)
        Die(RELAY_PATH);
    const pid_t relay = fork();
    if (relay < 0)
        Die("fork");
    if (relay == 0)
        RunRelay(listenFd);
    close(listenFd);
    const int rc = MeasureLatency("baseline", RELAY_PATH, n, LOOP_JITTER_US);
    kill(relay, SIGKILL);
    waitpid(relay, nullptr, 0);
    unlink(RELAY_PATH);
    return rc;
}

// Several senders at once, as fast as the daemon takes them; then every
// action is checked to have arrived exactly once.
int Throughput(int senders, int perSender)
{
    Recorder peer;
    const std::vector<RcAction> actions = CommandedActions();
    std::array<std::atomic<std::uint64_t>, RC_ACT_LAST + 1> sent {};
    std::atomic<std::uint64_t> failed {0};
    const std::int64_t t0 = AudioPeerNowNs();
    std::vector<std::thread> threads;
    for (int s = 0; s < senders; ++s)
        threads.emplace_back([&, s] {
            for (int i = 0; i < perSender; ++i) {
                const RcAction a = actions[static_cast<std::size_t>(s + i) % actions.size()];
                if (SendAction(a))
                    ++sent[static_cast<std::size_t>(a)];
                else
                    ++failed;
            }
        });
    for (std::thread& t : threads)
        t.join();
    std::uint64_t total = 0;
    for (const auto& c : sent)
        total += c.load();
    // Everything sent has been taken by the daemon; wait for the
    // last records, giving up once nothing has arrived for two seconds.
    std::uint64_t seen = peer.Received();
    while (!peer.WaitFor(total, 2000)) {
        const std::uint64_t now = peer.Received();
        if (now == seen)
            break;
        seen = now;
    }
    std::int64_t lastAt = 0;
    peer.WaitFor(0, 0, &lastAt);
    const double seconds = static_cast<double>(lastAt - t0) / 1e9;
    const auto got = peer.Counts();
    std::uint64_t lost = 0;
    std::uint64_t dup = 0;
    std::uint64_t received = 0;
    for (std::size_t a = RC_ACT_UNMAPPED; a <= RC_ACT_LAST; ++a) {
        const std::uint64_t want = sent[a].load();
        received += got[a];
        if (got[a] < want)
            lost += want - got[a];
        else
            dup += got[a] - want;
    }
    const std::uint64_t garbled = got[RC_ACT_LAST + 1];
    std::printf("throughput.senders=%d\nthroughput.sent=%llu\nthroughput.send_failed=%llu\n"
                "throughput.received=%llu\nthroughput.lost=%llu\nthroughput.duplicated=%llu\n"
                "throughput.garbled=%llu\nthroughput.seconds=%.3f\nthroughput.per_second=%.0f\n",
                senders, static_cast<unsigned long long>(total),
                static_cast<unsigned long long>(failed.load()),
                static_cast<unsigned long long>(received), static_cast<unsigned long long>(lost),
                static_cast<unsigned long long>(dup), static_cast<unsigned long long>(garbled),
                seconds, static_cast<double>(received) / seconds);
    return lost == 0 && dup == 0 && garbled == 0 && failed.load() == 0 ? 0 : 1;
}

// ---- Every road, for the allocation count ----------------------------------

// Sends action and waits until the audio peer has count records in all.
bool Deliver(Recorder& peer, RcAction action, std::uint64_t count)
{
    return SendAction(action) && peer.WaitFor(count, 3000);
}

// Waits until no record has arrived for 300 ms; returns how many came in all.
std::uint64_t Settle(Recorder& peer)
{
    std::uint64_t seen = peer.Received();
    while (peer.WaitFor(seen + 1, 300))
        seen = peer.Received();
    return seen;
}

int Exercise(pid_t pid)
{
    int failures = 0;
    auto check = [&](bool ok, const char* what) {
        if (!ok) {
            std::fprintf(stderr, "vexobench: exercise: %s\n", what);
            ++failures;
        }
    };
    // Nobody on the audio socket: every dispatch fails at the connect and logs.
    unlink(AUDIO_SOCKET_PATH);
    for (const RcAction a : {RC_ACT_STOP, RC_ACT_PLAY, RC_ACT_CUSTOM1})
        SendAction(a);
    std::this_thread::sleep_for(std::chrono::milliseconds(100));

    Recorder peer;
    std::uint64_t count = 0;
    for (int round = 0; round < 20; ++round)
        for (const RcAction a : CommandedActions())
            check(Deliver(peer, a, ++count), "action not delivered");
    // Odd clients: codes outside 1..25 or without a command, nothing sent,
    // one byte, eight bytes, and five at once (one more than the client slots).
    for (const RcAction a : {0, -1, 26, 1000, 1, 11, 12})
        SendAction(a);
    ActionSendBytes(nullptr, 0);
    const unsigned char one = RC_ACT_PLAY;
    ActionSendBytes(&one, 1);
    const RcAction two[2] = {RC_ACT_PLAY, RC_ACT_PLAY};
    ActionSendBytes(two, sizeof two);
    std::vector<std::thread> burst;
    for (int i = 0; i < 5; ++i)
        burst.emplace_back([] { SendAction(RC_ACT_PLAY); });
    for (std::thread& t : burst)
        t.join();
    count += 6;  // the eight-byte client and the five; the one byte is 6 only on little-endian
    check(Settle(peer) >= count, "burst not delivered");
    count = peer.Received();
    // A peer that never answers (the 500 ms budget runs out) and one that
    // closes without answering.
    peer.SetMode(AudioPeerMode::NeverAnswer);
    check(Deliver(peer, RC_ACT_PLAY, ++count), "silent peer not reached");
    std::this_thread::sleep_for(std::chrono::milliseconds(700));
    peer.SetMode(AudioPeerMode::CloseWithoutAnswer);
    check(Deliver(peer, RC_ACT_PLAY, ++count), "closing peer not reached");
    peer.SetMode(AudioPeerMode::Answer);

    {
        // The receiver: a short press, a volume key held over idle waits, a
        // long and a short press of Next, an unmapped key, a short and an
        // oversized report, then a media-center interface that takes a key.
        Receiver rx(pid);
        rx.Report(0x0007002C, 1);  // Play
        check(peer.WaitFor(++count, 3000), "receiver key not delivered");
        rx.Report(0x0007002C, 0);
        rx.Report(0x00070057, 1);  // Volume Plus, repeated while held
        check(peer.WaitFor(count + 3, 3000), "volume repeat not delivered");
        rx.Report(0x00070057, 0);
        count = Settle(peer);
        rx.Report(0x00070011, 1);  // Next, held past the long press
        check(peer.WaitFor(++count, 3000), "held Next not delivered");
        rx.Report(0x00070011, 0);
        rx.Report(0x00070011, 1);  // Next, short press
        std::this_thread::sleep_for(std::chrono::milliseconds(50));
        rx.Report(0x00070011, 0);
        check(peer.WaitFor(++count, 3000), "short Next not delivered");
        rx.Report(0x00070001, 1);
        rx.Report(0x00070001, 0);
        rx.Report(0, 0, 4);
        std::this_thread::sleep_for(std::chrono::milliseconds(300));
        rx.Report(0, 0, 80);
        std::this_thread::sleep_for(std::chrono::milliseconds(300));
        const int media = MediaPeerOpen(nullptr);
        if (media < 0)
            Die("media-center socket");
        rx.Report(0x0007002C, 1);
        pollfd pfd {media, POLLIN, 0};
        check(poll(&pfd, 1, 3000) == 1, "media-center key not offered");
        rx.Report(0x0007002C, 0);
        std::this_thread::sleep_for(std::chrono::milliseconds(300));
        close(media);
        unlink(MEDIA_CENTER_SOCKET_PATH);
        // SIGUSR1 while the receiver is open changes nothing.
        kill(pid, SIGUSR1);
        std::this_thread::sleep_for(std::chrono::milliseconds(300));
        check(Settle(peer) == count, "a key given to the media center was dispatched");
    }
    kill(pid, SIGUSR2);  // closed already: changes nothing
    std::this_thread::sleep_for(std::chrono::milliseconds(100));
    check(Deliver(peer, RC_ACT_PLAY, ++count), "action after the receiver not delivered");
    std::printf("exercise.records=%llu\nexercise.failures=%d\n",
                static_cast<unsigned long long>(peer.Received()), failures);
    return failures == 0 ? 0 : 1;
}

// ---- For bench/measure.sh -------------------------------------------------

// The built-in paths that the measuring script needs, as shell assignments.
int Paths()
{
    std::printf("pid_file=%s\nctrl_socket=%s\nreceiver=%s\nsyslog_socket=%s\n", RC_PID_FILE,
                RC_CTRL_SOCKET_PATH, RC_RAYTAC_DEVICE_PATH, SYSLOG_SOCKET_PATH);
    return 0;
}

int Usage()
{
    std::fprintf(stderr,
                 "usage: vexobench paths | wait-open PID [closed] | latency N [PID] |\n"
                 "       baseline N | throughput SENDERS N | exercise PID\n");
    return 2;
}

}  // namespace

int main(int argc, char** argv)
{
    signal(SIGPIPE, SIG_IGN);
    setvbuf(stdout, nullptr, _IOLBF, 0);
    if (argc == 2 && std::strcmp(argv[1], "paths") == 0)
        return Paths();
    if (argc < 3)
        return Usage();
    const std::string cmd = argv[1];
    const int n = std::atoi(argv[2]);
    if (cmd == "wait-open" && (argc == 3 || (argc == 4 && std::strcmp(argv[3], "closed") == 0)))
        return ProcWaitHoldsOpen(static_cast<pid_t>(n), RC_RAYTAC_DEVICE_PATH, argc == 3, 5000) ? 0 : 1;
    if (cmd == "latency" && argc == 3)
        return MeasureLatency("closed", RC_CTRL_SOCKET_PATH, n, LOOP_JITTER_US);
    if (cmd == "latency" && argc == 4) {
        const Receiver rx(static_cast<pid_t>(std::atoi(argv[3])));
        return MeasureLatency("open", RC_CTRL_SOCKET_PATH, n, RECEIVER_WAIT_US);
    }
    if (cmd == "baseline")
        return Baseline(n);
    if (cmd == "throughput" && argc == 4)
        return Throughput(n, std::atoi(argv[3]));
    if (cmd == "exercise")
        return Exercise(static_cast<pid_t>(n));
    return Usage();
}
