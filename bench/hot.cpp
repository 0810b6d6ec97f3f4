// The hot pure functions of the daemon in loops of known length, for
// instruction counts under callgrind. Each figure is one loop function,
// BenchLoop_<name>, whose cost callgrind collects alone (--toggle-collect);
// set-up runs outside it. Runs inside tests/sandbox.sh (it binds the audio
// daemon's socket and writes a profile file below /tmp).
//
//   vexohot list           the figures' names
//   vexohot calls NAME     how many calls one loop makes
//   vexohot describe NAME  what the figure measures
//   vexohot toggles NAME   the functions whose entry and exit toggle collection
//   vexohot run NAME       runs the loop once
#include <cerrno>
#include <cstdint>
#include <cstdio>
#include <cstring>
#include <string>

#include "audioctl/ctrl.hpp"
#include "audioctl/playlist.hpp"
#include "drivers/hw_raytac.hpp"
#include "lib/audio_peer.hpp"

namespace {

constexpr int KEY_CALLS = 1000;
constexpr int HOLD_ROUNDS = 200;
constexpr int HOLD_STEPS_PER_ROUND = 12;
constexpr int RECORD_CALLS = 200;
constexpr int PROFILE_CALLS = 200;
constexpr char PROFILE_PATH[] = "/tmp/vexohot-equalizer";

volatile std::uintptr_t sink;

RaytacEvent Key(std::uint32_t usage, std::int32_t value)
{
    RaytacEvent e {};
    e.idle = false;
    e.key.hid = usage;
    e.key.value = value;
    return e;
}

// The tools' stand-in audio daemon, answering every record on its own thread
// until the process ends.
void StartAudioPeer()
{
    static AudioPeer peer;
    std::string error;
    if (!peer.Listen(&error) || !peer.Start())
        std::fprintf(stderr, "vexohot: audio peer: %s\n", error.empty() ? std::strerror(errno) : error.c_str());
}

// Twenty profiles, the one asked for last.
void WriteProfiles()
{
    std::FILE* f = std::fopen(PROFILE_PATH, "w");
    if (f == nullptr)
        return;
    for (int i = 0; i < 19; ++i)
        std::fprintf(f, "Profile %d:%d %d %d %d %d %d %d %d %d %d\n", i, i, i, i, i, i, i, i, i, i, i);
    std::fprintf(f, "Rock:5.0 4.0 3.0 1.0 0.0 -1.0 0.0 2.0 3.5 4.5\n");
    std::fclose(f);
}

}  // namespace

extern "C" {

// Key-map lookups: the first key, the last key and a usage not in the map.
__attribute__((noinline)) void BenchLoop_keymap_first()
{
    for (int i = 0; i < KEY_CALLS; ++i)
        sink = reinterpret_cast<std::uintptr_t>(RaytacKeyFind(0x0007004F));
}
__attribute__((noinline)) void BenchLoop_keymap_last()
{
    for (int i = 0; i < KEY_CALLS; ++i)
        sink = reinterpret_cast<std::uintptr_t>(RaytacKeyFind(0x00070064));
}
__attribute__((noinline)) void BenchLoop_keymap_miss()
{
    for (int i = 0; i < KEY_CALLS; ++i)
        sink = reinterpret_cast<std::uintptr_t>(RaytacKeyFind(0x00070001));
}

// The hold logic over a mix of what a remote does: a short press of Play,
// a long press of Next, a volume key held over two waits and idle waits with
// nothing down; the figure is per step.
__attribute__((noinline)) void BenchLoop_hold_step()
{
    const RaytacEvent idle {true, {}};
    const RaytacEvent events[HOLD_STEPS_PER_ROUND] = {
        Key(0x0007002C, 1), Key(0x0007002C, 0), idle,
        Key(0x00070011, 1), idle, idle, idle, idle, Key(0x00070011, 0),
        Key(0x00070057, 1), idle, Key(0x00070057, 0),
    };
    RaytacHoldState state {0, 0, RC_ACT_NONE};
    for (int r = 0; r < HOLD_ROUNDS; ++r)
        for (const RaytacEvent& e : events)
            sink = static_cast<std::uintptr_t>(RaytacStep(state, e).action);
}

// Building and sending a command; the exchange itself (AudioCtrlTransact) is
// toggled out, so what remains is the record's building around it.
__attribute__((noinline)) void BenchLoop_record_bare()
{
    for (int i = 0; i < RECORD_CALLS; ++i)
        sink = static_cast<std::uintptr_t>(AudioCtrlSendBare(AUDIO_CMD_PLAY));
}
__attribute__((noinline)) void BenchLoop_record_int()
{
    for (int i = 0; i < RECORD_CALLS; ++i)
        sink = static_cast<std::uintptr_t>(AudioCtrlSendInt(AUDIO_CMD_CUSTOM, -2147483647 - 1));
}

__attribute__((noinline)) void BenchLoop_record_playlist()
{
    static AudioPlaylistRecord playlist;
    for (int i = 0; i < RECORD_CALLS; ++i)
        sink = static_cast<std::uintptr_t>(AudioCtrlSendRecordInt(AUDIO_CMD_23, i, &playlist));
}

// The profile search, the wanted line last of twenty.
__attribute__((noinline)) void BenchLoop_profile_search()
{
    char out[128];
    for (int i = 0; i < PROFILE_CALLS; ++i)
        sink = static_cast<std::uintptr_t>(AudioEqLookupProfile(PROFILE_PATH, "Rock", out, sizeof out));
}

}  // extern "C"

