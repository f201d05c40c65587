#pragma once

#include <set>
#include <string>

namespace kvr {

/// What has changed, for a client that shows devices. Devices are named by their serial numbers.
struct Change {
  std::set<std::string> records;    ///< devices whose coverage is another
  std::set<std::string> followUps;  ///< devices whose follow-up was posted, changed or removed
  bool devices = false;             ///< the list of devices, or what is said of one in it

  bool isNone() const { return records.empty() && followUps.empty() && !devices; }
};

/// Those who asked to be told of changes. Any thread.
class Observers {
 public:
  virtual ~Observers() = default;
  /// Whether there is anybody. If not, nobody needs to find out what has changed.
  virtual bool areThere() const = 0;
  /// Call when whoever is told can already read what has changed. Several changes may be told as one.
  virtual void tell(const Change& change) = 0;
};

}  // namespace kvr
