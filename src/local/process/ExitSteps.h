#pragma once

namespace kvr {

/// How far a requested clean exit has come.
enum class ExitPhase {
  NotRequested,
  WaitingForIdle,  ///< everything is served as usual
  WakerWatches,    ///< `kvragent-wake` has been started and watches in this agent's place
  NameGivenUp,     ///< calls that came through the name are still served; later calls start the next agent
};

/// What to do after a check of the state.
enum class ExitStep { Wait, LeaveWaker, GiveUpName, Leave };

/// `startedAgainByManager`: a service manager starts the next agent at once, so no waker is needed. Only one
/// step is taken per check; in between, the loop handles what has arrived meanwhile.
///
/// | phase            | idle | started again by its manager | step         |
/// |------------------|------|------------------------------|--------------|
/// | waiting for idle | yes  | yes                          | give up name |
/// | waiting for idle | yes  | no                           | leave waker  |
/// | waker watches    | yes  |                              | give up name |
/// | name given up    | yes  |                              | leave        |
/// | any              | no   |                              | wait         |
constexpr ExitStep exitStep(ExitPhase phase, bool isIdle, bool startedAgainByManager) {
  if (!isIdle) return ExitStep::Wait;
  switch (phase) {
    case ExitPhase::WaitingForIdle:
      return startedAgainByManager ? ExitStep::GiveUpName : ExitStep::LeaveWaker;
    case ExitPhase::WakerWatches:
      return ExitStep::GiveUpName;
    case ExitPhase::NameGivenUp:
      return ExitStep::Leave;
    case ExitPhase::NotRequested:
      break;
  }
  return ExitStep::Wait;
}

}  // namespace kvr
