#include "conformance/FileWorld.h"
#include "platform/stores/FileFollowUpCenter.h"
#include "simulated/SimulatedObservers.h"

namespace kvr {
namespace {

const std::string kClient = "com.tarsil.Kavrel";

FollowUpItem itemNamed(const std::string& identifier) {
  FollowUpItem item;
  item.uniqueIdentifier = identifier;
  return item;
}

struct AFollowUpCenter : InBothWorlds {
  std::vector<std::string> pending() {
    std::vector<std::string> names;
    const auto items = client->pendingItems();
    for (const auto& item : *items) names.push_back(*item.uniqueIdentifier);
    return names;
  }

  const std::string folder = world.path("Library/FollowUps");
  const std::string path = folder + "/" + kClient + ".plist";
  SimulatedObservers observers;
  FileFollowUpCenter center{world.lists, world.clock, observers};
  const std::unique_ptr<FollowUpCenterClient> client = center.newClient(kClient);
};
INSTANTIATE_TEST_SUITE_P(, AFollowUpCenter, ::testing::Bool(), AFollowUpCenter::nameOf);

TEST_P(AFollowUpCenter, GivesBackAnItemWithAllItsFields) {
  FollowUpItem item = itemNamed("a");
  item.groupIdentifier = "group";
  item.targetBundleIdentifier = kFollowUpSettingsBundleIdentifier;
  item.extensionIdentifier = "extension";
  item.displayStyle = 18;
  item.title = "T\u00e9xt";
  item.informativeFooterText = "footer";
  item.expirationDate = world.clock.now() + 100.999;
  item.userInfo = {{kFollowUpRelativeDateCeilingKey, true}, {"FollowupSerialNumber", "SN"}};
  item.actions = {{"Buy", std::nullopt}, {Value(), "https://example.com/"}};
  EXPECT_EQ(client->postItem(item), std::nullopt);
  EXPECT_EQ(client->postItem(itemNamed("bare")), std::nullopt);
  EXPECT_THAT(*client->pendingItems(), ElementsAre(item, itemNamed("bare")));
  EXPECT_THAT(*center.newClient("com.tarsil.other")->pendingItems(), IsEmpty());
}

TEST_P(AFollowUpCenter, ReplacesClearsAndDropsItems) {
  for (const char* name : {"a", "b", "c"}) EXPECT_FALSE(client->postItem(itemNamed(name)));
  auto replacement = itemNamed("b");
  replacement.title = "new";
  replacement.expirationDate = world.clock.now() + 10;
  EXPECT_FALSE(client->postItem(replacement));
  EXPECT_THAT(*client->pendingItems(), ElementsAre(itemNamed("a"), replacement, itemNamed("c")));
  EXPECT_FALSE(client->clearPendingItems({"a", "unknown"}));
  EXPECT_THAT(pending(), ElementsAre("b", "c"));
  world.clock.moveBy(10);
  EXPECT_THAT(pending(), ElementsAre("c"));
  EXPECT_FALSE(client->postItem(itemNamed("d")));
  EXPECT_THAT(world.tree(path)["items"].array(), SizeIs(2));
}

TEST_P(AFollowUpCenter, RefusesWhatItCannotKeep) {
  EXPECT_EQ(client->postItem({}).value().code, EINVAL);
  for (const char* name : {"", "../Preferences/x", "a/b"}) {
    EXPECT_TRUE(center.newClient(name)->postItem(itemNamed("a"))) << name;
    EXPECT_FALSE(center.newClient(name)->pendingItems()) << name;
  }
}

TEST_P(AFollowUpCenter, SetsADamagedListAsideAndGoesOn) {
  const Value damaged[] = {Dictionary{{"items", "x"}}, Dictionary{{"items", Array{1}}}};
  for (const auto& tree : damaged) {
    world.putTree(path, tree);
    EXPECT_THAT(pending(), IsEmpty());
    EXPECT_FALSE(client->postItem(itemNamed("a")));
    EXPECT_THAT(pending(), ElementsAre("a"));
    world.clock.moveBy(60);
  }
  EXPECT_THAT(world.names(folder), Contains(HasSubstr(".damaged-")).Times(2));
  EXPECT_THAT(world.errors(), SizeIs(2));
}

}  // namespace
}  // namespace kvr
