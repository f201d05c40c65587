#pragma once

#include "platform/services/DeviceProperties.h"

#include <functional>
#include <map>
#include <string>

namespace kvr {

/// Answers from a table; a question that is not in it has no answer.
class SimulatedDeviceProperties : public DeviceProperties {
 public:
  std::map<std::string, std::string, std::less<>> answers;
  bool internalInstall = false;

  std::optional<std::string> answer(std::string_view question) const override {
    const auto found = answers.find(question);
    return found == answers.end() ? std::nullopt : std::optional(found->second);
  }
  bool isInternalInstall() const override { return internalInstall; }
};

}  // namespace kvr
