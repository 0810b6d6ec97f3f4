#include "drivers/hw_vexoctrl.hpp"

// Placeholder until the control socket is built.
RcDriver vexoctrl = {"vexoctrl", "/tmp/vexoctrl", -1, CtrlSockOpen, CtrlSockRead, CtrlSockClose};

std::int32_t CtrlSockOpen() { return -1; }
std::int32_t CtrlSockRead() { return 0; }
std::int32_t CtrlSockClose() { return 0; }
