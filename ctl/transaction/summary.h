// A transaction on a terminal: what will happen, and how it ended.
#pragma once

#include <cstdio>

#include "output.h"
#include "transaction/record.h"

/// Products with their levels, instances that will stop, files new and replaced.
void printPlan(const Record &record, FILE *stream);

/// The verdict, what stands against it, and where the record is.
void printRecord(const Record &record, const OutputOptions &options);
