#include "drivers/hw_raytac.hpp"

// Placeholder until the receiver driver is built.
RcDriver raytac = {"raytac", "/dev/usb/hiddev5", -1, RaytacOpen, RaytacRead, RaytacClose};

std::int32_t RaytacOpen() { return -1; }
std::int32_t RaytacRead() { return 0; }
std::int32_t RaytacClose() { return 0; }
