#pragma once

#include <cstdint>

namespace kvr {

/// The keys of an availability dictionary.
namespace availability {

inline constexpr const char* kBundleID = "AppBundleID";      ///< string, the application asked about
inline constexpr const char* kTitle = "AppTitleKey";         ///< string
inline constexpr const char* kVendorName = "AppVendorName";  ///< string
inline constexpr const char* kText = "AppAvailablityText";   ///< string, what to show for the state
inline constexpr const char* kType = "AppAvailabilityType";  ///< integer, the state
inline constexpr const char* kLinkURL = "AppLinkURL";        ///< string, opens the store's page
inline constexpr const char* kIconURL = "AppIconURL";        ///< string

/// The state of an application on this device.
enum Type : std::int64_t { NotFound = 0, Installed = 1, Purchased = 2, InStore = 3 };

}  // namespace availability

namespace preference {

/// Whether the store's answer is overridden, for tests of the settings application: bool. Never written.
inline constexpr const char* kAppSupportAvailability = "AppSupportAvailability";

}  // namespace preference
}  // namespace kvr
