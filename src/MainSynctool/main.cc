#include "MainSynctool/synctool_entry.h"

int main(int argc, char* argv[]) {
  return zt::synctool::synctoolMain(argc, argv);
}
