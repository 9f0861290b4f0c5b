#pragma once

// The whole program: main() hands over its arguments and returns the
// result. Besides Qt's own options it takes "--root DIR" (or
// "--root=DIR"): DIR stands for "/" for every file read or written, as
// FTPCONFIG_ROOT does.
int runFtpConfig(int argc, char **argv);

// True exactly when the real user is root.
bool isLaunchedByRoot();

// Tells the user that only root may run the program and returns the exit
// status for that case.
int refuseNonRootLauncher();
