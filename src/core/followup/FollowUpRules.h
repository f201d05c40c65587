#pragma once

#include "platform/value/Date.h"

#include <optional>

namespace kvr {

/// The facts about one device and its warranty that the rules use.
struct OfferFacts {
  bool hasWarranty = false;
  bool isOffered = false;  ///< the warranty says that the offer may be displayed
  std::optional<Date> eligibleUntil;
  std::optional<Date> displayDate;  ///< from when the follow-up is to be displayed
  double durationBeforeEnd = 0;     ///< seconds before the end; used without a display date
  std::optional<Date> activationDate;
};

/// Whether there is an offer to follow up; if not, the first reason that applies, in this order.
enum class OfferState { NoWarranty, NotOffered, Ended, Open };

constexpr OfferState offerState(const OfferFacts& facts, Date now) {
  if (!facts.hasWarranty) return OfferState::NoWarranty;
  if (!facts.isOffered) return OfferState::NotOffered;
  if (!(facts.eligibleUntil && *facts.eligibleUntil > now)) return OfferState::Ended;
  return OfferState::Open;
}

/// The posting decision for one device's follow-up, before its date is considered.
enum class PostingOutcome { NoWarranty, NotOffered, Ended, Dismissed, Eligible };

/// `convertsAgain` tells whether the offer has started again since the dismissal. It is called only if its
/// answer matters, because calling it changes the records.
template <class ConvertsAgain>
constexpr PostingOutcome postingOutcome(const OfferFacts& facts, Date now, bool isDismissed,
                                        bool repostAllowed, const ConvertsAgain& convertsAgain) {
  switch (offerState(facts, now)) {
    case OfferState::NoWarranty:
      return PostingOutcome::NoWarranty;
    case OfferState::NotOffered:
      return PostingOutcome::NotOffered;
    case OfferState::Ended:
      return PostingOutcome::Ended;
    case OfferState::Open:
      break;
  }
  if (isDismissed && !repostAllowed && !convertsAgain()) return PostingOutcome::Dismissed;
  return PostingOutcome::Eligible;
}

struct PostDate {
  std::optional<Date> date;       ///< nothing counts as now
  bool isActivationDate = false;  ///< the device was activated only after the display date

  bool isInFuture(Date now) const { return date && *date > now; }
};

/// The date from which an offer is to be followed up: its display date, otherwise the end of eligibility
/// minus the lead time; nothing if both are missing.
constexpr std::optional<Date> displayDateOf(const OfferFacts& facts) {
  if (facts.displayDate || !facts.eligibleUntil) return facts.displayDate;
  return *facts.eligibleUntil - facts.durationBeforeEnd;
}

/// The date from which an offered follow-up may be posted.
constexpr PostDate postDate(const OfferFacts& facts) {
  const auto date = displayDateOf(facts);
  if (facts.activationDate && date && *facts.activationDate > *date) return {facts.activationDate, true};
  return {date, false};
}

/// What a refresh does with one device's follow-up.
enum class RefreshOutcome { NoWarranty, NotOffered, Ended, Update, Repost, LeaveAlone };

constexpr RefreshOutcome refreshOutcome(const OfferFacts& facts, Date now, bool isPending,
                                        bool allowForcePost) {
  switch (offerState(facts, now)) {
    case OfferState::NoWarranty:
      return RefreshOutcome::NoWarranty;
    case OfferState::NotOffered:
      return RefreshOutcome::NotOffered;
    case OfferState::Ended:
      return RefreshOutcome::Ended;
    case OfferState::Open:
      break;
  }
  if (isPending) return RefreshOutcome::Update;
  if (allowForcePost) return RefreshOutcome::Repost;
  return RefreshOutcome::LeaveAlone;
}

/// Whether a dismissed follow-up may be offered again.
enum class ConversionOutcome { NeverDismissed, NoDisplayDate, DismissedSince, DismissedBefore };

constexpr ConversionOutcome conversionOutcome(std::optional<Date> dismissed,
                                              std::optional<Date> displayDate) {
  if (!dismissed) return ConversionOutcome::NeverDismissed;
  if (!displayDate) return ConversionOutcome::NoDisplayDate;
  if (*dismissed >= *displayDate) return ConversionOutcome::DismissedSince;
  return ConversionOutcome::DismissedBefore;
}

/// Whether a row carries a badge: the warranty wants one, and the end is near enough but has not passed.
constexpr bool showsRowBadge(bool isWanted, std::optional<Date> eligibleUntil, double durationBeforeEnd,
                             Date now) {
  if (!isWanted || !eligibleUntil) return false;
  const bool isNearEnough = *eligibleUntil - durationBeforeEnd < now;
  return isNearEnough && now < *eligibleUntil;
}

}  // namespace kvr
