#pragma once

#include "core/devices/KVRDeviceInfo.h"
#include "core/followup/KVRFollowUpProvider.h"
#include "platform/Platform.h"
#include "platform/value/AtomicProperty.h"

#include <cstddef>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

namespace kvr {

/// Decides, device by device, whether an offer's follow-up is posted, kept up to date, removed or left alone.
///
/// A follow-up is *pending* while the follow-up centre shows it, *posted* once it has been posted, and
/// *dismissed* once the owner dismissed it; the last two are remembered in the preferences by serial hash.
/// New follow-ups come from posting only; a refresh updates and clears. A dismissed one is posted again only
/// when its display date has moved past the dismissal.
///
///     KVRFollowUp(platform).refreshFollowupWithDeviceInfos(infos);
///
/// Made for one call; everything that lasts is elsewhere. Failures of the centre are logged and otherwise
/// ignored; the preferences then stay as they are. Any thread, synchronously; operations of one platform take
/// turns, so that what one decides on still holds when it acts: a dismissal comes before a refresh or after
/// it, never in between, where the refresh would bring the item back.
class KVRFollowUp {
 public:
  explicit KVRFollowUp(Platform& platform);
  KVRFollowUp(Platform& platform, std::shared_ptr<KVRFollowUpProvider> followUpProvider);

  static std::string uniqueIdentfierForSerialNumber(const std::optional<std::string>& serialNumber);

  /// Posts what is due; whether anything was. A refused post counts as well.
  bool postFollowUpWithDevicesInfo(const KVRDeviceInfoList& devicesInfo);
  /// The same; `repostAllowed` disregards dismissals.
  bool _postFollowUpWithDevicesInfo(const KVRDeviceInfoList& devicesInfo, bool repostAllowed);
  /// Builds and posts one device's follow-up, whatever its date.
  void postFollowUpWithDeviceInfo(const KVRDeviceInfo& deviceInfo);
  /// Whether the offer has begun anew since its follow-up was dismissed; then it no longer counts as posted.
  bool _checkConversionEligibilityForDevice(const KVRDeviceInfo& deviceInfo);

  /// Clears the follow-up and remembers the dismissal.
  void dismissFollowUpForSerialNumber(const std::string& serialNumber);
  void _clearFollowUpWithDevices(const std::vector<KVRDeviceRef>& devices);

  /// Updates what is pending, removes what no longer applies; returns the devices whose follow-ups are shown
  /// after it. `clearUntrackedDeviceFollowups` also removes those of devices that are not in the list,
  /// `allowForcePost` posts again what is not pending.
  KVRDeviceInfoList refreshFollowupWithDeviceInfos(const KVRDeviceInfoList& deviceInfos,
                                                   bool clearUntrackedDeviceFollowups, bool allowForcePost);
  KVRDeviceInfoList refreshFollowupWithDeviceInfos(const KVRDeviceInfoList& deviceInfos);
  KVRDeviceInfoList refreshFollowupWithDeviceInfo(const KVRDeviceInfoRef& deviceInfo, bool allowForcePost);

  /// 0 when they cannot be listed.
  std::size_t pendingFollowUpCount();
  /// Turns the single follow-up of earlier versions into the local device's; without a warranty clears it.
  void migrateLegacyFollowUpIfNeededWithDeviceInfo(const KVRDeviceInfo& deviceInfo);

  /// Rewrites an item's texts, expiration, badge, user info and action. The device info must carry a warranty
  /// and a device with a serial number.
  void _setupFollowUpItem(FollowUpItem& item, const KVRDeviceInfo& withDeviceInfo) const;

  AtomicProperty<std::shared_ptr<KVRFollowUpProvider>> followUpProvider;

 private:
  FollowUpItem newFollowUpItem(const KVRDeviceInfo& deviceInfo) const;
  Value::Dictionary userInfoFor(const KVRWarranty& warranty, const std::string& serialNumber) const;
  std::vector<FollowUpItem> pendingItems();
  bool isToPost(const KVRDeviceInfo& deviceInfo, bool repostAllowed);
  bool isDue(const KVRDeviceInfo& deviceInfo);
  KVRDeviceInfoList updateItems(std::vector<FollowUpItem>& pending, const KVRDeviceInfoList& deviceInfos);

  struct Turn {
    std::recursive_mutex mutex;
  };
  std::unique_lock<std::recursive_mutex> takeTurn() const { return std::unique_lock(turn_->mutex); }

  Platform& platform_;
  const std::shared_ptr<Turn> turn_;
};

}  // namespace kvr
