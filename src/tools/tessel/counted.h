#pragma once

#include <cstddef>
#include <string>
#include <string_view>

namespace tessel::cli {

// "1 event", "3 events": a count and the noun that agrees with it, as the commands report.
std::string counted(std::size_t count, std::string_view one, std::string_view many);

}  // namespace tessel::cli
