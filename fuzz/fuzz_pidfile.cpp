// The pid file: whatever stands in "/var/run/vexorcd.pid" (left by a crash,
// truncated, edited by hand) decides whether the daemon refuses to start.
// Only a plain positive decimal pid that fits an int, with white space around
// it, may be taken; anything else reads as "no pid".
#include <charconv>
#include <climits>
#include <string_view>

#include "fuzz_util.hpp"
#include "vlibc/vlibc.hpp"

namespace {

constexpr char kPath[] = "/var/run/vexorcd.pid";

bool PidSpace(char c)
{
    return c == ' ' || c == '\t' || c == '\n' || c == '\r';
}

// What the file should read as, worked out independently of the reader.
int Expected(const std::uint8_t* data, std::size_t size)
{
    if (size == 0 || size > 32)
        return 0;
    std::string_view text(reinterpret_cast<const char*>(data), size);
    while (!text.empty() && PidSpace(text.front()))
        text.remove_prefix(1);
    while (!text.empty() && PidSpace(text.back()))
        text.remove_suffix(1);
    if (text.empty() || text.front() < '0' || text.front() > '9')
        return 0;
    long long value = 0;
    const auto [end, ec] = std::from_chars(text.data(), text.data() + text.size(), value);
    if (ec != std::errc() || end != text.data() + text.size())
        return 0;
    return value > 0 && value <= INT_MAX ? static_cast<int>(value) : 0;
}

}  // namespace

extern "C" int LLVMFuzzerInitialize(int*, char***)
{
    fz::RequireSandbox();
    return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size)
{
    fz::WriteWholeFile(kPath, data, size);
    const int pid = VLIBCReadPidFile(kPath);
    if (pid != Expected(data, size))
        fz::Fail("pid file read differs from the plain decimal rule");
    return 0;
}
