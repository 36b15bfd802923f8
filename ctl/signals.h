// Interruptions (SIGINT, SIGTERM, SIGHUP) that come while something must be removed first.
#pragma once

#include <csignal>

/// While one lives, an interruption is noted in place of ending the process; a signal that the caller has set
/// to be ignored stays ignored. Several may live one inside the other.
class InterruptionCatcher {
public:
  InterruptionCatcher();
  InterruptionCatcher(const InterruptionCatcher &) = delete;
  InterruptionCatcher &operator=(const InterruptionCatcher &) = delete;
  ~InterruptionCatcher();
};

/// Thrown where the work stops; the application ends the process by the same signal once all is removed.
struct Interrupted {
  int signal;
};

/// Whether an interruption has been noted.
bool wasInterrupted();
/// Waits until something can be read, or the end is reached; false when an interruption comes before.
bool waitForInput(int descriptor);
/// Interrupted when one has been noted.
void stopIfInterrupted();
/// From the first change to the last nothing but SIGKILL may end this process; what was noted before is
/// forgotten. The signals are caught, not ignored: the instances that it starts would inherit that.
void outlastInterruptions();
/// Ends the process by this signal, as if it had never been caught.
void endBySignal(int number);
