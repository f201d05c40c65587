#pragma once

#include "platform/log/Completion.h"
#include "platform/value/Value.h"

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace kvr {

/// A named value with its bus type: "s", "d", "t", "b", "a{sv}" or "aa{sv}".
struct ServiceArgument {
  const char* name;
  const char* type;
};

/// One operation: its arguments and its one reply value.
struct ServiceMethod {
  const char* member;
  std::vector<ServiceArgument> in;
  ServiceArgument out;
};

/// The operations that a service offers to its clients, in a fixed order.
struct ServiceInterface {
  const char* name;
  std::vector<ServiceMethod> methods;
};

/// The reply to one call; a null value is sent as the type's empty value. May be given on any thread.
using ServiceReply = Completion<Value>;

/// Serves the calls of one connection.
class ServiceObject {
 public:
  virtual ~ServiceObject() = default;
  /// Serves one call of the interface's method number `method`. The arguments have been checked against the
  /// method's types. Called on the connection's own queue; blocking there delays that connection only.
  virtual void invoke(std::size_t method, const Value::Array& arguments, ServiceReply reply) = 0;
};

/// One client's connection, offered to the delegate before its first call is served.
class ServiceConnection {
 public:
  virtual ~ServiceConnection() = default;
  /// The value of a named entitlement of the peer's program, or null.
  virtual Value valueForEntitlement(std::string_view entitlement) const = 0;
  virtual std::int32_t processIdentifier() const = 0;
  virtual void setExportedInterface(const ServiceInterface& interface) = 0;
  /// The connection holds the object for its whole life.
  virtual void setExportedObject(std::shared_ptr<ServiceObject> object) = 0;
  /// Starts delivering calls.
  virtual void resume() = 0;
};

class ServiceListenerDelegate {
 public:
  virtual ~ServiceListenerDelegate() = default;
  /// Whether a new connection is served. Called on the listener's queue, one connection at a time. A refusal
  /// holds for as long as the connection lives.
  virtual bool shouldAcceptNewConnection(ServiceConnection& connection) = 0;
};

/// A named service that programs can connect to.
class ServiceListener {
 public:
  virtual ~ServiceListener() = default;
  /// The delegate must outlive the listener.
  virtual void setDelegate(ServiceListenerDelegate& delegate) = 0;
  /// Takes the name and accepts connections. `interface` is what introspection shows.
  virtual void resume(const ServiceInterface& interface) = 0;
};

class ServiceListeners {
 public:
  virtual ~ServiceListeners() = default;
  virtual std::unique_ptr<ServiceListener> newListener(std::string name) = 0;
};

}  // namespace kvr
