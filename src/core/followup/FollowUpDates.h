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
/// such a device's eligibility when that comes earlier. An end that has already passed is returned without
/// looking at further devices. Nothing if there is no such moment.
std::optional<Date> nextPostDate(const std::vector<FollowUpDateFacts>& devices, Date now);

/// The earliest moment at which a shown follow-up's day count drops, a follow-up is due to be shown, or an
/// eligibility ends. `day` is the length of a day in seconds. For an initial call the result comes from the
/// devices alone and may be nothing; otherwise it is a day from now at the latest.
std::optional<Date> nextRefreshDate(const std::vector<FollowUpDateFacts>& devices, Date now, double day,
                                    bool isInitialCall);
/// The initial form, or the other where that gives nothing although follow-ups are shown.
Date refreshDate(const std::vector<FollowUpDateFacts>& devices, Date now, double day);

/// The date for which the post activity schedules itself again after a run that computed `next`. It never
/// runs back to back, whatever day length is stored.
///
/// A future date is kept. Otherwise it is a day from now, a minute at least, or the next post date of the
/// devices whose eligibility has not ended if that is earlier.
Date followingPostDate(Date next, const std::vector<FollowUpDateFacts>& devices, Date now, double day);
/// The same for the refresh activity. A future date is kept, because a day count changes then. Any other
/// becomes a minute from now, or proportionally less for a shorter day, but at least a second. With a day of
/// less than a second, refreshes are at least a minute apart.
Date followingRefreshDate(Date next, Date now, double day);

}  // namespace kvr
