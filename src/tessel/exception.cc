#include "tessel/exception.h"

namespace tessel {

Exception::Exception(std::string_view name, std::string reason)
    : name_(name), reason_(std::move(reason)), description_(name_ + ": " + reason_) {}

}  // namespace tessel
