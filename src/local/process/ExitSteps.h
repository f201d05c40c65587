#pragma once

namespace kvr {

/// How far a requested clean exit has come.
enum class ExitPhase {
  NotRequested,
  WaitingForIdle,  ///< everything is served as before
  WakerWatches,    ///< a waker has been left behind and listens for what only this process would have noticed
  NameGivenUp,     ///< what came through the name is still served; later calls start the next agent
};

/// What a look at it leads to.
enum class ExitStep { Wait, LeaveWaker, GiveUpName, Leave };

/// `startedAgainByManager`: a service manager starts the next agent at once, so that no waker is needed. One
/// step a look: in between the loop takes in what has come meanwhile.
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
