// Running a program through runCommand with both of its streams captured.
#pragma once

#include <string>
#include <vector>

#include "process.h"

/// The null-terminated vector that runCommand takes, over words that it owns.
class ArgumentVector {
public:
  explicit ArgumentVector(std::vector<std::string> words) : words_(std::move(words)) {
    for (std::string &word : words_)
      pointers_.push_back(word.data());
    pointers_.push_back(nullptr);
  }
  ArgumentVector(const ArgumentVector &) = delete;
  ArgumentVector &operator=(const ArgumentVector &) = delete;

  char **get() { return pointers_.data(); }

private:
  std::vector<std::string> words_;
  std::vector<char *> pointers_;
};

struct CapturedRun {
  bool started = false;
  int rc = -1;
  std::string out;
  std::string err;
};

inline CapturedRun capture(std::vector<std::string> words) {
  ArgumentVector argv(std::move(words));
  CapturedRun result;
  result.started = runCommand(argv.get(), &result.rc, &result.out, &result.err);
  return result;
}

/// The same for a line of shell.
inline CapturedRun captureShell(const std::string &line) {
  return capture({"/bin/sh", "-c", line});
}
