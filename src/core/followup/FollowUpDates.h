#pragma once

#include "core/followup/FollowUpRules.h"

#include <vector>

namespace kvr {

/// A device as the next-date computations see it.
struct FollowUpDateFacts {
  OfferFacts offer;
  bool isPosted = false;           ///< its follow-up has been posted before
  std::uint32_t daysEligible = 0;  ///< whole days left, rounded up
};

/// The earliest moment at which a device that has not been posted yet reaches its post date, or the end of
/// such a device's eligibility when that comes earlier. An end that has passed is the answer at once. Nothing
/// when there is no such moment.
std::optional<Date> nextPostDate(const std::vector<FollowUpDateFacts>& devices, Date now);

/// The earliest moment at which a shown follow-up's day count drops, a follow-up is due to be shown, or an
/// eligibility ends. `day` is the length of a day in seconds. The initial form takes only what the devices
/// give, and may be nothing; the other starts from a day after now.
std::optional<Date> nextRefreshDate(const std::vector<FollowUpDateFacts>& devices, Date now, double day,
                                    bool isInitialCall);

/// The date for which an activity schedules itself again when `next` was computed at the end of a run: never
/// one that would make it run back to back, whatever day length is stored.
///
/// When an offer's end has passed, the other devices' follow-ups are posted no later for it.
Date followingPostDate(Date next, const std::vector<FollowUpDateFacts>& devices, Date now, double day);
/// A date that lies ahead is kept, for a count changes then. Any other is put off by a minute, or by the same
/// share of a shorter day, a second at least. With a day of less than a second, whose counts nobody could
/// follow, refreshes are a minute apart.
Date followingRefreshDate(Date next, Date now, double day);

}  // namespace kvr
