#pragma once

#include "platform/services/ServiceListener.h"

#include <string>

namespace kvr {

/// The introspection document of an object that offers `interface` beside Introspectable and Peer.
std::string introspectionDocument(const ServiceInterface& interface);

/// The signature of a method's arguments, such as "st".
std::string signatureOf(const ServiceMethod& method);

}  // namespace kvr
