#pragma once

#include <string>

namespace kvr {

/// The agent's name at the follow-up centre; also the unique identifier of the single item of earlier
/// versions and the start of every device's.
inline constexpr const char* kFollowUpClientIdentifier = "com.tarsil.Kavrel";
inline constexpr const char* kFollowUpGroupIdentifier = "com.tarsil.followup.group.kvr";
inline constexpr const char* kFollowUpExtensionIdentifier = "com.tarsil.Kavrel.Extension";
/// The application that shows a watch's follow-ups.
inline constexpr const char* kWatchCompanionBundleIdentifier = "com.tarsil.Wristlink";
/// An item's user-info entry by which the agent recognises its own: string, the serial number.
inline constexpr const char* kFollowUpSerialNumberKey = "FollowupSerialNumber";

namespace preference {

/// Serial hashes of the devices whose follow-up was posted: array of strings, each once. Written by posting.
inline constexpr const char* kFollowUpPostedHashes = "FollowupPostedSerialNumberHashes";
/// Serial hashes of dismissed follow-ups: array of strings, one a dismissal. Written by dismissing.
inline constexpr const char* kFollowUpDismissedHashes = "FollowupDismissedSerialNumberHashes";
/// Behind a serial hash: the date of the latest dismissal. Written by dismissing.
inline constexpr const char* kDismissedSuffix = ".dismissed";

}  // namespace preference

namespace activity {

inline constexpr const char* kFollowUpPost = "com.tarsil.kvragent.followuppost";
inline constexpr const char* kFollowUpRefresh = "com.tarsil.kvragent.followuprefresh";

}  // namespace activity
}  // namespace kvr
