#include "platform/process_memory.h"

#include <malloc.h>

namespace zt::platform {

void useOneMemoryArena() {
  // glibc's M_ARENA_MAX; a failure leaves the default, which only costs memory.
  (void)mallopt(M_ARENA_MAX, 1);
}

}  // namespace zt::platform
