#pragma once

#include "platform/value/Error.h"

#include <optional>
#include <string>

namespace kvr {

/// How an operation of the follow-up centre went, for a log line: "success", or its error.
inline std::string outcomeText(const std::optional<Error>& error) {
  return error ? describe(*error) : "success";
}

}  // namespace kvr
