#include "core/scheduling/ActivityRegistry.h"

#include <utility>

namespace kvr {

ActivityRegistry& ActivityRegistry::of(Platform& platform) {
  return *platform.sharedObjects.get<ActivityRegistry>([] { return new ActivityRegistry; });
}

void ActivityRegistry::add(const std::string& identifier, Factory factory) {
  const std::lock_guard lock(mutex_);
  factories_[identifier] = std::move(factory);
}

std::shared_ptr<KVRSchedulerActivityDelegate> ActivityRegistry::newActivity(
    const std::string& identifier) const {
  Factory factory;
  {
    const std::lock_guard lock(mutex_);
    factory = factories_.at(identifier);
  }
  return factory();
}

}  // namespace kvr
