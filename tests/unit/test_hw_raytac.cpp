// The radio receiver: every key through the hold decisions, step by step and
// without a clock; the read of reports from a pipe, with and without a
// media-center interface taking the keys; the device's open and close.
#include <sys/stat.h>

#include <cctype>
#include <cstring>

#include "drivers/hw_raytac.hpp"
#include "harness.hpp"
#include "lib/media_peer.hpp"

namespace {

// Every key: its usage, its action and what holding it gives (its held
// variant; -1 for a volume key, which repeats; 0 for nothing).
const struct Key {
    std::uint32_t code;
    RcAction action, held;
} KEYS[] = {
    {0x0007004F, 2, 0},  {0x00070053, 2, 0},  {0x00070051, 4, 0},  {0x00070052, 5, 0},  {0x0007002C, 6, 0},
    {0x00070011, 7, 20}, {0x00070013, 8, 21}, {0x00070057, 9, -1}, {0x00070056, 10, -1}, {0x00070058, 13, 0},
    {0x00070059, 14, 0}, {0x00070050, 15, 0}, {0x00070049, 3, 0},  {0x00070061, 16, 22}, {0x00070062, 17, 23},
    {0x00070063, 18, 24}, {0x00070064, 19, 25},
    {0x00070004, 1, 0},  // the letter a, not on the remote: the dispatcher ignores 1
};

// Scripts for one key ('p' press, '.' an idle wait, 'r' release, 'x' an event
// of value 2, a release too) and what a plain, a volume and a long-press key
// hand over at each step: 'a' its action, 'h' its held variant, 'n' nothing;
// upper case when its code is offered to the media center as well.
const char* const SCRIPTS[][4] = {
    {"p...r.", "ANNNnn", "AAAAnn", "NNNNAn"},      // released after three idle waits
    {"p.....r", "ANNNNNn", "AAAAAAn", "NNNNHnn"},  // held past the fourth
    {"p.x.", "ANnn", "AAnn", "NNAn"},
};

TEST(RaytacStep, EveryKeyAtItsPressWhileHeldAndAtItsRelease)
{
    for (const Key& key : KEYS)
        for (const auto& s : SCRIPTS) {
            RaytacHoldState state {};
            std::string got;
            for (const char* e = s[0]; *e != '\0'; ++e) {
                const RaytacHandOver h =
                    RaytacStep(state, {*e == '.', {key.code, *e == 'p' ? 1 : *e == 'x' ? 2 : 0}});
                const char c =
                    h.action == 0 ? 'n' : h.action == key.action ? 'a' : h.action == key.held ? 'h' : '?';
                got += !h.offer ? c : h.code == key.code ? static_cast<char>(std::toupper(c)) : '!';
            }
            EXPECT_EQ(got, s[key.held > 0 ? 3 : key.held < 0 ? 2 : 1]) << std::hex << key.code << " " << s[0];
        }
}

// Writes reports of the keys {usage, value} in one piece into the pipe that
// the driver reads in place of its device (repeated and cut to size bytes
// when size is given), then reads reads times: the results.
std::string Send(int device, const std::vector<hiddev_event>& keys, std::size_t size = 0, std::size_t reads = 1)
{
    std::string bytes, results;
    for (const hiddev_event& key : keys) {
        RaytacReport report {};
        report.events[RAYTAC_KEY_EVENT] = key;
        bytes.append(reinterpret_cast<const char*>(&report), sizeof report);
    }
    while (bytes.size() < size)
        bytes += bytes;
    bytes.resize(size > 0 ? size : bytes.size());
    EXPECT_EQ(write(device, bytes.data(), bytes.size()), static_cast<ssize_t>(bytes.size()));
    while (reads-- > 0)
        results += std::to_string(RaytacRead()) + " ";
    return results;
}

TEST(RaytacRead, ReportsOneByOneAListeningMediaCenterAndBadReads)
{
    int device[2];
    ASSERT_EQ(pipe2(device, O_CLOEXEC), 0);
    raytac.descriptor = device[0];
    vt::Logged();
    const hiddev_event play {0x0007002C, 1}, playUp {0x0007002C, 0}, next {0x00070011, 1};
    EXPECT_EQ(Send(device[1], {play}), "6 ");  // nobody listens
    UnixFailure failed;
    const int ui = MediaPeerOpen(&failed);  // the tools' stand-in media center
    EXPECT_EQ(Send(device[1], {play}), "0 ");
    std::uint32_t code = 0;
    EXPECT_EQ(MediaPeerTake(ui, &code), 4);  // the code alone, in this machine's order
    EXPECT_EQ(code, 0x0007002Cu);
    close(ui);
    EXPECT_EQ(Send(device[1], {{0x00070057, 1}}), "9 ");  // its socket file left behind
    unlink(MEDIA_CENTER_SOCKET_PATH);
    // Reports that come in one read are handled one per read, in order; seven fit in a read.
    for (const auto& [keys, reads] : {std::pair<std::vector<hiddev_event>, std::string> {
             {{0x00070057, 0}, {0x0007004F, 1}}, "0 2 "},  // Volume Plus released with Stop: no runaway
             {{play, playUp, next}, "6 0 0 "},
             {{play, playUp, play, playUp, play, playUp, next, {0x00070011, 0}}, "6 0 6 0 6 0 0 7 "}})
        EXPECT_EQ(Send(device[1], keys, 0, keys.size()), reads);
    // Reads that are not whole reports are dropped; they may have held a release, so the hold ends.
    for (const std::size_t size : {80u, 150u, 7u}) {
        EXPECT_EQ(Send(device[1], {{0x00070057, 1}}), "9 ");
        EXPECT_EQ(Send(device[1], {play}, size), "-1 ");
        EXPECT_EQ(RaytacHold.heldAction, 0) << size;
    }
    const RaytacHoldState held = RaytacHold;
    raytac.descriptor = open("/tmp", O_RDONLY | O_DIRECTORY | O_CLOEXEC);  // its reads fail, silently
    EXPECT_EQ(RaytacRead(), -1);
    EXPECT_EQ(std::memcmp(&RaytacHold, &held, sizeof held), 0);
    EXPECT_EQ(vt::Logged(), (std::vector<std::string> {
                                "hw_raytac.cpp (311) The hid response is too short. ret:80 (10)",
                                "hw_raytac.cpp (311) The hid response is too short. ret:150 (18)",
                                "hw_raytac.cpp (304) Got short read from device!"}));
    RaytacClose();
    close(device[0]);
    close(device[1]);
}

TEST(RaytacDevice, OpeningTheDeviceForgetsAKeyLeftDownAndTheReportsNotYetHandedOut)
{
    ASSERT_EQ(mkfifo(RC_RAYTAC_DEVICE_PATH, 0600), 0);
    const int writer = open(RC_RAYTAC_DEVICE_PATH, O_RDWR | O_CLOEXEC);  // so that the open does not wait
    ASSERT_EQ(RaytacOpen(), 0);
    EXPECT_TRUE(RaytacOpen() == 0 && Send(writer, {{0x00070057, 1}, {0x0007004F, 1}}) == "9 ");
    RaytacClose();  // unplugged with Volume Plus down and Stop read but not handed out
    ASSERT_EQ(RaytacOpen(), 0);
    EXPECT_EQ(RaytacRead(), 0);  // an idle wait: neither a volume step nor the Stop
    RaytacClose();
    close(writer);
    unlink(RC_RAYTAC_DEVICE_PATH);
    EXPECT_EQ(RaytacOpen(), -1);  // no device, and no message
    EXPECT_TRUE(vt::Logged().empty());
}

}  // namespace
