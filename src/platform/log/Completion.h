#pragma once

#include "platform/log/Log.h"

#include <atomic>
#include <functional>
#include <memory>
#include <string_view>
#include <utility>

namespace kvr {

/// A callback that must be called exactly once.
///
/// Copies share one state, so any copy can be used to answer. The function runs on the thread that answers,
/// and its captures are released right after. A second answer is ignored. A second answer, and the
/// destruction of the last copy without an answer, are logged as errors.
template <class... A>
class Completion {
 public:
  using Function = std::function<void(A...)>;

  /// `name` is the operation that owes the answer; it must be a literal.
  Completion(Log& log, std::string_view name, Function function)
      : state_(std::make_shared<State>(log, name, std::move(function))) {}

  void operator()(A... arguments) const {
    if (state_->answered.exchange(true)) {
      state_->log.reportMisusedCompletion("answered a second time, refused", state_->name);
      return;
    }
    const Function function = std::exchange(state_->function, nullptr);
    function(std::move(arguments)...);
  }

 private:
  struct State {
    State(Log& theLog, std::string_view theName, Function theFunction)
        : log(theLog), name(theName), function(std::move(theFunction)) {}
    State(const State&) = delete;
    State& operator=(const State&) = delete;
    ~State() {
      if (!answered) log.reportMisusedCompletion("went without an answer", name);
    }

    Log& log;
    const std::string_view name;
    Function function;
    std::atomic<bool> answered{false};
  };

  std::shared_ptr<State> state_;
};

}  // namespace kvr
