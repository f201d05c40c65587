#pragma once

#include "core/warranty/KVRWarrantyDownloader.h"
#include "platform/Platform.h"

#include <memory>
#include <string>

namespace kvr {

/// A downloader for the client with this bundle identifier. Its local device is the devices manager's default
/// device, and each downloaded warranty may schedule the conversion outreach.
std::shared_ptr<KVRWarrantyDownloader> newWarrantyDownloader(Platform& platform,
                                                             std::string callingProcessBundleID);

/// Schedules the conversion outreach if a downloaded warranty has a conversion date that differs from the
/// cached one's and is earlier than the scheduled date. `andCachedWarranty` is the warranty cached so far, or
/// null. False when the date is news and could not be stored: the cache must then keep the earlier warranty,
/// so that the date is still news for the next download. Any thread.
bool _scheduleConversionOutreachIfRequiredForWarranty(Platform& platform, const KVRWarrantyRef& warranty,
                                                      const KVRWarrantyRef& andCachedWarranty);

}  // namespace kvr
