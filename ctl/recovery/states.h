// The states of a home after an installation that did not end: the table of docs/recovery.md, told from
// record, log and files.
#pragma once

#include <string>
#include <vector>

#include "home.h"
#include "recovery/interruption.h"

struct HomeState {
  std::string state; ///< its name in the table
  std::string path;  ///< relative to the home; of instances "kyn one"
  bool fixed = false;
};

/// Owner and mode that a file of a patch has to have.
struct Attributes {
  unsigned mode = 0755;
  std::int64_t user = -1; ///< -1: any
  std::int64_t group = -1;
};

/// By what stood there before; where that is not known, those that most of its neighbours have, without
/// set-id bits.
Attributes attributesFor(const Home &home, const Interruption &found, const InterruptedFile &file);

/// The file below updated_files of a temporary directory that is still there; empty when there is none.
std::string sourceOf(const Home &home, const InterruptedPatch &patch, const std::string &path);

/// The mode of the nearest directory above that was there before.
unsigned modeOfParent(const Home &home, const Interruption &found, const std::string &path);

/// Every state that holds, in the order of the table.
std::vector<HomeState> tellStates(const Home &home, const Interruption &found);
