#pragma once

namespace zt::filters {

// Makes both filter classes known to the engine, so that stored filters decode into them
// instead of staying opaque.
void registerFilterClasses();

}  // namespace zt::filters
