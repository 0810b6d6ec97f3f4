// Control-socket driver: local programs inject 4-byte action codes on "/tmp/vexoctrl".
#pragma once

#include "common/rc_types.hpp"

// The driver record, second in the registry.
extern RcDriver vexoctrl;

std::int32_t CtrlSockOpen();
std::int32_t CtrlSockRead();
std::int32_t CtrlSockClose();
