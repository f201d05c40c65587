#pragma once

#include "platform/value/Date.h"
#include "platform/value/Error.h"
#include "platform/value/Value.h"

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <vector>

namespace kvr {

/// The settings application's identifier at the follow-up centre.
inline constexpr const char* kFollowUpSettingsBundleIdentifier = "com.tarsil.followup.settings";
/// User-info keys from which the centre renders the days left until an item's expiration date: whether the
/// count is rounded up (bool), the text for a single day, the format for several.
inline constexpr const char* kFollowUpRelativeDateCeilingKey = "FollowUpRelativeDateCeiling";
inline constexpr const char* kFollowUpRelativeDateSingleDayKey = "FollowUpRelativeDateSingleDay";
inline constexpr const char* kFollowUpRelativeDatePluralDaysFormatKey =
    "FollowUpRelativeDatePluralDaysFormat";

struct FollowUpAction {
  Value label;  ///< text, or another kind of value if the service sent one; null for none
  std::optional<std::string> url;

  friend bool operator==(const FollowUpAction&, const FollowUpAction&) = default;
};

/// A pending action as the settings application (or a companion application) shows it.
struct FollowUpItem {
  std::optional<std::string> uniqueIdentifier;
  std::optional<std::string> groupIdentifier;
  std::optional<std::string> targetBundleIdentifier;
  std::optional<std::string> extensionIdentifier;
  std::uint64_t displayStyle = 0;  ///< bit set; 1 is the row's badge
  Value title;                     ///< as a label
  Value informativeFooterText;     ///< as a label
  std::optional<Date> expirationDate;
  Value::Dictionary userInfo;
  std::vector<FollowUpAction> actions;

  friend bool operator==(const FollowUpItem&, const FollowUpItem&) = default;
};

/// One client's view of the follow-up centre. Any thread; all operations are synchronous.
class FollowUpCenterClient {
 public:
  virtual ~FollowUpCenterClient() = default;
  /// Posts an item; it replaces a pending one with the same unique identifier. Nothing on success.
  virtual std::optional<Error> postItem(const FollowUpItem& item) = 0;
  /// Clears pending items; an identifier that is not pending is no error. Nothing on success.
  virtual std::optional<Error> clearPendingItems(const std::vector<std::string>& uniqueIdentifiers) = 0;
  /// This client's pending items, in the order first posted. Items whose expiration date has passed are left
  /// out.
  virtual Result<std::vector<FollowUpItem>> pendingItems() = 0;
};

class FollowUpCenter {
 public:
  virtual ~FollowUpCenter() = default;
  virtual std::unique_ptr<FollowUpCenterClient> newClient(std::string clientIdentifier) = 0;
};

}  // namespace kvr
