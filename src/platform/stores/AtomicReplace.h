#pragma once

#include "platform/value/Error.h"

#include <optional>
#include <string>

namespace kvr {

/// The steps in which a file is replaced, as one file system does them. Each reports its own failure.
class ReplaceSteps {
 public:
  virtual ~ReplaceSteps() = default;
  /// Makes an empty file beside the one to be replaced.
  virtual std::optional<Error> createTemporary() = 0;
  virtual std::optional<Error> write(const std::string& bytes) = 0;
  /// Makes what was written durable.
  virtual std::optional<Error> sync() = 0;
  /// Gives the temporary file the name of the one to be replaced.
  virtual std::optional<Error> moveIntoPlace() = 0;
  /// Makes the directory's entries durable.
  virtual std::optional<Error> syncDirectory() = 0;
  virtual void removeTemporary() = 0;
};

/// Replaces a file so that at every moment, after a loss of power too, its name leads to the old content or
/// to the new one, whole; to the new one for good once this has returned without an error. After an error
/// in any step but the last, the old file stays and nothing else is left behind.
std::optional<Error> replaceAtomically(ReplaceSteps& steps, const std::string& bytes);

}  // namespace kvr
