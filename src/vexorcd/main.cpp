#include "vexorcd/vexorcd.hpp"

int main(int argc, char** argv)
{
    return RcDaemonMain(argc, argv);
}
