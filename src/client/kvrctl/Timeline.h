#pragma once

#include "client/LocalState.h"
#include "client/kvrctl/Report.h"
#include "client/kvrctl/Table.h"

#include <optional>
#include <string>
#include <vector>

namespace kvr::client {

/// Shows on one axis of dates, for each device: its coverage, the period of its offer, the follow-up that is
/// shown or planned, and when the text of the shown one changes next; and the planned activities.
class Timeline {
 public:
  /// `followUps` are those that are shown at `now`. With a serial number, only that device is shown, without
  /// the activities, which are for all devices.
  Timeline(const std::vector<DeviceStatus>& devices, const std::vector<FollowUp>& followUps,
           const std::vector<Activity>& activities, Date now,
           const std::optional<std::string>& serialNumber = {});

  /// With block characters.
  std::string text(const Style& style) const;
  /// A complete SVG document, legible on light and dark backgrounds.
  std::string svg() const;
  /// The rows with their spans and marks.
  Value tree() const;

  enum Kind { CoverageSpan, OfferSpan, FollowUpSpan };
  struct Span {
    Kind kind;
    Date from;
    std::optional<Date> until;  ///< nothing if no end is known
    bool hasEnded;
  };
  struct Row {
    enum Subject { OfDevice, OfPart, OfAgent };  // a part is a device's offer or follow-up

    std::string label;
    Subject subject;
    std::string note;  ///< the plan's name if it runs, otherwise why there is no span
    bool isUnknown = false;
    std::vector<Span> spans{};
    std::vector<Date> marks{};

    /// The date that matters most, in words; the note if there is none.
    std::string end() const;
  };

 private:
  friend class TimelinePicture;

  void addDevice(const DeviceStatus& status, const std::vector<FollowUp>& followUps,
                 const std::vector<Activity>& activities);
  void addCoverage(const DeviceStatus& status);
  void addPart(const std::string& label, Kind kind, std::optional<Date> from, std::optional<Date> until);
  void addSpan(Row& row, Kind kind, Date from, std::optional<Date> until);
  /// Extends the axis to a date, within limits.
  void reach(Date date);
  /// The position of a date on the axis, from 0 to 1.
  double place(Date date) const;
  /// The same in one of so many cells.
  std::size_t cellOf(Date date, std::size_t width) const;
  /// What a row looks like in block characters.
  std::vector<Cell> cells(const Row& row, std::size_t width) const;
  bool isBeyond(const Span& span) const { return !span.until || *span.until > until_; }

  std::vector<Row> rows_;
  Date now_;
  Date from_;
  Date until_;
};

}  // namespace kvr::client
