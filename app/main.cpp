#include "Startup.h"

int main(int argc, char **argv)
{
    return runFtpConfig(argc, argv);
}
