#pragma once

#include "platform/services/FeatureFlags.h"

#include <set>
#include <string>
#include <utility>

namespace kvr {

class SimulatedFeatureFlags : public FeatureFlags {
 public:
  std::set<std::pair<std::string, std::string>> enabled;  ///< domain and feature

  bool isEnabled(std::string_view domain, std::string_view feature) const override {
    return enabled.contains({std::string(domain), std::string(feature)});
  }
};

}  // namespace kvr
