// An installation that did not end, or did not end well: what is known of it from its record and the log.
#pragma once

#include <ctime>
#include <optional>
#include <string>
#include <vector>

#include "home.h"
#include "patch.h"
#include "recovery/logfacts.h"
#include "transaction/record.h"

/// A file that a patch brings.
struct InterruptedFile {
  std::string path;
  unsigned archiveMode = 0;
  bool wasThere = false; ///< an old file stood there; false also when that is not known
  std::optional<FileState> before;
};

struct InterruptedPatch {
  Patch patch; ///< as its archive has it
  std::string versionFile;
  std::string levelBefore; ///< empty when it is not known
  std::string levelAfter;
  std::vector<std::string> temporary; ///< "tmp/yn" and, where it differs, "tmp/kyn"
  std::vector<InterruptedFile> files;
  PatchFacts facts; ///< what the log tells of it
};

struct Interruption {
  bool hasRecord = false; ///< of a transaction that did not end
  std::string folder;     ///< of that transaction
  Record record;          ///< what is known in the words of one, also without it
  LogFacts log;
  std::vector<InterruptedPatch> patches;
  std::vector<RecordedInstance> ran; ///< instances that ran before
  std::vector<std::string> directories;
  std::time_t since = 0;             ///< with a record: lines of the history before this are of others
  bool isWhole = true;               ///< every patch could be read
  std::vector<std::string> messages; ///< what could not be found out

  /// There is an installation to tell of.
  bool isThere() const { return hasRecord || log.isInterrupted; }
};

/// Of the newest transaction without an end; else of the log. JudgementError when something cannot be read.
Interruption findInterruption(const Home &home);
