#include "core/followup/FollowUpDates.h"

#include <algorithm>
#include <cmath>

namespace kvr {
namespace {

constexpr double kLeastInterval = 60;  // seconds
constexpr double kUsualDay = 86400;    // seconds
constexpr double kShortestDay = 1;     // second; less does not count as a day
constexpr double kLeastPause = 1;      // second

/// Whether the date is before `next`, the date found so far, or before now if there is none yet.
bool isEarlier(std::optional<Date> date, std::optional<Date> next, Date now) {
  return date && *date < next.value_or(now);
}

/// Whether the date is in the future, and before `next` if there is one.
bool isNearer(std::optional<Date> date, std::optional<Date> next, Date now) {
  return date && *date > now && (!next || *date < *next);
}

/// The later of display date and activation date. A device without an activation date counts as activated
/// now, so a display date in the past gives nothing.
std::optional<Date> postDateOf(const OfferFacts& offer, Date now) {
  if (offer.displayDate && offer.activationDate.value_or(now) <= *offer.displayDate) return offer.displayDate;
  return offer.activationDate;
}

}  // namespace

std::optional<Date> nextPostDate(const std::vector<FollowUpDateFacts>& devices, Date now) {
  std::optional<Date> next;
  for (const auto& device : devices) {
    const auto& offer = device.offer;
    if (device.isPosted) continue;
    if (offer.isOffered) {
      if (offer.eligibleUntil && *offer.eligibleUntil > now) {
        const auto candidate = postDateOf(offer, now);
        if (isNearer(candidate, next, now)) next = candidate;
      }
      if (isEarlier(offer.eligibleUntil, next, now)) next = offer.eligibleUntil;
    }
    if (next && *next < now) break;
  }
  return next;
}

std::optional<Date> nextRefreshDate(const std::vector<FollowUpDateFacts>& devices, Date now, double day,
                                    bool isInitialCall) {
  std::optional<Date> next;
  if (!isInitialCall) next = now + day;
  for (const auto& device : devices) {
    const auto& offer = device.offer;
    if (offer.isOffered) {
      const double offset = day * (static_cast<double>(device.daysEligible) - 1);
      if (offset > 0 && offer.eligibleUntil) {
        const auto shownFrom = postDateOf(offer, now);
        const auto dayChange = *offer.eligibleUntil - offset;
        const bool isShown = shownFrom && *shownFrom < now;
        if (isEarlier(dayChange, next, now) || (!next && isShown)) next = dayChange;
        if (isNearer(shownFrom, next, now)) next = shownFrom;
      }
      if (isEarlier(offer.eligibleUntil, next, now)) next = offer.eligibleUntil;
    }
    if (next && *next < now) break;
  }
  return next;
}

Date refreshDate(const std::vector<FollowUpDateFacts>& devices, Date now, double day) {
  const auto date = nextRefreshDate(devices, now, day, true);
  return date ? *date : *nextRefreshDate(devices, now, day, false);
}

Date followingPostDate(Date next, const std::vector<FollowUpDateFacts>& devices, Date now, double day) {
  if (next > now) return next;
  const Date later = now + std::max(std::isfinite(day) ? day : 0, kLeastInterval);
  auto offered = devices;
  std::erase_if(offered, [now](const FollowUpDateFacts& device) {
    return device.offer.eligibleUntil && *device.offer.eligibleUntil <= now;
  });
  return std::min(nextPostDate(offered, now).value_or(later), later);
}

Date followingRefreshDate(Date next, Date now, double day) {
  if (!(day >= kShortestDay)) return std::max(next, now + kLeastInterval);
  if (next > now) return next;
  return now + std::clamp(kLeastInterval * day / kUsualDay, kLeastPause, kLeastInterval);
}

}  // namespace kvr
