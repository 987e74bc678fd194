#pragma once

#include <stdexcept>

namespace tessel::cli {

// A command line that names something impossible (a value of the wrong form): the command
// exits with status 2, like an argument the parser refused, rather than 1 for a failure.
class UsageError : public std::runtime_error {
 public:
  using std::runtime_error::runtime_error;
};

}  // namespace tessel::cli
