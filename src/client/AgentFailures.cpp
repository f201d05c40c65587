#include "client/AgentFailures.h"

#include "local/buscodec/BusCodec.h"
#include "platform/names/Names.h"

#include <cerrno>
#include <utility>

namespace kvr::bus {

using namespace client;  // NOLINT(google-build-using-namespace)

namespace {

constexpr const char* kUnreachable[] = {
    SD_BUS_ERROR_SERVICE_UNKNOWN, SD_BUS_ERROR_NAME_HAS_NO_OWNER, SD_BUS_ERROR_NO_REPLY,
    SD_BUS_ERROR_DISCONNECTED,    SD_BUS_ERROR_TIMEOUT,           SD_BUS_ERROR_NO_SERVER,
    SD_BUS_ERROR_UNKNOWN_OBJECT,
};

}  // namespace

Error failure(Failure code, std::string message) {
  return {std::string(kErrorDomain), code, std::move(message)};
}

Error failureOf(int result, const BusError& error) {
  const std::string_view name = error.name();
  const std::string message = *error.message() ? error.message() : std::generic_category().message(-result);
  if (name == SD_BUS_ERROR_ACCESS_DENIED) return failure(Refused, message);
  for (const char* one : kUnreachable) {
    if (name == one) return failure(AgentUnreachable, message);
  }
  const bool couldNotStart = name.starts_with("org.freedesktop.DBus.Error.Spawn.");
  if (couldNotStart || result == -ECONNRESET || result == -ENOTCONN)
    return failure(AgentUnreachable, message);
  return failure(OtherFailure, message);
}

Result<Value> valueIn(sd_bus_message* answer, const char* type) {
  if (const sd_bus_error* error = sd_bus_message_get_error(answer)) {
    BusError copy;
    sd_bus_error_copy(copy.get(), error);
    return failureOf(-sd_bus_message_get_errno(answer), copy);
  }
  Result<Value> value = readBusValue(answer, type);
  if (!value) return failure(OtherFailure, "the agent's answer cannot be read: " + value.error().message);
  return value;
}

Result<BusMessageRef> newCall(sd_bus* bus, const char* member,
                              const std::vector<AgentClient::Argument>& arguments) {
  sd_bus_message* made = nullptr;
  const int r = sd_bus_message_new_method_call(bus, &made, names::kAgent, names::kObjectPath,
                                               names::kInterface, member);
  BusMessageRef message(made);
  if (r < 0) return failure(OtherFailure, busError(r, "the call cannot be made").message);
  for (const auto& argument : arguments) {
    const auto error = appendBusValue(made, argument.type, argument.value);
    if (error) return failure(OtherFailure, error->message);
  }
  return message;
}

}  // namespace kvr::bus