namespace {

struct Figure {
    const char* name;
    const char* what;
    void (*loop)();
    int calls;
    const char* extraToggle;  // a function whose cost is taken out, or nullptr
    void (*setUp)();
};

const Figure FIGURES[] = {
    {"keymap_first", "key-map lookup, first key", BenchLoop_keymap_first, KEY_CALLS, nullptr,
     nullptr},
    {"keymap_last", "key-map lookup, last of 17 keys", BenchLoop_keymap_last, KEY_CALLS, nullptr,
     nullptr},
    {"keymap_miss", "key-map lookup, unmapped key", BenchLoop_keymap_miss, KEY_CALLS, nullptr,
     nullptr},
    {"hold_step", "hold logic, one step (press, release or idle wait)", BenchLoop_hold_step,
     HOLD_ROUNDS * HOLD_STEPS_PER_ROUND, nullptr, nullptr},
    {"record_bare", "record building, command without argument", BenchLoop_record_bare,
     RECORD_CALLS, "AudioCtrlTransact*", StartAudioPeer},
    {"record_int", "record building, decimal argument", BenchLoop_record_int, RECORD_CALLS,
     "AudioCtrlTransact*", StartAudioPeer},
    {"record_playlist", "record building, playlist record with integer",
     BenchLoop_record_playlist, RECORD_CALLS, "AudioCtrlTransact*", StartAudioPeer},
    {"profile_search", "profile search, match on line 20 of 20", BenchLoop_profile_search,
     PROFILE_CALLS, nullptr, WriteProfiles},
};

const Figure* Find(const char* name)
{
    for (const Figure& f : FIGURES)
        if (std::strcmp(f.name, name) == 0)
            return &f;
    return nullptr;
}

}  // namespace

int main(int argc, char** argv)
{
    if (argc == 2 && std::strcmp(argv[1], "list") == 0) {
        for (const Figure& f : FIGURES)
            std::printf("%s\n", f.name);
        return 0;
    }
    const Figure* f = argc == 3 ? Find(argv[2]) : nullptr;
    if (f == nullptr) {
        std::fprintf(stderr,
                     "usage: vexohot list | calls NAME | describe NAME | toggles NAME | run NAME\n");
        return 2;
    }
    const std::string cmd = argv[1];
    if (cmd == "calls") {
        std::printf("%d\n", f->calls);
    } else if (cmd == "describe") {
        std::printf("%s\n", f->what);
    } else if (cmd == "toggles") {
        std::printf("BenchLoop_%s%s%s\n", f->name, f->extraToggle != nullptr ? " " : "",
                    f->extraToggle != nullptr ? f->extraToggle : "");
    } else if (cmd == "run") {
        if (f->setUp != nullptr)
            f->setUp();
        f->loop();
    } else {
        return 2;
    }
    return 0;
}
