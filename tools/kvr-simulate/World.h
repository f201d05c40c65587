#pragma once

#include "kvr-simulate/Service.h"
#include "simulated/SimulatedPlatform.h"

#include <cstdint>
#include <string>
#include <vector>

namespace kvr::simulate {

/// What outlives the agent: the device, its owner, the watches and the service, and the files between two
/// processes.
struct World {
  struct Watch {
    std::string serialNumber;
    Date paired;
    Date pairedBefore;  ///< the earlier one of the last two pairings
    bool isPaired = true;
    bool isArchived = false;
  };

  explicit World(std::uint64_t seed);

  /// A new offer for a device: what the service may come to say at `today`.
  Offer drawOffer(Dice& dice, const std::string& serialNumber, Date today) const;
  /// The phone and the watches, those not paired as well.
  std::vector<std::string> serialNumbers() const;
  /// Those that are looked after.
  std::vector<std::string> trackedSerialNumbers() const;
  const Watch* watch(const std::string& serialNumber) const;
  /// Whether a look-up may fail as things are.
  bool isInTrouble() const;
  /// Makes a platform show this world as it is.
  void show(SimulatedPlatform& platform) const;
  /// Puts the files of the earlier layout in place.
  void putLegacyFiles(SimulatedFiles& files);

  const std::uint64_t seed;
  Dice dice;
  double now = 0;  ///< seconds since birth, which nobody sets
  std::string phone;
  std::vector<Watch> watches;
  Service service;
  unsigned systemVersion = 0;
  unsigned boot = 0;
  std::string locale = "en_US";
  bool hasAccount = true;
  double accountChanged = 0;  ///< when, by `now`
  std::string heldToken = "token 0";
  SimulatedAccountStore::Renewal renewal;
  SimulatedDeviceAttestation::Outcome attestation;
  bool hasAttestation = true;
  bool isNetworkReachable = true;
  std::vector<std::string> hosts{"coverage.tarsil.example", "assets.tarsil.example"};  ///< ever configured
};

}  // namespace kvr::simulate
