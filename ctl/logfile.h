// The log on disk: read once through, or followed while it grows.
#pragma once

#include <cstdint>
#include <memory>
#include <string>

#include "inputfile.h"
#include "runlog.h"

/// patchlogs/orvpatch.log below a home.
std::string logPath(const std::string &home);

/// Feeds what stands between two offsets of the file. JudgementError when it cannot be read.
void feedLog(const InputFile &file, std::uint64_t from, std::uint64_t to, RunLog &log);

/// Reads what comes to the end of a log, also when it is cut off at its start or renamed in the meantime.
class LogFollower {
public:
  /// Begins at `offset`. A log that does not exist yet is waited for.
  LogFollower(const std::string &path, std::uint64_t offset);

  /// Feeds what has come since the last call; false when nothing has.
  bool poll(RunLog &log);
  /// When the log was last written to.
  std::time_t modified() const { return file_->modified(); }

private:
  bool feedRest(RunLog &log);

  std::string path_;
  std::unique_ptr<InputFile> file_;
  std::uint64_t offset_;
};
