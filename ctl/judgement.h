// The exceptions of this program: something cannot be judged (status 2), or is refused (status 1). A command
// throws them before it has written anything to standard output; the application prints them.
#pragma once

#include <stdexcept>

class JudgementError : public std::runtime_error {
public:
  using std::runtime_error::runtime_error;
};

/// A command refuses before it has changed anything: status 1.
class RefusalError : public std::runtime_error {
public:
  using std::runtime_error::runtime_error;
};
