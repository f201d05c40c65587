#pragma once

#include "core/warranty/KVRWarrantyDownloader.h"
#include "platform/Platform.h"

#include <memory>
#include <string>

namespace kvr {

/// A downloader for the client with this bundle identifier. It takes the devices manager's default device for
/// the local one, and what it downloads may schedule the conversion outreach.
std::shared_ptr<KVRWarrantyDownloader> newWarrantyDownloader(Platform& platform,
                                                             std::string callingProcessBundleID);

/// Schedules the conversion outreach when a downloaded warranty brings a conversion date that the one cached
/// before it (or null) did not have, and that is earlier than what is scheduled. Any thread.
void _scheduleConversionOutreachIfRequiredForWarranty(Platform& platform, const KVRWarrantyRef& warranty,
                                                      const KVRWarrantyRef& andCachedWarranty);

}  // namespace kvr
