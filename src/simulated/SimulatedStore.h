#pragma once

#include "platform/services/ApplicationRegistry.h"
#include "platform/services/StoreLookup.h"
#include "platform/services/StringTables.h"
#include "platform/services/WorkQueues.h"

#include <map>
#include <optional>
#include <string>
#include <tuple>
#include <utility>
#include <vector>

namespace kvr {

class SimulatedApplicationRegistry : public ApplicationRegistry {
 public:
  std::map<std::string, ApplicationRecord> installed;

  std::optional<ApplicationRecord> installedApplication(const std::string& bundleIdentifier) const override {
    const auto found = installed.find(bundleIdentifier);
    return found == installed.end() ? std::nullopt : std::optional(found->second);
  }
};

/// Answers with what the test has set.
class SimulatedStore : public StoreLookup {
 public:
  explicit SimulatedStore(WorkQueues& queues) : queues_(queues), queue_(queues.newSerialQueue("store")) {}

  std::vector<PurchasedApplication> purchases;
  double purchaseDelay = 0;  ///< seconds
  std::optional<std::vector<CatalogueItem>> catalogue = std::vector<CatalogueItem>();
  std::optional<Error> catalogueError;
  std::vector<std::int64_t> purchaseQueries;  ///< the accounts that were asked about
  std::size_t lookups = 0;

  void purchaseHistory(std::int64_t storeAccountIdentifier, std::vector<std::string> /*bundleIdentifiers*/,
                       PurchasesReply reply) override {
    purchaseQueries.push_back(storeAccountIdentifier);
    queues_.after(purchaseDelay, queue_, [found = purchases, reply = std::move(reply)] { reply(found); });
  }
  void lookUp(std::vector<std::string> /*bundleIdentifiers*/, const std::string& /*caller*/,
              CatalogueReply reply) override {
    ++lookups;
    queue_->async(
        [found = catalogue, error = catalogueError, reply = std::move(reply)] { reply(found, error); });
  }

 private:
  WorkQueues& queues_;
  const WorkQueueRef queue_;
};

class SimulatedStringTables : public StringTables {
 public:
  /// By bundle, table and key.
  std::map<std::tuple<std::string, std::string, std::string>, std::string> texts;

  std::string localizedString(const std::string& bundle, const std::string& table, const std::string& key,
                              const std::string& defaultValue) const override {
    const auto found = texts.find({bundle, table, key});
    return found == texts.end() ? defaultValue : found->second;
  }
};

}  // namespace kvr
