#pragma once

namespace zt::synctool {

// The whole program: reads the "DebugLog" default, finds the identifier after "--sync",
// runs one sync for it and answers the exit status: 0 whenever a sync was attempted,
// whatever its outcome (the final notification carries that), 1 when no identifier was
// given. Every other argument, "--oneshot" included, is accepted and ignored.
int synctoolMain(int argc, const char* const argv[]);

// Logs the usage line, whether or not debug logging is on.
void usage();

}  // namespace zt::synctool
