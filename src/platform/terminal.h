#pragma once

namespace zt::platform {

enum class StandardStream { Output, Error };

// Whether the stream is a terminal a person reads: live progress and plain-words summaries go
// there, while pipes and log files get the lines alone.
bool isTerminal(StandardStream stream);

}  // namespace zt::platform
