// The AirClick driver: its decisions on their own, then whole reads of
// reports written into a FIFO at the device path.
#include <fcntl.h>
#include <linux/hiddev.h>
#include <sys/ioctl.h>
#include <sys/stat.h>
#include <sys/time.h>
#include <unistd.h>

#include <cstdint>
#include <cstdio>
#include <cstring>
#include <string>
#include <thread>
#include <vector>

#include <gtest/gtest.h>

#include "drivers/hw_airclick.hpp"
#include "harness.hpp"
#include "vexorcd/registry.hpp"

namespace {

constexpr char kDevice[] = "/dev/usb/hiddev1";
constexpr std::uint32_t kPlay = 0xFA, kNext = 0xF3, kVolumePlus = 0xF9, kRelease = 0xFB;
constexpr std::int64_t kT0 = 1'700'000'000'000'000;

using Bytes = std::vector<unsigned char>;

// A report of `events` events whose usages carry a value: i in event i, the
// button code in the fifth.
Bytes Report(std::uint32_t button, std::size_t events = 5)
{
    Bytes out(events * sizeof(hiddev_event));
    for (std::size_t i = 0; i < events; ++i) {
        const hiddev_event ev {0x000C0001u + static_cast<unsigned>(i),
                               static_cast<std::int32_t>(i == 4 ? button : i)};
        std::memcpy(out.data() + i * sizeof ev, &ev, sizeof ev);
    }
    return out;
}

TEST(AirclickDecisions, TheButtonIsTheValueOfAFifthEventThatCarriesOne)
{
    char line[512] = {};
    std::FILE* f = fmemopen(line, sizeof line, "w");
    EXPECT_EQ(AirclickReportCode(Report(kPlay).data(), 40, f), kPlay);
    EXPECT_EQ(AirclickKeyLookup(kPlay, f), RC_ACT_PLAY);
    EXPECT_EQ(AirclickKeyLookup(kRelease, f), RC_ACT_NONE);  // matches, and the search runs on
    std::fclose(f);
    EXPECT_STREQ(line, "Got value: 0 \t1 \t2 \t3 \t250 \t\nPlay\nButton Released\n");

    EXPECT_EQ(AirclickReportCode(Report(kNext, 7).data(), 56, nullptr), kNext);
    // Fewer than five events, or a fifth whose usage has a zero lowest byte:
    // no button, though the report before had one there.
    EXPECT_EQ(AirclickReportCode(Report(kPlay, 4).data(), 32, nullptr), 0u);
    Bytes blank = Report(kPlay);
    const std::uint32_t noValue = 0x000C0100;
    std::memcpy(blank.data() + 32, &noValue, 4);
    EXPECT_EQ(AirclickReportCode(blank.data(), blank.size(), nullptr), 0u);

    for (auto [code, action] : {std::pair{0xF3u, RC_ACT_NEXT}, {0xEBu, RC_ACT_PREV},
                                {0xF9u, RC_ACT_VOLUME_UP}, {0xF7u, RC_ACT_VOLUME_DOWN}, {0u, 0}})
        EXPECT_EQ(AirclickKeyLookup(code, nullptr), action) << code;
}

TEST(AirclickDecisions, PressesCountOnceAndHeldVolumeRepeatsOncePer200ms)
{
    AirclickRepeatState s {0, 0};
    auto step = [&](RcAction found, std::int64_t now = kT0) {
        const AirclickOutcome o = AirclickStep(s, found, now);
        return o.done ? o.action : -1;  // -1: dropped, the read waits again
    };
    EXPECT_EQ(step(RC_ACT_PLAY), RC_ACT_PLAY);
    EXPECT_EQ(step(RC_ACT_PLAY), -1);
    EXPECT_EQ(step(RC_ACT_NEXT), RC_ACT_NEXT);  // another button at once
    EXPECT_EQ(step(0), 0);                      // the release ends the read
    EXPECT_EQ(step(0), -1);
    EXPECT_EQ(s.lastRepeatTime, 0);

    // Volume Plus every 50 ms, long after any repeat: the press, a repeat at
    // once, then one in four, counted from the last repeat given.
    std::vector<RcAction> given;
    for (int i = 0; i < 10; ++i)
        given.push_back(step(RC_ACT_VOLUME_UP, kT0 + i * 50'000));
    EXPECT_EQ(given, (std::vector<RcAction>{9, 9, -1, -1, -1, 9, -1, -1, -1, 9}));
    const std::int64_t last = s.lastRepeatTime;
    EXPECT_EQ(step(RC_ACT_VOLUME_UP, last + 199'999), -1);
    EXPECT_EQ(step(RC_ACT_VOLUME_UP, last + 200'000), 9);
    EXPECT_EQ(step(RC_ACT_VOLUME_UP, last - 1), 9);  // a clock set back: a large unsigned gap
}

// The driver reading a FIFO at its device path; the test keeps a writer
// open (a FIFO without one reads as end of file).
class AirclickFifo : public ::testing::Test {
protected:
    void SetUp() override
    {
        AirclickClose();
        AirclickRepeat = {0, 0};
        unlink(kDevice);
        ASSERT_EQ(mkfifo(kDevice, 0600), 0);
        writer_ = open(kDevice, O_RDWR | O_CLOEXEC);
        ASSERT_EQ(AirclickOpen(), 0);
    }
    void TearDown() override
    {
        AirclickClose();
        close(writer_);
        unlink(kDevice);
    }
    void Write(const Bytes& r) { ASSERT_EQ(write(writer_, r.data(), r.size()), static_cast<ssize_t>(r.size())); }
    int Pending()
    {
        int n = 0;
        ioctl(writer_, FIONREAD, &n);
        return n;
    }
    // Writes each report once the driver has taken the one before, as a
    // remote sends them while a button is held.
    std::thread Feed(std::vector<Bytes> reports)
    {
        return std::thread([this, reports] {
            for (const Bytes& r : reports) {
                vt::WaitUntil([&] { return Pending() == 0; }, 5000);
                (void)!write(writer_, r.data(), r.size());
            }
        });
    }
    int writer_ = -1;
};

TEST_F(AirclickFifo, RepeatsOfAHeldButtonAreDroppedUntilItsRelease)
{
    Write(Report(kPlay));
    EXPECT_EQ(AirclickRead(), RC_ACT_PLAY);
    // A repeat is dropped: the read gives nothing.
    Write(Report(kPlay));
    EXPECT_EQ(AirclickRead(), 0);
    EXPECT_EQ(Pending(), 0);

    // One report per read: each repeat gives 0 at once, so does the release;
    // then Play counts again.
    std::thread feeder = Feed({Report(kPlay), Report(kPlay), Report(kRelease), Report(kPlay)});
    std::vector<std::int32_t> reads;
    for (int i = 0; i < 4; ++i)
        reads.push_back(AirclickRead());
    feeder.join();
    EXPECT_EQ(reads, (std::vector<std::int32_t>{0, 0, 0, RC_ACT_PLAY}));

    // A held volume button repeats at once, stamped with the time of day.
    Write(Report(kVolumePlus));
    EXPECT_EQ(AirclickRead(), RC_ACT_VOLUME_UP);
    timeval before {};
    gettimeofday(&before, nullptr);
    Write(Report(kVolumePlus));
    EXPECT_EQ(AirclickRead(), RC_ACT_VOLUME_UP);
    EXPECT_GE(AirclickRepeat.lastRepeatTime, std::int64_t{before.tv_sec} * 1000000 + before.tv_usec);
}

TEST_F(AirclickFifo, BadReadsAndAFailedOpenAreLoggedAndLeaveTheStateAlone)
{
    vt::SyslogSink log;
    Write(Report(kPlay));
    ASSERT_EQ(AirclickRead(), RC_ACT_PLAY);
    Write(Bytes(4, 0xFA));
    EXPECT_EQ(AirclickRead(), -1);
    close(writer_);  // without a writer the FIFO reads as end of file
    writer_ = -1;
    EXPECT_EQ(AirclickRead(), -1);
    EXPECT_EQ(AirclickRepeat.lastAction, RC_ACT_PLAY);

    // A directory opens for reading but cannot be read.
    AirclickClose();
    unlink(kDevice);
    ASSERT_EQ(mkdir(kDevice, 0755), 0);
    ASSERT_EQ(AirclickOpen(), 0);
    EXPECT_EQ(AirclickRead(), -1);
    AirclickClose();
    rmdir(kDevice);
    EXPECT_EQ(AirclickOpen(), -1);
    ASSERT_TRUE(log.WaitFor("(123)"));
    EXPECT_EQ(log.Lines(), (std::vector<std::string>{
        "hw_airclick.cpp (205) Got short read from device!", "hw_airclick.cpp (205) Got short read from device!",
        "hw_airclick.cpp (203) Error reading event.",
        "hw_airclick.cpp (123) failed to open /dev/usb/hiddev1 (No such file or directory)."}));
}

TEST_F(AirclickFifo, NotInTheDaemonsTableButReadyForOne)
{
    EXPECT_EQ(RcDriversFind("airclick"), nullptr);
    RcDriver* const table[] = {&airclick, nullptr};
    const std::int32_t fd = airclick.descriptor;
    EXPECT_EQ(RcDriversOpenAll(table), 0);  // a second open keeps the descriptor it has
    EXPECT_EQ(airclick.descriptor, fd);
    Write(Report(kPlay));
    EXPECT_EQ(RcDriversPoll(table), RC_ACT_PLAY);
    EXPECT_EQ(RcDriversCloseAll(table), 0);
    EXPECT_EQ(airclick.descriptor, -1);
    EXPECT_EQ(fcntl(fd, F_GETFD), -1);
    EXPECT_EQ(AirclickRead(), 0);  // closed: nothing, at once
}

}  // namespace
