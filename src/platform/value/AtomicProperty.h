#pragma once

#include <mutex>
#include <utility>

namespace kvr {

/// A record's property. Readable and writable from any thread; a reader sees the complete old or new value.
/// Read it as `record->name()`, write it as `record->name = value`.
template <class T>
class AtomicProperty {
 public:
  AtomicProperty() = default;
  AtomicProperty(T value) : value_(std::move(value)) {}  // NOLINT(google-explicit-constructor)
  AtomicProperty(const AtomicProperty&) = delete;
  AtomicProperty& operator=(const AtomicProperty&) = delete;

  T operator()() const {
    const std::lock_guard lock(mutex_);
    return value_;
  }

  AtomicProperty& operator=(T value) {
    const std::lock_guard lock(mutex_);
    std::swap(value_, value);
    return *this;
  }

 private:
  mutable std::mutex mutex_;
  T value_{};
};

}  // namespace kvr
