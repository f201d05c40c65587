#pragma once

#include "platform/services/Clock.h"
#include "platform/services/FollowUpCenter.h"
#include "platform/stores/PropertyListFiles.h"

namespace kvr {

/// Pending items kept as one property list a client below "Library/FollowUps" of the home directory.
///
/// Changes are made under the directory's lock, on what the file holds at that moment, so no two clients lose
/// each other's items; an item that is not touched keeps whatever its entry holds.
class FileFollowUpCenter : public FollowUpCenter {
 public:
  FileFollowUpCenter(PropertyListFiles& lists, const Clock& clock) : lists_(lists), clock_(clock) {}

  std::unique_ptr<FollowUpCenterClient> newClient(std::string clientIdentifier) override;

 private:
  class Client;

  PropertyListFiles& lists_;
  const Clock& clock_;
};

}  // namespace kvr
