// The working directory during one step of a patch; the one before comes back with the end of the step.
#pragma once

#include <string>

#include "nls.h"

class WorkingDirectory {
public:
  WorkingDirectory() = default;
  WorkingDirectory(const WorkingDirectory &) = delete;
  WorkingDirectory &operator=(const WorkingDirectory &) = delete;
  /// Goes back, unless that has been done; a failure is ignored.
  ~WorkingDirectory();

  /// Changes into `directory`; code 24.
  bool enter(const std::string &directory, PatchError *err);
  /// Goes back; code 24.
  bool leave(PatchError *err);

private:
  std::string before_;
  bool isEntered_ = false;
};
