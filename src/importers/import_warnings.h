#pragma once

#include <cstddef>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "importers/import_error.h"
#include "importers/import_options.h"

namespace tessel::importers {

// Something an import read otherwise than it was written, or left out, and where.
struct ImportWarning {
  std::string source;
  std::optional<std::size_t> line;
  std::string message;
};

// The one text of a warning, located as ImportError locates a fault:
// "work.ics: line 12: RDATE: Can't parse ...; dropped the RDATE of the event "Birthday"".
std::string warningText(const ImportWarning& warning);

// The warnings of one import. Every fault that an import can step over goes through
// fault(): with OnFault::Refuse it is raised as it is, so that the import is all or nothing
// with the messages it always had; with OnFault::Skip it becomes a warning that says what
// the fault cost.
class ImportWarnings {
 public:
  explicit ImportWarnings(OnFault onFault) : onFault_(onFault) {}

  OnFault onFault() const { return onFault_; }

  // `fault` costs `consequence` ("dropped the PHOTO of the card "Jane Doe"").
  void fault(const ImportError& fault, std::string_view consequence);

  // What an import read otherwise than written without a fault (an alarm without ACTION
  // read as a display alarm): a warning with either OnFault.
  void note(std::string source, std::optional<std::size_t> line, std::string message);

  const std::vector<ImportWarning>& all() const { return warnings_; }
  std::size_t count() const { return warnings_.size(); }

  // Hands each fault taken with OnFault::Skip and each note, in order, to `other`'s fault()
  // and note(): a reader that meets them in another order than the import reports them keeps
  // them here meanwhile.
  void passOn(ImportWarnings& other) const;

 private:
  // A fault, or a note when there is none.
  struct Held {
    std::optional<ImportError> fault;
    std::string consequence;
  };

  OnFault onFault_;
  std::vector<ImportWarning> warnings_;
  // Beside each of warnings_.
  std::vector<Held> held_;
};

}  // namespace tessel::importers
