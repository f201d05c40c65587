#include "kvr-simulate/Events.h"

#include "kvr-simulate/Dice.h"

#include <array>

namespace kvr::simulate {
namespace {

constexpr double kHour = 3600;
constexpr double kDay = 24 * kHour;
constexpr double kYear = 365 * kDay;

struct Frequency {
  EventKind kind;
  const char* name;
  unsigned weight;
};

constexpr std::array kFrequencies{
    Frequency{EventKind::Call, "call", 30},           Frequency{EventKind::Offer, "offer", 12},
    Frequency{EventKind::Watch, "watch", 8},          Frequency{EventKind::Account, "account", 4},
    Frequency{EventKind::Token, "token", 4},          Frequency{EventKind::Locale, "locale", 4},
    Frequency{EventKind::Clock, "clock", 4},          Frequency{EventKind::Suspend, "suspend", 4},
    Frequency{EventKind::Network, "network", 4},      Frequency{EventKind::Reboot, "reboot", 4},
    Frequency{EventKind::Upgrade, "upgrade", 3},      Frequency{EventKind::Stop, "stop", 3},
    Frequency{EventKind::Crash, "crash", 8},          Frequency{EventKind::PowerLoss, "power loss", 6},
    Frequency{EventKind::ServiceFault, "service", 8}, Frequency{EventKind::FileFault, "files", 6},
    Frequency{EventKind::Attestation, "attest", 2},   Frequency{EventKind::Damage, "damage", 1},
    Frequency{EventKind::Setting, "setting", 2},
};

EventKind drawKind(Dice& dice) {
  unsigned sum = 0;
  for (const auto& frequency : kFrequencies) sum += frequency.weight;
  auto choice = dice.below(sum);
  for (const auto& frequency : kFrequencies) {
    if (choice < frequency.weight) return frequency.kind;
    choice -= frequency.weight;
  }
  return EventKind::Call;
}

double drawGap(Dice& dice) {
  const double share = dice.share();
  if (share < 0.25) return dice.between(0, 10);
  if (share < 0.5) return dice.between(0, 2 * kHour);
  return dice.between(0, 6 * kDay);
}

}  // namespace

const char* nameOf(EventKind kind) {
  for (const auto& frequency : kFrequencies) {
    if (frequency.kind == kind) return frequency.name;
  }
  return "?";
}

std::vector<Event> eventsOf(std::uint64_t seed, double years) {
  Dice dice(seed);
  std::vector<Event> events;
  double at = drawGap(dice);
  while (at < years * kYear) {
    const auto kind = drawKind(dice);
    events.push_back({events.size(), at, kind, dice.number()});
    at += drawGap(dice);
  }
  return events;
}

}  // namespace kvr::simulate
