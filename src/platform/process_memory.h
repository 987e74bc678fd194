#pragma once

namespace zt::platform {

// Keeps every thread's allocations in one memory arena. By default each thread that
// allocates gets an arena of its own, and what it frees stays there for it alone: the
// threads that convert photos in turn would each keep the pixels of their last picture
// resident. Called once, before any thread starts.
void useOneMemoryArena();

}  // namespace zt::platform
