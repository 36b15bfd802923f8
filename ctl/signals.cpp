#include "signals.h"

#include <array>
#include <cerrno>

#include <poll.h>

namespace {

constexpr std::array<int, 3> Interruptions = {SIGINT, SIGTERM, SIGHUP};

volatile std::sig_atomic_t noted = 0;
int catchers = 0;
std::array<struct sigaction, Interruptions.size()> before = {};

} // namespace

InterruptionCatcher::InterruptionCatcher() {
  if (catchers++ > 0)
    return;
  for (std::size_t i = 0; i < Interruptions.size(); ++i) {
    sigaction(Interruptions[i], nullptr, &before[i]);
    struct sigaction note = {};
    note.sa_handler = [](int number) { noted = number; };
    if (before[i].sa_handler == SIG_DFL) // no SA_RESTART: a wait ends as well
      sigaction(Interruptions[i], &note, nullptr);
  }
}

InterruptionCatcher::~InterruptionCatcher() {
  if (--catchers > 0)
    return;
  for (std::size_t i = 0; i < Interruptions.size(); ++i)
    if (before[i].sa_handler == SIG_DFL)
      sigaction(Interruptions[i], &before[i], nullptr);
}

bool wasInterrupted() {
  return noted != 0;
}

bool waitForInput(int descriptor) {
  sigset_t interruptions;
  sigset_t mask;
  sigemptyset(&interruptions);
  for (const int number : Interruptions)
    sigaddset(&interruptions, number);
  // Blocked but for the wait itself: one that comes just before it would not end it.
  sigprocmask(SIG_BLOCK, &interruptions, &mask);
  pollfd input = {descriptor, POLLIN, 0};
  int ready = 0;
  while (!wasInterrupted() && (ready = ppoll(&input, 1, nullptr, &mask)) < 0 && errno == EINTR)
    continue;
  sigprocmask(SIG_SETMASK, &mask, nullptr);
  return ready > 0;
}

void stopIfInterrupted() {
  if (wasInterrupted())
    throw Interrupted{noted};
}

void outlastInterruptions() {
  for (const int number : {SIGINT, SIGTERM, SIGHUP, SIGQUIT, SIGPIPE})
    static_cast<void>(std::signal(number, [](int) {}));
  noted = 0;
}

void endBySignal(int number) {
  static_cast<void>(std::signal(number, SIG_DFL));
  static_cast<void>(std::raise(number));
}
