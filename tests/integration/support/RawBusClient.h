#pragma once

#include "Prelude.h"
#include "local/buscodec/BusCodec.h"
#include "local/buscodec/BusHandles.h"

#include <stdexcept>

namespace kvr::testing {

/// A client that sends plain bus messages. Use it on one thread.
class RawBusClient {
 public:
  static constexpr const char* kName = "com.tarsil.kvragent";
  static constexpr const char* kPath = "/com/tarsil/kvragent";
  static constexpr const char* kInterface = "com.tarsil.kvragent.KVRAgentProtocol";

  struct Reply {
    BusMessageRef message;  ///< null after an error
    std::string error;      ///< the error's name
    std::string errorText;
  };

  explicit RawBusClient(const std::string& address) {
    sd_bus* bus = nullptr;
    require(sd_bus_new(&bus), "sd_bus_new");
    bus_.reset(bus);
    require(sd_bus_set_address(bus, address.c_str()), "sd_bus_set_address");
    require(sd_bus_set_bus_client(bus, 1), "sd_bus_set_bus_client");
    require(sd_bus_start(bus), "sd_bus_start");
  }

  sd_bus* bus() const { return bus_.get(); }
  /// A call of the service's interface; arguments are of basic types or records.
  BusMessageRef newCall(const char* member, std::string_view types = "", const Array& arguments = {}) const {
    sd_bus_message* message = nullptr;
    require(sd_bus_message_new_method_call(bus(), &message, kName, kPath, kInterface, member), member);
    BusMessageRef held(message);
    for (std::size_t i = 0; !types.empty(); ++i) {
      const std::size_t length = types.starts_with("a{sv}") ? 5 : types.starts_with("aa{sv}") ? 6 : 1;
      const auto error = appendBusValue(message, std::string(types.substr(0, length)), arguments.at(i));
      if (error) throw std::runtime_error(describe(*error));
      types.remove_prefix(length);
    }
    return held;
  }
  /// Sends a call and waits for its reply.
  Reply call(const BusMessageRef& message) const {
    BusError error;
    sd_bus_message* reply = nullptr;
    const int r = sd_bus_call(bus(), message.get(), 0, error.get(), &reply);
    Reply result{BusMessageRef(reply), error.name(), error.message()};
    if (r < 0 && result.error.empty()) require(r, "sd_bus_call");
    return result;
  }
  Reply call(const char* member, std::string_view types = "", const Array& arguments = {}) const {
    return call(newCall(member, types, arguments));
  }
  /// Sends a call without waiting; it still requests an answer.
  void send(const BusMessageRef& message) const {
    std::uint64_t number = 0;  // passing it requests an answer
    require(sd_bus_send(bus(), message.get(), &number), "sd_bus_send");
    require(sd_bus_flush(bus()), "sd_bus_flush");
  }
  void send(const char* member, std::string_view types = "", const Array& arguments = {}) const {
    send(newCall(member, types, arguments));
  }
  /// The next answer to a call made with `send`; nothing when none arrives.
  std::optional<Reply> next() const {
    while (true) {
      sd_bus_message* message = nullptr;
      const int r = sd_bus_process(bus(), &message);
      BusMessageRef held(message);
      if (r < 0 || (r == 0 && sd_bus_wait(bus(), kLimit) <= 0)) return std::nullopt;
      if (!message || sd_bus_message_is_signal(message, nullptr, nullptr) > 0) continue;
      if (const auto* error = sd_bus_message_get_error(message)) return Reply{nullptr, error->name, ""};
      return Reply{std::move(held), "", ""};
    }
  }
  /// The value in a reply; throws if it is an error.
  Value value(const char* type, const Reply& reply) const {
    if (!reply.message) throw std::runtime_error(reply.error + ": " + reply.errorText);
    Result<Value> value = readBusValue(reply.message.get(), type);
    if (!value) throw std::runtime_error(describe(value.error()));
    return *std::move(value);
  }
  /// Waits until the service's name has an owner, or has none; false when the bus stays silent too long.
  bool waitForName(bool isOwned) const {
    const auto handler = [](sd_bus_message*, void*, sd_bus_error*) { return 0; };
    require(sd_bus_match_signal(bus(), nullptr, kBusName, nullptr, kBusName, "NameOwnerChanged", handler,
                                nullptr),
            "sd_bus_match_signal");
    // Every connection that comes or goes wakes this loop, so it checks the owner of the service's name.
    while ((sd_bus_get_name_creds(bus(), kName, 0, nullptr) >= 0) != isOwned) {
      const int processed = sd_bus_process(bus(), nullptr);
      require(processed, "sd_bus_process");
      if (processed == 0 && sd_bus_wait(bus(), kLimit) == 0) return false;
    }
    return true;
  }
  /// Leaves the bus at once.
  void leave() { bus_.reset(); }

 private:
  static constexpr std::uint64_t kLimit = 60'000'000;  ///< microseconds; only a failing test waits this long

  static void require(int result, const char* what) {
    if (result < 0) throw std::runtime_error(describe(busError(result, what)));
  }

  BusRef bus_;
};

}  // namespace kvr::testing
