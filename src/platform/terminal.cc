#include "platform/terminal.h"

#include <unistd.h>

namespace zt::platform {

bool isTerminal(StandardStream stream) {
  return ::isatty(stream == StandardStream::Output ? STDOUT_FILENO : STDERR_FILENO) == 1;
}

}  // namespace zt::platform
