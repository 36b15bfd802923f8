// Blocks the signals that end the program during a step that a repetition could not make good. They act right
// after the step. No child may be started in it: it would inherit the mask.
#pragma once

#include <csignal>

class SignalGuard {
public:
  /// Blocks SIGINT, SIGTERM, SIGHUP and SIGQUIT during the lifetime of the object.
  SignalGuard();
  SignalGuard(const SignalGuard &) = delete;
  SignalGuard &operator=(const SignalGuard &) = delete;
  ~SignalGuard();

private:
  sigset_t before_ = {};
};
