// undo: a transaction taken back, to the byte.
#pragma once

#include <string>
#include <vector>

#include "home.h"
#include "transaction/record.h"

/// Stops the instances concerned, puts the files back, starts what ran before. True when nothing was left
/// undone; `messages` tells what was. May be repeated after any interruption.
bool takeBack(const Home &home, const std::string &folder, const Record &record,
              std::vector<std::string> &messages);

/// Takes a transaction back, the newest that is not undone when `id` is empty; the undo has a record of its
/// own. RefusalError for another one than the newest of a file, when another run is at work, or when there is
/// none.
Record undoTransaction(const Home &home, const std::string &id);

/// Takes back what a kill or a power failure has left in its middle, newest first: installations, and undos
/// that did not end. The ids of those that were taken back. RefusalError when an installation is still at
/// work.
std::vector<std::string> takeBackInterrupted(const Home &home);
