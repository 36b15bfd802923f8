// Holds back the signals that end the program while a step runs that no repetition could make good. They act
// right after the step. No child may be started meanwhile: it would inherit the mask.
#pragma once

#include <csignal>

class SignalGuard {
public:
  /// Blocks SIGINT, SIGTERM, SIGHUP and SIGQUIT for the life of the object.
  SignalGuard();
  SignalGuard(const SignalGuard &) = delete;
  SignalGuard &operator=(const SignalGuard &) = delete;
  ~SignalGuard();

private:
  sigset_t before_ = {};
};
