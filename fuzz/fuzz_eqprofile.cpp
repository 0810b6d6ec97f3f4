// The equalizer profile file, which users edit: any content, searched with
// any name and size of buffer. The buffer is written only on a match, and
// then with a trimmed value from the file that fits it.
// Input: a byte for the buffer size, a name up to the first newline, then the file.
#include <fstream>

#include "audioctl/ctrl.hpp"
#include "fuzz_util.hpp"

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size)
{
    const std::string input(reinterpret_cast<const char*>(data), size);
    const int outSize = size > 0 && data[0] < 0x40 ? 1 + data[0] % 32 : 1024;  // sometimes one that cuts
    const std::size_t newline = std::min(input.find('\n'), size), from = std::min<std::size_t>(1, newline);
    const std::string name = input.substr(from, newline - from).c_str();
    const std::string file = input.substr(std::min(newline + 1, size));
    std::ofstream("/tmp/profiles", std::ios::binary | std::ios::trunc) << file;
    char out[1100];
    std::memset(out, 'Z', sizeof out);
    const int got = AudioEqLookupProfile("/tmp/profiles", name.c_str(), out, outSize);
    const std::string value = got == 1 ? out : "";
    const auto space = [](char c) { return c != '\0' && std::strchr(" \t\n\r\v\f", c) != nullptr; };
    fz::Check(got >= -1 && got <= 1 && file.find(value) != std::string::npos, "a value that is not in the file");
    fz::Check(std::all_of(out + (got == 1 ? outSize : 0), std::end(out), [](char c) { return c == 'Z'; }) &&
                  value.size() < static_cast<std::size_t>(outSize), "a buffer written beyond the value");
    fz::Check(value.empty() || (!space(value.front()) && !space(value.back())), "a value not trimmed");
    return 0;
}
