// Raytac radio receiver driver: HID keyboard usages through hiddev.
#pragma once

#include "common/rc_types.hpp"

// The driver record, first in the registry; SIGUSR1/SIGUSR2 open and close it.
extern RcDriver raytac;

std::int32_t RaytacOpen();
std::int32_t RaytacRead();
std::int32_t RaytacClose();
