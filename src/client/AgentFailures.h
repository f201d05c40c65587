#pragma once

#include "client/AgentClient.h"
#include "local/buscodec/BusHandles.h"

#include <string>
#include <vector>

// What the two kinds of connection to the agent share; not installed.
namespace kvr::bus {

Error failure(client::Failure code, std::string message);
/// What a negative result of the bus library, or an error that came as the answer, means to a client.
Error failureOf(int result, const BusError& error);
/// The value in an answer, or what its error means.
Result<Value> valueIn(sd_bus_message* answer, const char* type);
/// A call of the agent.
Result<BusMessageRef> newCall(sd_bus* bus, const char* member,
                              const std::vector<client::AgentClient::Argument>& arguments);

inline Value argumentOf(client::Policy policy) { return static_cast<std::uint64_t>(policy); }

template <class Record>
Result<Record> recordIn(const Result<Value>& reply) {
  if (!reply) return reply.error();
  return Record::from(*reply);
}

template <class Record>
Result<std::vector<Record>> recordsIn(const Result<Value>& reply) {
  if (!reply) return reply.error();
  std::vector<Record> records;
  for (const Value& record : reply->array()) records.push_back(Record::from(record));
  return records;
}

}  // namespace kvr::bus
