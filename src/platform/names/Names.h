#pragma once

#include <string>
#include <string_view>

// Names that the agent shares with its clients and the host. They are an interface: changing one breaks
// others.
namespace kvr::names {

/// The agent's main bundle identifier, also its name on the bus and its preference domain.
inline constexpr const char* kAgent = "com.tarsil.kvragent";

// --- the bus
// ------------------------------------------------------------------------------------------------

inline constexpr const char* kObjectPath = "/com/tarsil/kvragent";
inline constexpr const char* kInterface = "com.tarsil.kvragent.KVRAgentProtocol";
/// How a client asks to be told of changes, and how it is told.
inline constexpr const char* kChangesInterface = "com.tarsil.kvragent.Changes";
inline constexpr const char* kChangedMember = "Changed";
/// Clients whose program lacks this entitlement (a true boolean) are not served.
inline constexpr const char* kEntitlement = "com.tarsil.private.kvragent";

/// A system-wide notification is a signal whose argument is the notification's name. Any program may send it.
inline constexpr const char* kNotificationPath = "/com/tarsil/NotificationCenter";
inline constexpr const char* kNotificationInterface = "com.tarsil.NotificationCenter";
inline constexpr const char* kNotificationMember = "Posted";
inline constexpr const char* kLanguageChanged = "com.tarsil.language.changed";
inline constexpr const char* kDeviceDidPair = "com.tarsil.pairedregistry.device-did-pair";
inline constexpr const char* kDeviceDidUnpair = "com.tarsil.pairedregistry.device-did-unpair";

// --- background activities
// ----------------------------------------------------------------------------------

inline constexpr const char* kPostUpgrade = "com.tarsil.kvragent.upgrade";
inline constexpr const char* kPostBoot = "com.tarsil.kvragent.boot";
inline constexpr const char* kOutreach = "com.tarsil.kvragent.outreach";
inline constexpr const char* kConversionOutreach = "com.tarsil.kvragent.conversionoutreach";
inline constexpr const char* kFollowUpPost = "com.tarsil.kvragent.followuppost";
inline constexpr const char* kFollowUpRefresh = "com.tarsil.kvragent.followuprefresh";

// --- files, below the home directory
// ------------------------------------------------------------------------

/// The agent's client identifier at the follow-up centre, also the name of its warranty cache's folder.
inline constexpr const char* kFollowUpClient = "com.tarsil.Kavrel";

inline constexpr std::string_view kPreferencesFolder = "Library/Preferences";
inline constexpr std::string_view kFollowUpsFolder = "Library/FollowUps";
inline constexpr std::string_view kActivitiesFolder = "Library/Activities";
inline constexpr std::string_view kKeysFolder = "Library/Keys";
inline constexpr std::string_view kCacheFolder = "Library/Application Support/com.tarsil.Kavrel";

/// The property list of one domain or client in one of these folders.
inline std::string listIn(std::string_view folder, std::string_view name) {
  return std::string(folder) + "/" + std::string(name) + ".plist";
}
inline std::string preferencesFile() { return listIn(kPreferencesFolder, kAgent); }
inline std::string activitiesFile() { return listIn(kActivitiesFolder, kAgent); }
inline std::string followUpsFile() { return listIn(kFollowUpsFolder, kFollowUpClient); }

// --- entries of those files that clients read
// ---------------------------------------------------------------

/// Preference key suffix after an activity's identifier: the date before which the activity does not run.
inline constexpr const char* kTargetDateSuffix = ".TargetDate";
/// Preference key suffix after a serial hash and "_": when the device's warranty was downloaded.
inline constexpr const char* kLastUpdatedDate = "CachedWarrantyLastUpdatedDate";
/// Preference key suffix after a serial hash: the date of the latest dismissal.
inline constexpr const char* kDismissedSuffix = ".dismissed";
/// User-info key of a follow-up: the serial number of its device.
inline constexpr const char* kFollowUpSerialNumber = "FollowupSerialNumber";

}  // namespace kvr::names
