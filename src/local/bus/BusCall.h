#pragma once

#include "local/buscodec/BusHandles.h"
#include "platform/services/ServiceListener.h"

#include <memory>

namespace kvr {

// Names of errors that a call is answered with.
inline constexpr const char* kBusErrorFailed = SD_BUS_ERROR_FAILED;
inline constexpr const char* kBusErrorRefused = SD_BUS_ERROR_ACCESS_DENIED;
inline constexpr const char* kBusErrorTooMany = SD_BUS_ERROR_LIMITS_EXCEEDED;

/// One call of an interface, checked against it.
struct BusCall {
  BusMessageRef message;
  std::size_t index = 0;  ///< of the method in its interface
  std::shared_ptr<const Value::Array> arguments;
  std::size_t bytes = 0;  ///< of the texts among the arguments
};

/// Takes a call apart. An error's domain is the bus error's name to answer with. All that is kept of the
/// message is bounded: no argument of this interface needs a long text.
Result<BusCall> readBusCall(sd_bus_message* message, const ServiceInterface& interface);

/// Answers with a value of one of the types of BusCodec.h; when it cannot be sent, with an error, which is
/// also returned. Nothing is sent to a caller who expects no reply.
std::optional<Error> replyToBusCall(sd_bus_message* call, const char* type, const Value& value);
void failBusCall(sd_bus_message* call, const char* errorName, const std::string& message);

}  // namespace kvr
