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

using Bytes = std::vector<unsigned char>;

// A report of `events` events with usages that carry a value, the button
// code in the fifth; events before it hold other values.
Bytes Report(std::uint32_t button, std::size_t events = 5)
{
    Bytes out;
    for (std::size_t i = 0; i < events; ++i) {
        hiddev_event ev {0x000C0001u + static_cast<unsigned>(i),
                         i == 4 ? static_cast<std::int32_t>(button) : static_cast<std::int32_t>(i)};
        const auto* p = reinterpret_cast<const unsigned char*>(&ev);
        out.insert(out.end(), p, p + sizeof ev);
    }
    return out;
}

void SetUsage(Bytes& report, std::size_t event, std::uint32_t usage)
{
    std::memcpy(report.data() + event * sizeof(hiddev_event), &usage, sizeof usage);
}

// What AirclickReportCode prints, and the code it finds.
std::pair<std::uint32_t, std::string> CodeAndLine(const Bytes& report)
{
    char buf[512] = {};
    std::FILE* f = fmemopen(buf, sizeof buf, "w");
    const std::uint32_t code = AirclickReportCode(report.data(), report.size(), f);
    std::fclose(f);
    return {code, buf};
}

std::int64_t Now()
{
    timeval tv {};
    gettimeofday(&tv, nullptr);
    return static_cast<std::int64_t>(tv.tv_sec) * 1000000 + tv.tv_usec;
}

TEST(AirclickDecisions, TheButtonIsTheFifthEventsValueWhenItCarriesOne)
{
    EXPECT_EQ(CodeAndLine(Report(kPlay)), std::make_pair(kPlay, std::string("Got value: 0 \t1 \t2 \t3 \t250 \t\n")));
    EXPECT_EQ(CodeAndLine(Report(kNext, 7)).first, kNext);

    // Fewer than five events, or a fifth whose usage has a zero lowest byte:
    // no button, even when an earlier report had one at that place.
    EXPECT_EQ(CodeAndLine(Report(kPlay, 4)).first, 0u);
    Bytes blank = Report(kPlay);
    SetUsage(blank, 4, 0x000C0100);
    EXPECT_EQ(CodeAndLine(blank), std::make_pair(0u, std::string("Got value: 0 \t1 \t2 \t3 \t\n")));
}

TEST(AirclickDecisions, KeyMapGivesTheFiveButtonsAndNothingForARelease)
{
    const std::pair<std::uint32_t, RcAction> buttons[] = {
        {0xFA, RC_ACT_PLAY}, {0xF3, RC_ACT_NEXT}, {0xEB, RC_ACT_PREV},
        {0xF9, RC_ACT_VOLUME_UP}, {0xF7, RC_ACT_VOLUME_DOWN}, {0x00, RC_ACT_NONE}, {0x1FA, RC_ACT_NONE}};
    for (const auto& [code, action] : buttons)
        EXPECT_EQ(AirclickKeyLookup(code, nullptr), action) << code;

    char buf[64] = {};
    std::FILE* f = fmemopen(buf, sizeof buf, "w");
    EXPECT_EQ(AirclickKeyLookup(kRelease, f), RC_ACT_NONE);
    EXPECT_EQ(AirclickKeyLookup(kPlay, f), RC_ACT_PLAY);
    std::fclose(f);
    EXPECT_STREQ(buf, "Button Released\nPlay\n");
}

TEST(AirclickDecisions, EachPressCountsOnceUntilAReleaseOrAnotherButton)
{
    AirclickRepeatState s {0, 0};
    const std::int64_t t = 1'700'000'000'000'000;
    using O = AirclickOutcome;
    auto step = [&](RcAction found) {
        const O o = AirclickStep(s, found, t);
        return std::make_pair(o.done, o.action);
    };
    EXPECT_EQ(step(RC_ACT_PLAY), std::make_pair(true, RC_ACT_PLAY));
    EXPECT_EQ(step(RC_ACT_PLAY), std::make_pair(false, 0));   // repeat dropped
    EXPECT_EQ(step(RC_ACT_NEXT), std::make_pair(true, RC_ACT_NEXT));
    EXPECT_EQ(step(RC_ACT_NONE), std::make_pair(true, 0));    // release: read ends with 0
    EXPECT_EQ(s.lastAction, 0);
    EXPECT_EQ(step(RC_ACT_NONE), std::make_pair(false, 0));   // a second release is dropped
    EXPECT_EQ(step(RC_ACT_NEXT), std::make_pair(true, RC_ACT_NEXT));
    EXPECT_EQ(s.lastRepeatTime, 0);
}

