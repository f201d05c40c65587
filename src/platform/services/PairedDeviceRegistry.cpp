#include "platform/services/PairedDeviceRegistry.h"

#include "platform/value/Value.h"

namespace kvr {

std::string describe(const PairedDeviceEntry& entry) {
  Value::Dictionary fields;
  const auto add = [&fields](const char* key, const Value& value) {
    if (!value.isNull()) fields.emplace(key, value);
  };
  add("name", entry.name);
  add("localizedModel", entry.localizedModel);
  add("serialNumber", entry.serialNumber);
  add("pairedDate", entry.pairedDate);
  add("isPaired", entry.isPaired);
  add("isArchived", entry.isArchived);
  return describe(Value(std::move(fields)));
}

}  // namespace kvr
