#pragma once

namespace kvr::preference {

/// Override of the store account's storefront: string, or a value of any other kind by its description (an
/// operator who stores 143441 as a number means that storefront). Never written by the agent.
inline constexpr const char* kStorefrontLocale = "storefrontLocale";
/// The user's text-size category in the UI toolkit's own domain: string. Written by the platform.
inline constexpr const char* kWidgetryDomain = "com.tarsil.Widgetry";
inline constexpr const char* kPreferredContentSize = "UIPreferredContentSizeCategoryName";

}  // namespace kvr::preference

namespace kvr::header {

inline constexpr const char* kVornicToken = "X-Tarsil-Vornic-Token";
inline constexpr const char* kAltDSID = "altDSID";
inline constexpr const char* kUserAgent = "User-Agent";
inline constexpr const char* kStorefrontLocale = "storefrontLocale";
inline constexpr const char* kContentType = "Content-Type";
inline constexpr const char* kSerialNumber = "X-Tarsil-SN";
inline constexpr const char* kTransactionID = "X-Tarsil-Txn-ID";
inline constexpr const char* kContentSize = "X-Tarsil-Content-Size";
inline constexpr const char* kDM = "X-Tarsil-DM";
inline constexpr const char* kOfferID = "Offer-ID";

}  // namespace kvr::header
