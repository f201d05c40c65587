#include "platform/stores/AtomicReplace.h"

namespace kvr {

std::optional<Error> replaceAtomically(ReplaceSteps& steps, const std::string& bytes) {
  if (auto error = steps.createTemporary()) return error;
  auto error = steps.write(bytes);
  if (!error) error = steps.sync();
  if (!error) error = steps.moveIntoPlace();
  if (error) {
    steps.removeTemporary();
    return error;
  }
  return steps.syncDirectory();
}

}  // namespace kvr
