// Runs of the log as documents and on the terminal.
#pragma once

#include <string>
#include <vector>

#include <nlohmann/json_fwd.hpp>

#include "runscan.h"

/// The fields of a run that a list shows.
nlohmann::ordered_json runDocument(const DatedRun &dated);
nlohmann::ordered_json stepDocument(const LogStep &step);
nlohmann::ordered_json childDocument(const LogChild &child);
nlohmann::ordered_json messageDocument(const LogMessage &message);

/// Columns of a list of runs, and a run's cells.
std::vector<std::string> runHeading();
std::vector<std::string> runCells(const DatedRun &dated);

/// Some lines about one run, its steps, the programs that it started, one of its messages.
void printRun(const DatedRun &dated);
void printSteps(const std::vector<LogStep> &steps);
void printChildren(const std::vector<LogChild> &children);
void printMessage(const LogMessage &message, const std::string &indent);

/// "passed", "failed" or "open".
const char *resultName(StepResult result);
