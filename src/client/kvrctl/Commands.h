#pragma once

#include "client/AgentClient.h"
#include "client/kvrctl/Output.h"
#include "client/kvrctl/Report.h"

#include <optional>
#include <string>

namespace kvr::client {

/// The parsed command line.
struct Options {
  std::string text;  ///< a command's one argument: a bundle identifier, a name
  std::optional<std::string> serialNumber;
  std::string file;  ///< the file to draw into
  double seconds = 0;
  bool noWait = false;
  Policy policy = Policy::Default;
  bool all = false;
  bool json = false;
  bool showSerial = false;
  bool isWatched = false;

  Report report() const { return Report(showSerial ? Report::Serials::Whole : Report::Serials::Shortened); }
};

// The commands. Each writes its answer to standard output, or the reason why there is none to standard error.
// Any text is a serial number. It may be given in its shortened form, "…1234", if only one device ends in
// that.

using AgentCommand = Status (*)(const AgentClient&, const Options&);

Status showStatus(const AgentClient& agent, const Options& options);
Status showDevice(const AgentClient& agent, const Options& options);
Status showPaired(const AgentClient& agent, const Options& options);
Status showInfo(const AgentClient& agent, const Options& options);
Status refresh(const AgentClient& agent, const Options& options);
Status dismiss(const AgentClient& agent, const Options& options);
Status scheduleOutreach(const AgentClient& agent, const Options& options);
Status reportAccountAdded(const AgentClient& agent, const Options& options);
Status showSupportApplication(const AgentClient& agent, const Options& options);
Status showWebURL(const AgentClient& agent, const Options& options);
Status showTimeline(const AgentClient& agent, const Options& options);
Status postNotification(const AgentClient& agent, const Options& options);

// These need no agent.

Status showFollowUps(const Options& options);
Status showActivities(const Options& options);
Status showVerdicts(const Options& options);

}  // namespace kvr::client
