#include "host/services/Epck.h"

#include <cstdio>

int main(int argc, char **argv)
{
    const int status = norvhost::epckMain(argc, argv);
    if (status == 2)
        fprintf(stderr, "usage: epck --vaaick nolog\nexit status 0: the iSCSI service answers, 1: it does not\n");
    return status;
}
