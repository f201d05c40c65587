#pragma once

#include "client/LocalState.h"
#include "client/kvrctl/Report.h"

#include <string>
#include <vector>

namespace kvr::client {

/// Shows on one axis of dates, for each device: its coverage, the period of its offer, the follow-up that is
/// shown or planned, and when the text of the shown one changes next; and the planned activities.
class Timeline {
 public:
  Timeline(const std::vector<DeviceStatus>& devices, const std::vector<FollowUp>& followUps,
           const std::vector<Activity>& activities, Date now);

  /// With block characters, `columns` wide in total.
  std::string text(const Style& style, std::size_t columns) const;
  /// A complete SVG document, legible on light and dark backgrounds.
  std::string svg() const;
  /// The rows with their spans and marks.
  Value tree() const;

 private:
  enum Kind { CoverageSpan, OfferSpan, FollowUpSpan };
  struct Span {
    Kind kind;
    Date from;
    Date until;
  };
  struct Row {
    std::string label;
    std::vector<Span> spans;
    std::vector<Date> marks;
  };

  void addDevice(const DeviceStatus& status, const std::vector<FollowUp>& followUps,
                 std::optional<Date> change);
  void add(const std::string& label, Kind kind, std::optional<Date> from, std::optional<Date> until);
  /// Extends the axis to a date, within limits.
  void reach(Date date);
  /// The position of a date on the axis, from 0 to 1.
  double place(Date date) const;

  std::vector<Row> rows_;
  Date now_;
  Date from_;
  Date until_;
};

}  // namespace kvr::client
