// The lock of a home: it leaves no file, is held by this process alone, and dies with it.
#pragma once

#include <string>

#include "filedescriptor.h"

class HomeLock {
public:
  /// Takes the lock of the home's directory. JudgementError when the home cannot be opened.
  explicit HomeLock(const std::string &home);
  /// False when another process holds it.
  bool isHeld() const { return held_; }

private:
  FileDescriptor directory_;
  bool held_;
};

/// Whether a process holds the lock now.
bool isHomeLocked(const std::string &home);
