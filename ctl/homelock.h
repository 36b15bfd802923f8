// The lock of a home: it leaves no file, is held by this process alone, and dies with it.
#pragma once

#include <string>

#include "filedescriptor.h"

class HomeLock {
public:
  /// Takes the lock of the home's directory. RefusalError when another process holds it; JudgementError when
  /// the home cannot be opened.
  explicit HomeLock(const std::string &home);

private:
  FileDescriptor directory_;
};

/// Whether a process holds the lock now.
bool isHomeLocked(const std::string &home);
