#include "integration/support/RawBusClient.h"

#include "platform/local/bus/BusCodec.h"

#include <stdexcept>

namespace kvr::testing {
namespace {

void require(int result, const char* what) {
  if (result < 0) throw std::runtime_error(describe(busError(result, what)));
}

std::vector<std::string> typesIn(std::string_view signature) {
  std::vector<std::string> types;
  while (!signature.empty()) {
    const std::size_t length = signature.starts_with("a{sv}") ? 5 : signature.starts_with("aa{sv}") ? 6 : 1;
    types.emplace_back(signature.substr(0, length));
    signature.remove_prefix(length);
  }
  return types;
}

}  // namespace

RawBusClient::RawBusClient(const std::string& address) {
  sd_bus* bus = nullptr;
  require(sd_bus_new(&bus), "sd_bus_new");
  bus_.reset(bus);
  require(sd_bus_set_address(bus, address.c_str()), "sd_bus_set_address");
  require(sd_bus_set_bus_client(bus, 1), "sd_bus_set_bus_client");
  require(sd_bus_start(bus), "sd_bus_start");
}

BusMessageRef RawBusClient::newCall(const char* member, const char* signature, const Array& arguments) const {
  sd_bus_message* message = nullptr;
  require(sd_bus_message_new_method_call(bus_.get(), &message, kName, kPath, kInterface, member), member);
  BusMessageRef held(message);
  const auto types = typesIn(signature);
  for (std::size_t i = 0; i < types.size(); ++i) {
    if (const auto error = appendBusValue(message, types[i], arguments.at(i)))
      throw std::runtime_error(describe(*error));
  }
  return held;
}

RawBusClient::Reply RawBusClient::call(const BusMessageRef& message) const {
  BusError error;
  sd_bus_message* reply = nullptr;
  const int r = sd_bus_call(bus_.get(), message.get(), 0, error.get(), &reply);
  Reply result{BusMessageRef(reply), error.name(), error.message()};
  if (r < 0 && result.error.empty()) require(r, "sd_bus_call");
  return result;
}

RawBusClient::Reply RawBusClient::call(const char* member, const char* signature,
                                       const Array& arguments) const {
  return call(newCall(member, signature, arguments));
}

void RawBusClient::send(const BusMessageRef& message) const {
  std::uint64_t number = 0;  // without one, no answer would be expected
  require(sd_bus_send(bus_.get(), message.get(), &number), "sd_bus_send");
  require(sd_bus_flush(bus_.get()), "sd_bus_flush");
}

Value RawBusClient::value(const char* type, const Reply& reply) const {
  if (!reply.message) throw std::runtime_error(reply.error + ": " + reply.errorText);
  Result<Value> value = readBusValue(reply.message.get(), type);
  if (!value) throw std::runtime_error(describe(value.error()));
  return *std::move(value);
}

}  // namespace kvr::testing
