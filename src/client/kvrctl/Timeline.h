#pragma once

#include "client/LocalState.h"
#include "client/kvrctl/Report.h"

#include <string>
#include <vector>

namespace kvr::client {

/// For every device, on one axis of dates: its coverage, the window of its offer, the follow-up that is shown
/// or to come, and when the shown one's text changes next; and the activities to come.
class Timeline {
 public:
  Timeline(const std::vector<DeviceStatus>& devices, const std::vector<FollowUp>& followUps,
           const std::vector<Activity>& activities, Date now);

  /// With block characters, `columns` wide in all.
  std::string text(const Style& style, std::size_t columns) const;
  /// A document of its own that is legible on light and dark ground.
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
  /// Has the axis reach a date, within reason.
  void reach(Date date);
  /// Where a date stands on the axis, from 0 to 1.
  double place(Date date) const;

  std::vector<Row> rows_;
  Date now_;
  Date from_;
  Date until_;
};

}  // namespace kvr::client
