// The runs of a whole log with what the history adds to them.
#pragma once

#include <cstdint>
#include <functional>
#include <string>
#include <vector>

#include "inputfile.h"
#include "rundate.h"
#include "runlog.h"

/// A run with its day.
struct DatedRun {
  LogRun run;
  RunDate date;
};

/// One run with all but its messages.
struct RunDetails {
  DatedRun dated;
  std::vector<LogStep> steps;
  std::vector<LogChild> children;
  std::uint64_t end = 0; ///< offset behind its last byte
};

/// Calls `visit` for each run of the log's first `size` bytes, in order. JudgementError when it cannot be
/// read.
void eachRun(const InputFile &log, std::uint64_t size, const RunDates &dates,
             const std::function<void(const DatedRun &)> &visit);

/// The run of a number, or the last one for `LastRun`. JudgementError when there is none.
constexpr std::size_t LastRun = static_cast<std::size_t>(-1);
RunDetails findRun(const InputFile &log, std::uint64_t size, const RunDates &dates, std::size_t number);

/// Calls `visit` for each message of a run that was found.
void eachMessage(const InputFile &log, const RunDetails &details,
                 const std::function<void(const LogMessage &)> &visit);
