// Whether the process that wrote a run's lines still is at work.
#pragma once

#include <ctime>

/// Whether a process of this id runs that was there at `lastSign`, when the run last wrote to the log: an id
/// may have been given to another process since. A process of another host or container counts as gone.
bool isStillAtWork(long pid, std::time_t lastSign);
