// The system library stand-in: pid files, liveness and trimming.
#include <unistd.h>

#include <cstdio>
#include <cstring>

#include <gtest/gtest.h>

#include "harness.hpp"
#include "vlibc/vlibc.hpp"

namespace {

TEST(VlibcPidFile, ReadsADecimalPidAndTreatsEverythingElseAsNone)
{
    vt::RequireSandbox();
    const char* path = "/tmp/test.pid";
    const struct { const char* content; int pid; } cases[] = {
        {"1234", 1234}, {"1234\n", 1234}, {" 77 \n", 77}, {"2147483647", 2147483647},
        {"", 0}, {"\n", 0}, {"abc", 0}, {"12ab", 0}, {"-5", 0}, {"0", 0}, {"+5", 0},
        {"2147483648", 0}, {"99999999999999999999", 0}, {"1 2", 0},
        {"00000000000000000000000000000000000000001", 0},  // longer than any pid file
    };
    for (const auto& c : cases) {
        vt::WriteFile(path, c.content);
        EXPECT_EQ(VLIBCReadPidFile(path), c.pid) << '"' << c.content << '"';
    }
    unlink(path);
    EXPECT_EQ(VLIBCReadPidFile(path), 0);
    EXPECT_EQ(VLIBCReadPidFile("/tmp"), 0);
    EXPECT_EQ(VLIBCReadPidFile(nullptr), 0);
}

TEST(VlibcProcAlive, ProbesWithoutSignallingAndRefusesGroupPids)
{
    EXPECT_EQ(VLIBCProcAlive(getpid()), 1);
    EXPECT_EQ(VLIBCProcAlive(1), 1);
    EXPECT_EQ(VLIBCProcAlive(4194305), 0);  // above the kernel's pid limit
    EXPECT_EQ(VLIBCProcAlive(0), 0);
    EXPECT_EQ(VLIBCProcAlive(-1), 0);
}

}  // namespace

namespace {

TEST(VlibcTrim, TrimsBothEndsInPlace)
{
    const struct { const char* in; const char* out; } cases[] = {
        {"  a b \t\n", "a b"}, {"x", "x"}, {"", ""}, {" \t\r\n\v\f", ""}, {"\n 1.5 -2\r\n", "1.5 -2"},
    };
    for (const auto& c : cases) {
        char text[32];
        std::snprintf(text, sizeof text, "%s", c.in);
        EXPECT_EQ(VLIBCStrTrimSpace(text, 0), static_cast<int>(std::strlen(c.out))) << c.in;
        EXPECT_STREQ(text, c.out);
    }
    char keep[] = " k ";
    EXPECT_EQ(VLIBCStrTrimSpace(keep, 1), -1);  // no flags are defined
    EXPECT_STREQ(keep, " k ");
    EXPECT_EQ(VLIBCStrTrimSpace(nullptr, 0), -1);
}

}  // namespace
