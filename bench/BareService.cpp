// The smallest possible service on the bus: a name, an object, and replies built by sd-bus calls.
//
// kvr-bench-bare [TREE]: "Info" replies with the dictionary that the file describes, built again for every
// call; "Infos" with an array of the dictionaries in it; "Ping" with nothing. A line of the file is a type, a
// key (not in an array) and a value: "s key text", "x key 1", "t key 1", "d key 1.5", "b key 1", "( key 1.5"
// (a date); "{ key" and "[ key" open a container, "}" and "]" close it.

#include <systemd/sd-bus.h>
#include <systemd/sd-event.h>

#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <fstream>
#include <string>
#include <vector>

namespace {

constexpr const char* kName = "com.tarsil.kvragent.bare";
constexpr const char* kPath = "/com/tarsil/kvragent/bare";
constexpr const char* kInterface = "com.tarsil.kvragent.Bare";

struct Node {
  char kind = '{';
  std::string key;
  std::string text;
  double real = 0;
  std::int64_t number = 0;
  std::vector<Node> children;
};

std::string takeWord(std::string& line) {
  const auto space = line.find(' ');
  std::string word = line.substr(0, space);
  line.erase(0, space == std::string::npos ? line.size() : space + 1);
  return word;
}

void read(std::istream& file, Node& parent) {
  for (std::string line; std::getline(file, line) && line != "}" && line != "]";) {
    Node& node = parent.children.emplace_back();
    node.kind = takeWord(line)[0];
    if (parent.kind == '{') node.key = takeWord(line);
    node.text = line;
    node.number = std::strtoll(line.c_str(), nullptr, 10);
    node.real = std::strtod(line.c_str(), nullptr);
    if (node.kind == '{' || node.kind == '[') read(file, node);
  }
}

int appendDictionary(sd_bus_message* message, const Node& dictionary);

int appendVariant(sd_bus_message* message, const Node& node) {
  switch (node.kind) {
    case 's':
      return sd_bus_message_append(message, "v", "s", node.text.c_str());
    case 'x':
      return sd_bus_message_append(message, "v", "x", node.number);
    case 't':
      return sd_bus_message_append(message, "v", "t", static_cast<std::uint64_t>(node.number));
    case 'd':
      return sd_bus_message_append(message, "v", "d", node.real);
    case 'b':
      return sd_bus_message_append(message, "v", "b", static_cast<int>(node.number));
    case '(':
      return sd_bus_message_append(message, "v", "(d)", node.real);
    case '{': {
      int r = sd_bus_message_open_container(message, 'v', "a{sv}");
      if (r >= 0) r = appendDictionary(message, node);
      return r < 0 ? r : sd_bus_message_close_container(message);
    }
    default: {
      int r = sd_bus_message_open_container(message, 'v', "av");
      if (r >= 0) r = sd_bus_message_open_container(message, 'a', "v");
      for (const Node& child : node.children) {
        if (r >= 0) r = appendVariant(message, child);
      }
      if (r >= 0) r = sd_bus_message_close_container(message);
      return r < 0 ? r : sd_bus_message_close_container(message);
    }
  }
}

int appendDictionary(sd_bus_message* message, const Node& dictionary) {
  int r = sd_bus_message_open_container(message, 'a', "{sv}");
  for (const Node& child : dictionary.children) {
    if (r >= 0) r = sd_bus_message_open_container(message, 'e', "sv");
    if (r >= 0) r = sd_bus_message_append_basic(message, 's', child.key.c_str());
    if (r >= 0) r = appendVariant(message, child);
    if (r >= 0) r = sd_bus_message_close_container(message);
  }
  return r < 0 ? r : sd_bus_message_close_container(message);
}

int handleInfo(sd_bus_message* call, void* userdata, sd_bus_error*) {
  std::uint64_t policy = 0;
  int r = sd_bus_message_read(call, "t", &policy);
  sd_bus_message* reply = nullptr;
  if (r >= 0) r = sd_bus_message_new_method_return(call, &reply);
  if (r >= 0) r = appendDictionary(reply, *static_cast<const Node*>(userdata));
  if (r >= 0) r = sd_bus_send(nullptr, reply, nullptr);
  sd_bus_message_unref(reply);
  return r;
}

int handleInfos(sd_bus_message* call, void* userdata, sd_bus_error*) {
  sd_bus_message* reply = nullptr;
  int r = sd_bus_message_new_method_return(call, &reply);
  if (r >= 0) r = sd_bus_message_open_container(reply, 'a', "a{sv}");
  for (const Node& child : static_cast<const Node*>(userdata)->children) {
    if (r >= 0) r = appendDictionary(reply, child);
  }
  if (r >= 0) r = sd_bus_message_close_container(reply);
  if (r >= 0) r = sd_bus_send(nullptr, reply, nullptr);
  sd_bus_message_unref(reply);
  return r;
}

int handlePing(sd_bus_message* call, void*, sd_bus_error*) { return sd_bus_reply_method_return(call, ""); }

#pragma GCC diagnostic push
#pragma GCC diagnostic ignored "-Wpedantic"  // the macros of sd-bus-vtable.h
const sd_bus_vtable kMethods[] = {
    SD_BUS_VTABLE_START(0), SD_BUS_METHOD("Info", "t", "a{sv}", handleInfo, SD_BUS_VTABLE_UNPRIVILEGED),
    SD_BUS_METHOD("Infos", "tb", "aa{sv}", handleInfos, SD_BUS_VTABLE_UNPRIVILEGED),
    SD_BUS_METHOD("Ping", "", "", handlePing, SD_BUS_VTABLE_UNPRIVILEGED), SD_BUS_VTABLE_END};
#pragma GCC diagnostic pop

}  // namespace

int main(int argumentCount, char** arguments) {
  Node tree;
  if (argumentCount > 1) {
    std::ifstream file(arguments[1]);
    read(file, tree);
  }
  sd_bus* bus = nullptr;
  sd_event* loop = nullptr;
  int r = sd_event_default(&loop);
  if (r >= 0) r = sd_bus_open_user(&bus);
  if (r >= 0) r = sd_bus_add_object_vtable(bus, nullptr, kPath, kInterface, kMethods, &tree);
  if (r >= 0) r = sd_bus_request_name(bus, kName, 0);
  if (r >= 0) r = sd_bus_attach_event(bus, loop, 0);
  if (r >= 0) r = sd_event_loop(loop);
  sd_bus_unref(bus);
  sd_event_unref(loop);
  if (r < 0) std::fprintf(stderr, "kvr-bench-bare: error %d\n", -r);
  return r < 0 ? EXIT_FAILURE : EXIT_SUCCESS;
}
