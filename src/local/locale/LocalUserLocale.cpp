#include "local/locale/LocalUserLocale.h"

#include "local/locale/LocaleModule.h"
#include "local/system/LoadedLibrary.h"

#include <algorithm>
#include <array>
#include <cmath>
#include <cstdlib>
#include <ctime>
#include <mutex>

namespace kvr {
namespace {

constexpr std::string_view kDefaultIdentifier = "en_US";

/// Whether a text has the form of a locale identifier. It is used in paths and headers.
bool isIdentifier(std::string_view text) {
  constexpr std::size_t kLongest = 128;
  return !text.empty() && text.size() <= kLongest && std::ranges::all_of(text, [](char c) {
    return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9') ||
           std::string_view("_-@=;").find(c) != std::string_view::npos;
  });
}

/// Taken from the first variable that is set, without encoding and modifier.
std::string identifierFromEnvironment() {
  for (const auto* name : {"LC_ALL", "LC_MESSAGES", "LANG"}) {
    const char* const value = std::getenv(name);
    if (value == nullptr || value[0] == '\0') continue;
    std::string_view identifier(value);
    identifier = identifier.substr(0, identifier.find_first_of(".@"));
    if (isIdentifier(identifier) && identifier != "C" && identifier != "POSIX")
      return std::string(identifier);
    break;
  }
  return std::string(kDefaultIdentifier);
}

}  // namespace

std::optional<std::string> LocalUserLocale::statedByDevice() const {
  auto stated = root_.dictionary("Locale.plist")["identifier"].stringIfAny();
  return stated && isIdentifier(*stated) ? stated : std::nullopt;
}

std::string LocalUserLocale::preferredIdentifier() const {
  const auto stated = statedByDevice();
  return stated ? *stated : identifierFromEnvironment();
}

long LocalUserLocale::secondsFromGMT(Date date) const {
  constexpr double kLast = 1e14;  // seconds; far beyond the rules of any time zone
  const double seconds =
      std::isnan(date.secondsSince1970) ? 0 : std::clamp(date.secondsSince1970, -kLast, kLast);
  const auto time = static_cast<std::time_t>(std::floor(seconds));
  // The C library's time zone is global to the process.
  static std::mutex zoneMutex;
  const std::lock_guard lock(zoneMutex);
  ::tzset();
  std::tm local{};
  return ::localtime_r(&time, &local) == nullptr ? 0 : local.tm_gmtoff;
}

std::string LocalUserLocale::decimalString(std::uint64_t number) const {
  std::call_once(loaded_, [this] {
    if (const auto symbol = loadSymbol(kLocaleModuleFile, kDecimalStringSymbol)) {
      decimalString_ = *symbol;
    } else {
      log_.error("numbers are written as plain digits: %@", symbol.error());
    }
  });
  std::array<char, 256> text{};
  if (decimalString_ != nullptr) {
    const auto format = reinterpret_cast<DecimalString>(decimalString_);
    const int length = format(preferredIdentifier().c_str(), number, text.data(), text.size());
    if (length > 0) return {text.data(), static_cast<std::size_t>(length)};
  }
  return std::to_string(number);
}

}  // namespace kvr
