#pragma once

#include <exception>
#include <string>
#include <string_view>

namespace tessel {

// The one exception type the engine raises. Callers tell failures apart by name(); the
// cancellation of a session is named TesselSessionCancelledException (schema.h).
class Exception : public std::exception {
 public:
  Exception(std::string_view name, std::string reason);

  const std::string& name() const { return name_; }
  const std::string& reason() const { return reason_; }
  // "name: reason", the text log lines print.
  const std::string& description() const { return description_; }
  const char* what() const noexcept override { return description_.c_str(); }

 private:
  std::string name_;
  std::string reason_;
  std::string description_;
};

// Names of the other failures.
inline constexpr std::string_view TesselStoreException = "TesselStoreException";
inline constexpr std::string_view TesselUnknownClientException = "TesselUnknownClientException";
inline constexpr std::string_view TesselUnknownRecordException = "TesselUnknownRecordException";
inline constexpr std::string_view TesselInvalidRecordException = "TesselInvalidRecordException";
inline constexpr std::string_view TesselSessionRunningException = "TesselSessionRunningException";
inline constexpr std::string_view TesselSessionEndedException = "TesselSessionEndedException";
inline constexpr std::string_view TesselCodingException = "TesselCodingException";

}  // namespace tessel
