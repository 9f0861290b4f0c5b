#include <cstdio>

int main()
{
    std::fputs("ftpconfig: the main window is not built yet; see README.md for the test command.\n", stderr);
    return 1;
}
