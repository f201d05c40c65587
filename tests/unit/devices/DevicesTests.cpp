#include "core/devices/KVRDeviceInfo.h"
#include "core/devices/KVRDevicesManager.h"
#include "unit/CoverageWorld.h"

namespace kvr {
namespace {

TEST(ADevice, KeepsItsPropertiesThroughItsCodedForm) {
  const KVRDevice watch("Watch", "SN1", Date{86400}, KVRDevice::kWatch);
  EXPECT_EQ(watch.description(), "Watch (SN1) (1970-01-02 00:00:00 +0000) - Watch");
  EXPECT_EQ(KVRDevice::initWithCoder(watch.encodeWithCoder())->description(), watch.description());

  const KVRDevice bare(std::nullopt, std::nullopt, std::nullopt, 0xFFFFFFFFFFFFFFFF);
  EXPECT_EQ(bare.encodeWithCoder(), Value(Dictionary{{"deviceType", 0xFFFFFFFFFFFFFFFF}}));
  EXPECT_EQ(KVRDevice::initWithCoder(bare.encodeWithCoder())->deviceType(), 0xFFFFFFFFFFFFFFFF);
  EXPECT_EQ(bare.description(), "(null) ((null)) ((null)) - Default");

  const auto wrong = KVRDevice::initWithCoder(
      Dictionary{{"name", 7}, {"serialNumber", Array{}}, {"activationDate", 5}, {"deviceType", "1"}});
  EXPECT_EQ(wrong->description(), bare.description()) << "a wrong kind is an absent property";
}

struct ADeviceInfo : SimulatedTest {
  KVRWarrantyRef warranty(bool display) {
    return KVRWarranty::initWithDictionary(
        world.platform, Dictionary{{"zubOfferEligibleUntil", 86400},
                                   {"featureToggleParameters", Dictionary{{"zubOfferDisplay", display}}}});
  }
};

TEST_F(ADeviceInfo, TellsItsOfferAndDecodesPartByPart) {
  const auto device = KVRDevice::deviceWithName("P", "S", {}, 0);
  EXPECT_EQ(KVRDeviceInfo(device, warranty(false)).description(), "P (S) ((null)) - Default: No offer");
  EXPECT_EQ(KVRDeviceInfo(device, nullptr).description(), "P (S) ((null)) - Default: No offer");
  Value coded = KVRDeviceInfo(device, warranty(true)).encodeWithCoder();
  EXPECT_EQ(KVRDeviceInfo::initWithCoder(world.platform, coded)->description(),
            "P (S) ((null)) - Default: Eligible until 1970-01-02 00:00:00 +0000");
  coded = Dictionary{{"device", "x"}, {"warranty", coded["warranty"]}};
  const auto half = KVRDeviceInfo::initWithCoder(world.platform, coded);
  EXPECT_EQ(half->device(), nullptr);
  EXPECT_NE(half->warranty(), nullptr);
}

struct TheDevicesManager : CoverageTest {
  TheDevicesManager() {
    world.pairedDevices.devices = {
        {"Run", "Model", "W1", Date{1}, true, false},
        {std::nullopt, "Model", "W2", std::nullopt, true, std::nullopt},
        {"Gone", "Model", "W3", Date{1}, false, false},
        {"Old", "Model", "W4", Date{1}, true, true},
        {"Half", "Model", "W5", Date{1}, {}, {}},
        {"Nameless", "Model", std::nullopt, Date{1}, true, false},
    };
  }
  KVRDevicesManager& manager() { return *KVRDevicesManager::sharedManager(world.platform); }
};

TEST_F(TheDevicesManager, FindsTheWatchesThatArePairedNow) {
  world.preferences.setObject(Date{77}, "DefaultDeviceActivationDate");
  const auto devices = manager().allDevices();
  EXPECT_THAT(devices, ElementsAre(Key("LOCAL"), Key("W1"), Key("W2")));
  EXPECT_EQ(devices.at("LOCAL")->description(), "Phone (LOCAL) (1970-01-01 00:01:17 +0000) - Default");
  EXPECT_EQ(devices.at("W1")->description(), "Run (W1) (1970-01-01 00:00:01 +0000) - Watch");
  EXPECT_EQ(devices.at("W2")->description(), "Model (W2) ((null)) - Watch");

  world.pair("LOCAL");
  EXPECT_EQ(manager().allDevices().at("LOCAL")->name(), "Watch");
  world.deviceProperties.answers.erase("SerialNumber");
  world.pairedDevices.devices.pop_back();
  EXPECT_THAT(manager().allDevices(), ElementsAre(Key("W1"), Key("W2")));
}

TEST_F(TheDevicesManager, IgnoresWatchesThatFlagOrServiceDoNotSupport) {
  world.preferences.setObject(Dictionary{{"LowServerVersion", 1}, {"HighServerVersion", 2}},
                              preference::kServerVersionCache);
  EXPECT_THAT(manager().pairedDevices(), IsEmpty());
  EXPECT_TRUE(world.log.contains("Bravik 3.0 disabled by server, ignore paired devices"));
  world.featureFlags.enabled.clear();
  EXPECT_THAT(manager().allDevices(), ElementsAre(Key("LOCAL")));
  EXPECT_TRUE(world.log.contains("Bravik 3.0 disabled by feature flag, ignore paired devices"));
  EXPECT_THAT(world.http.requests(), IsEmpty());
}

TEST_F(TheDevicesManager, HonoursOverridesOnInternalInstallationsOnly) {
  world.clock.set(Date{1000000});
  world.preferences.setObject("OVERRIDE", "SerialNumber");
  world.preferences.setObject(Dictionary{{"a", "S1"}, {"b", "S2"}, {"c", 3}}, "PairedWatchesSerialNumbers");
  world.preferences.setObject(-86400, "S1.activationInterval");
  EXPECT_EQ(manager().defaultDevice()->serialNumber(), "LOCAL");
  EXPECT_THAT(manager().pairedDevices(), ElementsAre(Key("W1"), Key("W2")));

  world.deviceProperties.internalInstall = true;
  EXPECT_EQ(manager().defaultDevice()->serialNumber(), "OVERRIDE");
  const auto watches = manager().pairedDevices();
  EXPECT_THAT(watches, ElementsAre(Key("S1"), Key("S2")));
  EXPECT_EQ(watches.at("S1")->name(), "DEBUG:S1");
  EXPECT_EQ(watches.at("S1")->activationDate(), Date{1000000 - 86400});
  EXPECT_EQ(watches.at("S2")->activationDate(), Date{1000000});
  EXPECT_EQ(watches.at("S2")->deviceType(), KVRDevice::kWatch);
  world.preferences.setObject(Dictionary{}, "PairedWatchesSerialNumbers");
  EXPECT_THAT(manager().pairedDevices(), IsEmpty());
}

}  // namespace
}  // namespace kvr
