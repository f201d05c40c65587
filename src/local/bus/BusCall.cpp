#include "local/bus/BusCall.h"

#include "local/bus/BusIntrospection.h"
#include "local/buscodec/BusCodec.h"

#include <algorithm>
#include <cerrno>
#include <memory>
#include <new>
#include <utility>

namespace kvr {
namespace {

constexpr std::size_t kLongestText = 1U << 20U;  // bytes

Error invalidArguments(const ServiceMethod& method, const std::string& why) {
  return {SD_BUS_ERROR_INVALID_ARGS, EINVAL, std::string(method.member) + ": " + why};
}

std::optional<Error> sendReply(sd_bus_message* call, const char* type, const Value& value) {
  try {
    sd_bus_message* made = nullptr;
    const int r = sd_bus_message_new_method_return(call, &made);
    const BusMessageRef reply(made);
    if (r < 0) return busError(r, "no reply can be made");
    if (auto error = appendBusValue(reply.get(), type, value)) return error;
    const int sent = sd_bus_send(nullptr, reply.get(), nullptr);
    if (sent < 0) return busError(sent, "the reply cannot be sent");
    return std::nullopt;
  } catch (const std::bad_alloc&) {
    return busError(-ENOMEM, "the reply cannot be written");
  }
}

}  // namespace

Result<BusCall> readBusCall(sd_bus_message* message, const ServiceInterface& interface) {
  const std::string_view member = sd_bus_message_get_member(message);
  const auto method = std::find_if(interface.methods.begin(), interface.methods.end(),
                                   [member](const ServiceMethod& one) { return one.member == member; });
  if (method == interface.methods.end()) {
    return Error{SD_BUS_ERROR_UNKNOWN_METHOD, ENOENT,
                 std::string(interface.name) + " has no method " + std::string(member)};
  }
  const std::string signature = signatureOf(*method);
  if (!sd_bus_message_has_signature(message, signature.c_str())) {
    return invalidArguments(*method, "the arguments are not of type \"" + signature + "\"");
  }
  BusCall call;
  Value::Array arguments;
  for (const ServiceArgument& argument : method->in) {
    Result<Value> value = readBusValue(message, argument.type);
    if (!value) return invalidArguments(*method, value.error().message);
    if (value->isString() && value->string().size() > kLongestText) {
      return invalidArguments(*method, std::string(argument.name) + " is too long");
    }
    if (value->isString()) call.bytes += value->string().size();
    arguments.push_back(*std::move(value));
  }
  call.arguments = std::make_shared<const Value::Array>(std::move(arguments));
  call.interface = &interface;
  call.index = static_cast<std::size_t>(method - interface.methods.begin());
  call.message.reset(sd_bus_message_ref(message));
  return call;
}

std::optional<Error> replyToBusCall(sd_bus_message* call, const char* type, const Value& value) {
  if (sd_bus_message_get_expect_reply(call) <= 0) return std::nullopt;
  auto error = sendReply(call, type, value);
  if (error) failBusCall(call, kBusErrorFailed, error->message);
  return error;
}

void failBusCall(sd_bus_message* call, const char* errorName, const std::string& message) {
  // Sending the error fails only when the bus is gone, which the caller notices anyway, or when memory is
  // short, which cannot be reported to it.
  sd_bus_reply_method_errorf(call, errorName, "%s", message.c_str());
}

}  // namespace kvr
