// Input from the bus: a message whose body is the input, as a peer may send it; what was read is sent again.
#include "Fuzz.h"
#include "local/buscodec/BusCodec.h"
#include "local/buscodec/BusHandles.h"
#include "local/system/Descriptor.h"

#include <sys/socket.h>
#include <unistd.h>

#include <array>
#include <memory>

namespace kvr::fuzz {
namespace {

constexpr std::array<std::string_view, 6> kTypes = {"a{sv}", "aa{sv}", "s", "t", "b", "d"};

void append(std::string& bytes, std::uint32_t number) {
  for (unsigned shift = 0; shift < 32; shift += 8) bytes += static_cast<char>(number >> shift);
}

/// One field of a message's header: its number, and a text of type 'o', 's' or 'g'.
void appendField(std::string& fields, char number, char type, std::string_view text) {
  while (fields.size() % 8 != 0) fields += '\0';
  fields += {number, 1, type, 0};
  if (type == 'g') {
    fields += static_cast<char>(text.size());
  } else {
    append(fields, static_cast<std::uint32_t>(text.size()));
  }
  fields.append(text) += '\0';
}

std::string signalWith(std::string_view type, std::string_view body) {
  std::string fields;
  appendField(fields, 1, 'o', "/a");
  appendField(fields, 2, 's', "a.b");
  appendField(fields, 3, 's', "c");
  appendField(fields, 8, 'g', type);
  std::string message = {'l', 4, 0, 1};
  append(message, static_cast<std::uint32_t>(body.size()));
  append(message, 1);  // the serial number
  append(message, static_cast<std::uint32_t>(fields.size()));
  message += fields;
  while (message.size() % 8 != 0) message += '\0';
  return message.append(body);
}

/// A bus connected only to this process.
class Wire {
 public:
  Wire() {
    std::array<int, 2> ends{};
    require(::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0, ends.data()) == 0,
            "a socket");
    peer_ = Descriptor(ends[1]);
    sd_bus* bus = nullptr;
    require(sd_bus_new(&bus) >= 0, "a bus");
    bus_.reset(bus);
    require(sd_bus_set_fd(bus, ends[0], ends[0]) >= 0 && sd_bus_set_anonymous(bus, 1) >= 0 &&
                sd_bus_negotiate_fds(bus, 0) >= 0 && sd_bus_start(bus) >= 0,
            "a bus on a socket");
    send("OK 0123456789abcdef0123456789abcdef\r\n");
    while (sd_bus_is_ready(bus) == 0) require(sd_bus_process(bus, nullptr) >= 0, "a bus that is ready");
  }

  sd_bus* bus() const { return bus_.get(); }
  void send(std::string_view bytes) const {
    require(::write(peer_.get(), bytes.data(), bytes.size()) == static_cast<ssize_t>(bytes.size()),
            "a write");
  }

 private:
  Descriptor peer_;
  BusRef bus_;
};

void requireSentOn(const Wire& wire, std::string_view type, const Value& value) {
  sd_bus_message* message = nullptr;
  require(sd_bus_message_new_signal(wire.bus(), &message, "/a", "a.b", "c") >= 0, "a message");
  const BusMessageRef held(message);
  if (const auto error = appendBusValue(message, type, value)) {
    require(error->domain == "bus" && !error->message.empty(), "an error says what it is");
    require(false, "what was read can be sent on", error->message);
  }
  require(sd_bus_message_seal(message, 1, 0) >= 0 && sd_bus_message_rewind(message, 1) >= 0, "a message");
  const auto again = readBusValue(message, type);
  require(again && *again == value, "the bus gives the value back");
}

}  // namespace

void run(std::string_view input) {
  static auto wire = std::make_unique<Wire>();
  constexpr std::size_t kLargest = std::size_t{64} * 1024;  // what a socket accepts at once
  if (input.empty() || input.size() > kLargest) return;
  const auto type = kTypes[static_cast<unsigned char>(input[0]) % kTypes.size()];
  wire->send(signalWith(type, input.substr(1)));
  sd_bus_message* message = nullptr;
  int r = 0;
  while ((r = sd_bus_process(wire->bus(), &message)) > 0 && message == nullptr) {
  }
  if (r < 0 || message == nullptr) {
    wire = std::make_unique<Wire>();  // the bus library itself would refuse it
    return;
  }
  const BusMessageRef held(message);
  const auto value = readBusValue(message, type);
  if (!value) {
    require(value.error().domain == "bus" && !value.error().message.empty(), "an error says what it is");
    return;
  }
  requireSentOn(*wire, type, *value);
}

}  // namespace kvr::fuzz
