#pragma once

#include <string_view>

namespace kvr {

/// The platform's feature switches; a switch that is not set is off. Any thread.
class FeatureFlags {
 public:
  virtual ~FeatureFlags() = default;
  virtual bool isEnabled(std::string_view domain, std::string_view feature) const = 0;
};

}  // namespace kvr
