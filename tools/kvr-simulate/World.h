#pragma once

#include "kvr-simulate/Service.h"
#include "simulated/SimulatedPlatform.h"

#include <cstdint>
#include <string>
#include <vector>

namespace kvr::simulate {

/// What outlives a process of the agent: the device, its owner, the watches and the service.
struct World {
  struct Watch {
    std::string serialNumber;
    Date paired;
    Date pairedBefore;  ///< the earlier of the last two pairings
    bool isPaired = true;
    bool isArchived = false;
  };

  explicit World(std::uint64_t seed);

  /// Draws a new offer that the service might make for a device at `today`.
  Offer drawOffer(Dice& dice, const std::string& serialNumber, Date today) const;
  /// The phone and all watches, including unpaired ones.
  std::vector<std::string> serialNumbers() const;
  /// The phone and the watches that the agent looks after.
  std::vector<std::string> trackedSerialNumbers() const;
  const Watch* watch(const std::string& serialNumber) const;
  /// Whether a look-up may fail at present.
  bool isInTrouble() const;
  /// Sets up a platform to match this world.
  void show(SimulatedPlatform& platform) const;
  /// Stores the files of the earlier layout.
  void putLegacyFiles(SimulatedFiles& files);

  const std::uint64_t seed;
  Dice dice;
  double now = 0;  ///< seconds since birth, which no clock change affects
  std::string phone;
  std::vector<Watch> watches;
  Service service;
  unsigned systemVersion = 0;
  unsigned boot = 0;
  std::string locale = "en_US";
  bool hasAccount = true;
  double accountChanged = 0;  ///< when, in seconds since birth
  std::string heldToken = "token 0";
  SimulatedAccountStore::Renewal renewal;
  SimulatedDeviceAttestation::Outcome attestation;
  bool hasAttestation = true;
  bool isNetworkReachable = true;
  std::vector<std::string> hosts{"coverage.tarsil.example", "assets.tarsil.example"};  ///< ever configured
};

}  // namespace kvr::simulate
