#pragma once

#include "core/scheduling/KVRSchedulerActivityDelegate.h"
#include "platform/Platform.h"

#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <string>

namespace kvr {

/// Maps names to activities, so that code can schedule an activity by its name alone.
///
/// A platform has one registry. Start-up fills it before anything is scheduled:
///
///     ActivityRegistry::of(platform).add(
///         names::kOutreach, [&platform] { return std::make_shared<KVROutreachActivity>(platform); });
///
/// Any thread.
class ActivityRegistry {
 public:
  using Factory = std::function<std::shared_ptr<KVRSchedulerActivityDelegate>()>;

  static ActivityRegistry& of(Platform& platform);

  /// A later factory of the same name replaces the earlier one.
  void add(const std::string& identifier, Factory factory);
  /// A new activity of this name. Throws std::out_of_range for a name that was not added.
  std::shared_ptr<KVRSchedulerActivityDelegate> newActivity(const std::string& identifier) const;

 private:
  mutable std::mutex mutex_;
  std::map<std::string, Factory> factories_;
};

}  // namespace kvr
