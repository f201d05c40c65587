#pragma once

#include "local/buscodec/BusHandles.h"
#include "platform/services/ServiceListener.h"

#include <memory>

namespace kvr {

// The D-Bus error names that calls are answered with.
inline constexpr const char* kBusErrorFailed = SD_BUS_ERROR_FAILED;
inline constexpr const char* kBusErrorRefused = SD_BUS_ERROR_ACCESS_DENIED;
inline constexpr const char* kBusErrorTooMany = SD_BUS_ERROR_LIMITS_EXCEEDED;

/// One call of an interface; its signature and arguments have been checked.
struct BusCall {
  BusMessageRef message;
  const ServiceInterface* interface = nullptr;
  std::size_t index = 0;  ///< of the method in that interface
  std::shared_ptr<const Value::Array> arguments;
  std::size_t bytes = 0;  ///< total length of the text arguments
};

/// Parses and checks a call of an interface, which must outlive it. The error's domain is the D-Bus error
/// name to answer with. Texts are limited to 1 MiB, since no method of this interface needs a longer one.
Result<BusCall> readBusCall(sd_bus_message* message, const ServiceInterface& interface);

/// Answers with a value of one of the types of BusCodec.h. If that cannot be sent, the caller gets an error,
/// which is also returned. Sends nothing to a caller that expects no reply.
std::optional<Error> replyToBusCall(sd_bus_message* call, const char* type, const Value& value);
void failBusCall(sd_bus_message* call, const char* errorName, const std::string& message);

}  // namespace kvr
