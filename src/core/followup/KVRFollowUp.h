#pragma once

#include "core/devices/KVRDeviceInfo.h"
#include "core/followup/KVRFollowUpProvider.h"
#include "platform/Platform.h"
#include "platform/value/AtomicProperty.h"

#include <cstddef>
#include <memory>
#include <optional>
#include <string>
#include <vector>

namespace kvr {

/// Decides, device by device, whether an offer's follow-up is posted, kept up to date, removed or left alone.
///
/// A follow-up is *pending* while the follow-up centre shows it, *posted* once it has been posted, and
/// *dismissed* once the owner dismissed it; the last two are stored in the preferences by serial hash. New
/// follow-ups come from posting only; a refresh updates and clears. A dismissed one is posted again only when
/// its display date has moved past the dismissal.
///
///     KVRFollowUp(platform).refreshFollowupWithDeviceInfos(infos);
///
/// Make one for each call; it has no lasting state. Failures of the centre are logged and otherwise ignored;
/// the preferences then stay as they are. Any thread, synchronous. The operations on one platform take turns:
/// a dismissal in the middle of a refresh could otherwise be undone by it.
class KVRFollowUp {
 public:
  explicit KVRFollowUp(Platform& platform);
  KVRFollowUp(Platform& platform, std::shared_ptr<KVRFollowUpProvider> followUpProvider);

  static std::string uniqueIdentfierForSerialNumber(const std::optional<std::string>& serialNumber);

  /// Posts what is due. Returns whether anything was, even if the centre refused it.
  bool postFollowUpWithDevicesInfo(const KVRDeviceInfoList& devicesInfo);
  /// The same; `repostAllowed` ignores dismissals.
  bool _postFollowUpWithDevicesInfo(const KVRDeviceInfoList& devicesInfo, bool repostAllowed);
  /// Builds and posts one device's follow-up, whatever its date.
  void postFollowUpWithDeviceInfo(const KVRDeviceInfo& deviceInfo);
  /// Whether the offer has started again since its follow-up was dismissed. If so, the follow-up no longer
  /// counts as posted.
  bool _checkConversionEligibilityForDevice(const KVRDeviceInfo& deviceInfo);

  /// Clears the follow-up and remembers the dismissal.
  void dismissFollowUpForSerialNumber(const std::string& serialNumber);
  void _clearFollowUpWithDevices(const std::vector<KVRDeviceRef>& devices);

  /// Updates what is pending, removes what no longer applies; returns the devices whose follow-ups are shown
  /// afterwards. `clearUntrackedDeviceFollowups` also removes those of devices that are not in the list,
  /// `allowForcePost` posts again what is not pending.
  KVRDeviceInfoList refreshFollowupWithDeviceInfos(const KVRDeviceInfoList& deviceInfos,
                                                   bool clearUntrackedDeviceFollowups, bool allowForcePost);
  KVRDeviceInfoList refreshFollowupWithDeviceInfos(const KVRDeviceInfoList& deviceInfos);
  KVRDeviceInfoList refreshFollowupWithDeviceInfo(const KVRDeviceInfoRef& deviceInfo, bool allowForcePost);

  /// How many are pending; 0 if they cannot be listed.
  std::size_t pendingFollowUpCount();
  /// Migrates the single follow-up of earlier versions to the local device; clears it if there is no
  /// warranty.
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

  Turn takeTurn() const;

  Platform& platform_;
};

}  // namespace kvr
