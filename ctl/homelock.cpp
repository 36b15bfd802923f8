#include "homelock.h"

#include <cerrno>
#include <cstring>

#include <fcntl.h>
#include <sys/file.h>

#include "judgement.h"

// The descriptor is closed on exec, so that no child keeps the lock alive.
HomeLock::HomeLock(const std::string &home) : directory_(home.c_str(), O_RDONLY | O_DIRECTORY) {
  if (!directory_.isOpen())
    throw JudgementError("cannot open " + home + ": " + strerror(errno));
  if (flock(directory_.get(), LOCK_EX | LOCK_NB) == 0)
    return;
  if (errno == EWOULDBLOCK)
    throw RefusalError("another transaction is at work on " + home);
  throw JudgementError("cannot lock " + home + ": " + strerror(errno));
}

bool isHomeLocked(const std::string &home) {
  const FileDescriptor directory(home.c_str(), O_RDONLY | O_DIRECTORY);
  if (directory.isOpen() && flock(directory.get(), LOCK_SH | LOCK_NB) == 0)
    return false;
  if (errno != EWOULDBLOCK)
    throw JudgementError("cannot look for a lock on " + home + ": " + strerror(errno));
  return true;
}
