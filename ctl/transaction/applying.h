// apply: an installation as a transaction, with everything saved before the first change.
#pragma once

#include <cstddef>
#include <functional>
#include <string>

#include "check/hostreport.h"
#include "home.h"
#include "transaction/record.h"

struct ApplyOptions {
  CheckOptions check;
  bool undoOnFailure = false;
  bool dryRun = false;
  std::size_t keep = 5;
};

/// What the transaction asks of its caller.
struct ApplyDialogue {
  std::function<bool(const Record &)> agree; ///< shown what will happen; false: nothing is to be done
  std::function<void(const std::string &step)> begins; ///< a step begins
};

/// Runs the whole transaction. The record's verdict says how it ended; a refusal has changed nothing and
/// leaves no folder behind. JudgementError and RefusalError end it before the first change.
Record applyPatches(const Home &home, const std::string &path, const ApplyOptions &options,
                    const ApplyDialogue &dialogue);

/// The exit status of a verdict.
int statusOf(const Record &record);
