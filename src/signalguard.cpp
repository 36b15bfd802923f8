#include "signalguard.h"

#include <initializer_list>

SignalGuard::SignalGuard() {
  sigset_t ending;
  sigemptyset(&ending);
  for (const int number : {SIGINT, SIGTERM, SIGHUP, SIGQUIT})
    sigaddset(&ending, number);
  sigprocmask(SIG_BLOCK, &ending, &before_);
}

SignalGuard::~SignalGuard() {
  sigprocmask(SIG_SETMASK, &before_, nullptr);
}
