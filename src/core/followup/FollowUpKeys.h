#pragma once

namespace kvr {

inline constexpr const char* kFollowUpGroupIdentifier = "com.tarsil.followup.group.kvr";
inline constexpr const char* kFollowUpExtensionIdentifier = "com.tarsil.Kavrel.Extension";
/// The application that shows a watch's follow-ups.
inline constexpr const char* kWatchCompanionBundleIdentifier = "com.tarsil.Wristlink";

namespace preference {

/// Serial hashes of the devices whose follow-up was posted: array of strings, each once. Written by posting.
inline constexpr const char* kFollowUpPostedHashes = "FollowupPostedSerialNumberHashes";
/// Serial hashes of dismissed follow-ups: array of strings, one per dismissal. Written by dismissing.
inline constexpr const char* kFollowUpDismissedHashes = "FollowupDismissedSerialNumberHashes";

}  // namespace preference
}  // namespace kvr
