#include "signing/SHA256Hash.h"
#include "unit/SimulatedTest.h"
#include "warranty/KVRWarranty.h"

namespace kvr {
namespace {

class TheWarrantyCache : public SimulatedTest {
 protected:
  static constexpr const char* kDirectory = "/home/user/Library/Application Support/com.tarsil.Kavrel";
  static constexpr const char* kLegacyPath =
      "/home/user/Library/Application Support/com.tarsil.Kavrel/Warranty.plist";

  std::shared_ptr<KVRWarranty> cached(const std::optional<std::string>& serialNumber) {
    return KVRWarranty::cachedWarrantyForSerialNumber(world.platform, serialNumber);
  }
  void store(const Value& dictionary, const std::optional<std::string>& serialNumber) {
    KVRWarranty::initWithDictionary(world.platform, dictionary)->cacheWarranty(serialNumber);
  }
};

TEST_F(TheWarrantyCache, KeepsOneFileADeviceNamedByTheHash) {
  store(Dictionary{{"covered", true}}, "SN0000000001");
  store(Dictionary{{"covered", false}}, "SN0000000002");
  EXPECT_THAT(
      world.files.list(kDirectory),
      UnorderedElementsAre(std::string(kDirectory) + "/" + sha256Hash("SN0000000001") + "_Warranty.plist",
                           std::string(kDirectory) + "/" + sha256Hash("SN0000000002") + "_Warranty.plist"));
  EXPECT_THAT(world.files.list("/"), Each(Not(HasSubstr("SN0000"))));
  EXPECT_THAT(*world.files.get(world.files.list(kDirectory)[0]), ::testing::StartsWith("<?xml"));
  EXPECT_TRUE(cached("SN0000000001")->covered());
  EXPECT_FALSE(cached("SN0000000002")->covered());
}

TEST_F(TheWarrantyCache, HasTheLegacyFileForNoDeviceOnly) {
  world.files.putPropertyList(kLegacyPath, Dictionary{{"covered", true}});
  EXPECT_EQ(cached("SN"), nullptr);
  EXPECT_NE(cached(std::nullopt), nullptr);
}

TEST_F(TheWarrantyCache, KeepsTheOldFileWhenTheNewOneCannotBeWritten) {
  store(Dictionary{{"covered", true}}, "SN");
  world.files.setWriteFault(Error{"files", ENOSPC, "no space"});
  store(Dictionary{{"covered", false}}, "SN");
  EXPECT_TRUE(cached("SN")->covered());
}

}  // namespace
}  // namespace kvr
