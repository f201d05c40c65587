#pragma once

#include "platform/services/Clock.h"
#include "platform/services/FollowUpCenter.h"
#include "platform/services/Observers.h"
#include "platform/stores/PropertyListFiles.h"

namespace kvr {

/// Keeps pending items in one property list per client below "Library/FollowUps" of the home directory.
///
/// Changes are made under the directory's lock, on the file's current content, so concurrent clients do not
/// lose each other's items. Entries of items that do not change are kept as they are, unknown keys included.
/// The observers are told whose items these changes concern.
class FileFollowUpCenter : public FollowUpCenter {
 public:
  FileFollowUpCenter(PropertyListFiles& lists, const Clock& clock, Observers& observers)
      : lists_(lists), clock_(clock), observers_(observers) {}

  std::unique_ptr<FollowUpCenterClient> newClient(std::string clientIdentifier) override;

 private:
  class Client;

  PropertyListFiles& lists_;
  const Clock& clock_;
  Observers& observers_;
};

}  // namespace kvr