TEST(AirclickDecisions, AHeldVolumeButtonRepeatsAtMostOncePer200msSinceTheLastRepeat)
{
    AirclickRepeatState s {0, 0};
    const std::int64_t t0 = 1'700'000'000'000'000;
    // Reports every 50 ms, long after any earlier repeat: the press, a repeat
    // at once, then one report in four.
    std::vector<RcAction> given;
    for (int i = 0; i < 10; ++i) {
        const AirclickOutcome o = AirclickStep(s, RC_ACT_VOLUME_UP, t0 + i * 50'000);
        given.push_back(o.done ? o.action : -1);
    }
    EXPECT_EQ(given, (std::vector<RcAction>{9, 9, -1, -1, -1, 9, -1, -1, -1, 9}));

    // The gap counts from the last repeat given, to the microsecond.
    const std::int64_t last = s.lastRepeatTime;
    EXPECT_FALSE(AirclickStep(s, RC_ACT_VOLUME_UP, last + 199'999).done);
    EXPECT_TRUE(AirclickStep(s, RC_ACT_VOLUME_UP, last + 200'000).done);
    // A clock set back is a large unsigned gap: a repeat at once.
    EXPECT_TRUE(AirclickStep(s, RC_ACT_VOLUME_UP, last - 1'000'000).done);
    // The other volume button is a new press, given at once.
    EXPECT_EQ(AirclickStep(s, RC_ACT_VOLUME_DOWN, last - 1'000'000 + 1).action, RC_ACT_VOLUME_DOWN);
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
        ASSERT_GE(writer_, 0);
        ASSERT_EQ(AirclickOpen(), 0);
    }
    void TearDown() override
    {
        AirclickClose();
        if (writer_ >= 0)
            close(writer_);
        unlink(kDevice);
    }
    void Write(const Bytes& report)
    {
        ASSERT_EQ(write(writer_, report.data(), report.size()), static_cast<ssize_t>(report.size()));
    }
    int Pending()
    {
        int n = 0;
        ioctl(writer_, FIONREAD, &n);
        return n;
    }
    // Writes the reports one at a time, each once the driver has taken the
    // one before, as a remote sends them while a button is held.
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

TEST_F(AirclickFifo, APressCountsOnceAndAgainAfterARelease)
{
    vt::SyslogSink log;
    testing::internal::CaptureStdout();
    Write(Report(kPlay));
    EXPECT_EQ(AirclickRead(), RC_ACT_PLAY);
    EXPECT_EQ(testing::internal::GetCapturedStdout(), "Got value: 0 \t1 \t2 \t3 \t250 \t\nPlay\n");

    // The second report is dropped and the read ends after a quiet wait.
    Write(Report(kPlay));
    EXPECT_EQ(AirclickRead(), 0);
    EXPECT_EQ(Pending(), 0);
    EXPECT_EQ(AirclickRepeat.lastAction, RC_ACT_PLAY);

    Write(Report(kRelease));
    EXPECT_EQ(AirclickRead(), 0);
    EXPECT_EQ(AirclickRepeat.lastAction, 0);
    Write(Report(kPlay));
    EXPECT_EQ(AirclickRead(), RC_ACT_PLAY);

    // A held volume button repeats at once, stamped with the time of day.
    Write(Report(kVolumePlus));
    EXPECT_EQ(AirclickRead(), RC_ACT_VOLUME_UP);
    const std::int64_t before = Now();
    Write(Report(kVolumePlus));
    EXPECT_EQ(AirclickRead(), RC_ACT_VOLUME_UP);
    EXPECT_GE(AirclickRepeat.lastRepeatTime, before);
    EXPECT_LE(AirclickRepeat.lastRepeatTime, Now());
    EXPECT_TRUE(log.Lines().empty()) << log.Dump();
}

TEST_F(AirclickFifo, AHeldButtonsRepeatsAreDroppedWithinOneReadUntilTheRelease)
{
    Write(Report(kPlay));
    ASSERT_EQ(AirclickRead(), RC_ACT_PLAY);
    std::thread feeder = Feed({Report(kPlay), Report(kPlay), Report(kPlay), Report(kRelease)});
    // One call takes all four reports: the repeats are dropped, the release ends it.
    EXPECT_EQ(AirclickRead(), 0);
    feeder.join();
    EXPECT_EQ(Pending(), 0);
    EXPECT_EQ(AirclickRepeat.lastAction, 0);

    // Another button while one is held is given at once.
    feeder = Feed({Report(kPlay), Report(kPlay), Report(kNext)});
    EXPECT_EQ(AirclickRead(), RC_ACT_PLAY);
    EXPECT_EQ(AirclickRead(), RC_ACT_NEXT);
    feeder.join();
}

TEST_F(AirclickFifo, BadReadsAreLoggedAndLeaveTheStateAlone)
{
    vt::SyslogSink log;
    Write(Report(kPlay));
    ASSERT_EQ(AirclickRead(), RC_ACT_PLAY);
    Write(Bytes(4, 0xFA));
    EXPECT_EQ(AirclickRead(), -1);
    // Without a writer the FIFO reads as end of file: nothing at all.
    close(writer_);
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

    ASSERT_TRUE(log.WaitFor("(203)"));
    EXPECT_EQ(log.Lines(), (std::vector<std::string>{"hw_airclick.cpp (205) Got short read from device!",
                                                     "hw_airclick.cpp (205) Got short read from device!",
                                                     "hw_airclick.cpp (203) Error reading event."}));
}

TEST(AirclickLifecycle, OpenCloseAndTheRegistry)
{
    vt::SyslogSink log;
    AirclickClose();
    unlink(kDevice);
    EXPECT_EQ(AirclickRead(), 0);  // closed: nothing, at once
    EXPECT_EQ(AirclickOpen(), -1);
    EXPECT_EQ(airclick.descriptor, -1);
    ASSERT_TRUE(log.WaitFor("hw_airclick.cpp"));
    EXPECT_EQ(log.Lines(), std::vector<std::string>{
                               "hw_airclick.cpp (123) failed to open /dev/usb/hiddev1 (No such file or directory)."});

    // The daemon does not use the driver...
    EXPECT_EQ(RcDriversFind("airclick"), nullptr);
    // ...and a table that lists it is all that using it takes.
    RcDriver* const table[] = {&airclick, nullptr};
    ASSERT_EQ(mkfifo(kDevice, 0600), 0);
    const int writer = open(kDevice, O_RDWR | O_CLOEXEC);
    ASSERT_GE(writer, 0);
    AirclickRepeat = {0, 0};
    EXPECT_EQ(RcDriversOpenAll(table), 0);
    const std::int32_t fd = airclick.descriptor;
    EXPECT_GE(fd, 0);
    EXPECT_EQ(AirclickOpen(), 0);  // a second open keeps the descriptor it has
    EXPECT_EQ(airclick.descriptor, fd);
    const Bytes play = Report(kPlay);
    ASSERT_EQ(write(writer, play.data(), play.size()), static_cast<ssize_t>(play.size()));
    EXPECT_EQ(RcDriversPoll(table), RC_ACT_PLAY);
    EXPECT_EQ(RcDriversCloseAll(table), 0);
    EXPECT_EQ(airclick.descriptor, -1);
    EXPECT_EQ(fcntl(fd, F_GETFD), -1);
    close(writer);
    unlink(kDevice);
}

}  // namespace
