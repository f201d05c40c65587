#pragma once

#include "Prelude.h"
#include "platform/local/bus/BusHandles.h"

#include <optional>

namespace kvr::testing {

/// A client that speaks to a bus in plain messages. One thread.
class RawBusClient {
 public:
  static constexpr const char* kName = "com.tarsil.kvragent";
  static constexpr const char* kPath = "/com/tarsil/kvragent";
  static constexpr const char* kInterface = "com.tarsil.kvragent.KVRAgentProtocol";

  struct Reply {
    BusMessageRef message;  ///< null when it was an error
    std::string error;      ///< the error's name
    std::string errorText;
  };

  explicit RawBusClient(const std::string& address);

  sd_bus* bus() const { return bus_.get(); }
  /// A call of the service's interface with arguments of the bus's basic types and records.
  BusMessageRef newCall(const char* member, const char* signature = "", const Array& arguments = {}) const;
  /// Sends a call and waits for its reply.
  Reply call(const BusMessageRef& message) const;
  Reply call(const char* member, const char* signature = "", const Array& arguments = {}) const;
  /// Sends a call and waits for nothing; an answer is expected all the same.
  void send(const BusMessageRef& message) const;
  /// The value that a call replied; throws when it was an error.
  Value value(const char* type, const Reply& reply) const;
  /// Makes this client leave the bus at once.
  void leave() { bus_.reset(); }

 private:
  BusRef bus_;
};

}  // namespace kvr::testing
