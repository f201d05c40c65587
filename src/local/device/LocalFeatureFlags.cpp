#include "local/device/LocalFeatureFlags.h"

namespace kvr {

bool LocalFeatureFlags::isEnabled(std::string_view domain, std::string_view feature) const {
  const auto tree = root_.dictionary("FeatureFlags.plist");
  const auto& flag = tree[domain][feature];
  return flag.isBool() && flag.boolean();
}

}  // namespace kvr
