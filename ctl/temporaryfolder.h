// A folder of this process alone, mode 0700, that goes with everything in it when the object does; an
// interruption in between is noted (signals.h).
#pragma once

#include <string>

#include "signals.h"

class TemporaryFolder {
public:
  /// Below TMPDIR, or /tmp; JudgementError when none can be made.
  TemporaryFolder();
  /// Below this folder.
  explicit TemporaryFolder(const std::string &parent);
  TemporaryFolder(const TemporaryFolder &) = delete;
  TemporaryFolder &operator=(const TemporaryFolder &) = delete;
  ~TemporaryFolder();

  const std::string &path() const { return path_; } ///< without "/" at the end

private:
  InterruptionCatcher catcher_;
  std::string path_;
};
