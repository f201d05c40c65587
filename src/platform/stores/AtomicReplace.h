#pragma once

#include "platform/value/Error.h"

#include <optional>
#include <string>

namespace kvr {

/// The steps of replacing a file, implemented for one file system. Each reports its own failure.
class ReplaceSteps {
 public:
  virtual ~ReplaceSteps() = default;
  /// Creates an empty file beside the one to be replaced.
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

/// Replaces a file so that its name always leads to the complete old or the complete new content, even after
/// a power loss, and to the new content once this has returned without an error. After an error in any step
/// but the last, the old file stays and nothing else is left behind.
std::optional<Error> replaceAtomically(ReplaceSteps& steps, const std::string& bytes);

}  // namespace kvr
