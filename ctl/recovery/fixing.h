// What docs/recovery.md leaves to the administrator, done: owner and mode of files, directories that were
// left closed, empty version and result files, left-over directories, instances that do not run.
#pragma once

#include <string>
#include <vector>

#include "recovery/states.h"

/// Fixes what can be fixed, and marks it; `messages` tells why the rest cannot. A temporary directory stays
/// as long as it may hold the only copy of a file.
void fixStates(const Home &home, const Interruption &found, std::vector<HomeState> &states,
               std::vector<std::string> &messages);
