// A folder of this process alone, mode 0700, that goes with everything in it when the object does.
#pragma once

#include <string>

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
  std::string path_;
};
