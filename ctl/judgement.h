// The one exception of this program: something cannot be judged. The application prints it and ends with
// status 2; a command throws it before it has written anything to standard output.
#pragma once

#include <stdexcept>

class JudgementError : public std::runtime_error {
public:
  using std::runtime_error::runtime_error;
};
