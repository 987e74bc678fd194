#include "sync/synctool_entry.h"

int main(int argc, char* argv[]) { return zt::sync::synctoolMain(argc, argv); }
