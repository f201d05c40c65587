#pragma once

#include <map>
#include <memory>
#include <mutex>
#include <typeindex>

namespace kvr {

/// Holds the objects that exist once per platform, each made on first use. Thread-safe.
class SharedObjects {
 public:
  /// The one `T`, made by `make` (which must not call `get`) if there is none yet.
  template <class T, class Make>
  std::shared_ptr<T> get(const Make& make) {
    const std::lock_guard lock(mutex_);
    auto& slot = objects_[std::type_index(typeid(T))];
    if (!slot) slot = std::shared_ptr<T>(make());
    return std::static_pointer_cast<T>(slot);
  }

 private:
  std::mutex mutex_;
  std::map<std::type_index, std::shared_ptr<void>> objects_;
};

}  // namespace kvr
