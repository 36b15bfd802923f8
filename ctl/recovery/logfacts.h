// What the log tells of installations that did not end well: those since the last one that did.
//
// They count together, for a repetition knows nothing of what a killed run has done before it: which
// instances it had stopped, which directories it had made.
#pragma once

#include <map>
#include <optional>
#include <set>
#include <string>
#include <vector>

#include "home.h"
#include "runlog.h"

/// One patch as the runs have left it.
struct PatchFacts {
  std::string file;            ///< name of the patch file
  std::string archive;         ///< its path, as tar was given it; empty when tar did not run
  std::set<std::string> moved; ///< relative to the home
  bool hasBegun = false;       ///< a run has come to its files
  bool hasMoved = false;       ///< the last run was through with its files
  bool hasRecorded = false;    ///< its line of history is written, since its level was written last
  int recording = -1; ///< the second of the day in which the last run came to that line, when it ended there
};

struct StoppedInstance {
  std::string product; ///< "kyn"
  std::string name;
};

/// What a version file held when a run read it.
struct OldVersion {
  std::string level; ///< "06100000"
  std::vector<std::string> prereqs;
};

struct LogFacts {
  bool isInterrupted = false;                 ///< an installation did not end well
  std::optional<int> status;                  ///< of the last one, when it ended
  std::string user;                           ///< who ran it
  std::vector<PatchFacts> patches;            ///< in the order in which they were met
  std::vector<LogStep> steps;                 ///< of the last one
  std::set<std::string> replaced;             ///< paths whose old file was removed; absolute
  std::vector<std::string> directories;       ///< that were made; absolute
  std::vector<StoppedInstance> stopped;       ///< all those that a run has stopped
  std::map<std::string, OldVersion> versions; ///< before the first one, by path of the version file
  std::map<std::string, OldVersion> known; ///< as read last by any run, unless a patch has changed them since
};

/// Reads the whole log of a home. JudgementError when it cannot be read.
LogFacts readLogFacts(const Home &home);
