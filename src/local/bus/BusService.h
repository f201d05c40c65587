#pragma once

#include "local/bus/BusClient.h"

#include <map>
#include <memory>
#include <string>

namespace kvr {

/// A service on the bus: a well-known name, the object at the matching path, and its clients.
///
/// Everything happens on the bus thread.
class BusService : public std::enable_shared_from_this<BusService> {
 public:
  struct Settings {
    BusConnection& connection;
    Log& log;
    std::string name;
    /// Called when the name cannot be acquired or is lost.
    std::function<void(const Error&)> failed;
  };

  BusService(Settings settings, BusClient::Context context);

  /// Exports the object and requests the name.
  void open();
  /// Releases the name. Once no more calls can arrive through it, runs `done`; later calls get an error.
  void beginEnding(Work done);
  /// Drops every client and releases everything on the bus.
  void close();

 private:
  static int handleCall(sd_bus_message* message, void* userdata, sd_bus_error* error);
  static int handleAny(sd_bus_message* message, void* userdata, sd_bus_error* error);
  static int handleNameRequested(sd_bus_message* message, void* userdata, sd_bus_error* error);
  static int handleNameReleased(sd_bus_message* message, void* userdata, sd_bus_error* error);

  int offer(sd_bus* bus);
  int requestName(sd_bus* bus);
  bool take(sd_bus_message* message);
  void receive(sd_bus_message* call);
  void forget(const std::string& uniqueName);
  void fail(const std::string& why);
  void end();

  const Settings settings_;
  const std::string path_;
  std::shared_ptr<const BusClient::Context> context_;
  BusSlotRef object_;
  BusSlotRef filter_;
  BusSlotRef nameRequest_;
  std::map<std::string, std::shared_ptr<BusClient>, std::less<>> clients_;
  bool isGivingUp_ = false;  ///< the name
  bool hasEnded_ = false;
  Work done_;
};

}  // namespace kvr
