// What the fuzz targets share. They write the daemon's built-in paths, so
// they run only inside tests/sandbox.sh (fuzz/run.sh sees to it). Each checks
// properties of what the code gives back, never a second account of its work.
#pragma once

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <iterator>
#include <string>

namespace fz {

// Stops the fuzzer with a message; libFuzzer keeps the input.
inline void Check(bool holds, const char* what)
{
    if (!holds) {
        std::fprintf(stderr, "fuzz check failed: %s\n", what);
        std::abort();
    }
}

inline const bool inSandbox = (Check(std::getenv("VEXO_IN_SANDBOX") != nullptr, "run in tests/sandbox.sh"), true);

}  // namespace fz
