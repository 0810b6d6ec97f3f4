#include "vexorcd/dispatch.hpp"

std::int32_t RcDispatchAction(RcAction action)
{
    (void)action;  // the command client fills this in
    return 0;
}
