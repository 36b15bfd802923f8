// A private product home for one unit test: a temporary folder, published as QUILLHOME, with its own log.
#pragma once

#include <iosfwd>
#include <string>
#include <vector>

#include <gtest/gtest.h>
#include <sys/types.h>

/// One line of the log without its time and source line; the level word is trimmed.
struct LogLine {
  std::string level;
  std::string component;
  std::string message;
};
using LogLines = std::vector<LogLine>;

bool operator==(const LogLine &a, const LogLine &b);
std::ostream &operator<<(std::ostream &out, const LogLine &line);

/// Fixture: a fresh home and log before each test, everything removed after it, the working directory, PATH
/// and the component registry put back. A test that leaves a descriptor open fails.
class ScratchHome : public ::testing::Test {
public:
  /// The home, ending in "/".
  const std::string &home() const { return home_; }

  /// Writes a file under the home, making its directories; returns its path.
  std::string write(const std::string &relativePath, const std::string &content, unsigned mode = 0644) const;
  std::string makeDirectory(const std::string &relativePath) const;
  std::string read(const std::string &path) const;

  /// Everything logged since the last call (the header block, written at set-up, is left out).
  LogLines logLines();
  /// The same, but only what this component logged.
  LogLines logLinesOf(const std::string &component);
  /// Source line numbers of the lines that the last logLines() returned.
  const std::vector<int> &sourceLines() const { return sourceLines_; }

protected:
  void SetUp() override;
  void TearDown() override;

private:
  std::string home_;
  std::string startDirectory_;
  std::string startPath_;
  std::size_t logOffset_ = 0;
  std::size_t startDescriptors_ = 0;
  std::vector<int> sourceLines_;
};

/// Whether the tests run as root; a test that needs it starts with REQUIRE_ROOT(), one in which permissions
/// must bind with REQUIRE_ORDINARY_USER().
bool runsAsRoot();
#define REQUIRE_ROOT()                                                                                       \
  if (!runsAsRoot())                                                                                         \
  GTEST_SKIP() << "needs root: run the tests as root too"
#define REQUIRE_ORDINARY_USER()                                                                              \
  if (runsAsRoot())                                                                                          \
  GTEST_SKIP() << "needs an ordinary user: permissions do not bind root"

/// Shorthand for expectations: trace("file.cpp", "moveFile entry").
LogLine trace(const std::string &component, const std::string &message);
LogLine info(const std::string &component, const std::string &message);
LogLine error(const std::string &component, const std::string &message);

/// The lines of an operation: its entry, what it logs between, its exit.
LogLines framed(const LogLine &entry, const LogLines &between, const LogLine &exit);

/// The lines with every pointer value written as "(buffer)", since addresses vary.
LogLines withoutPointers(LogLines lines);

/// What is at `path` itself, without following a link.
bool isThere(const std::string &path);
/// The twelve permission bits of what `path` leads to.
mode_t modeOf(const std::string &path);
/// The two names lead to one file.
bool sameFile(const std::string &a, const std::string &b);

/// The number of descriptors that this process has open.
std::size_t openDescriptors();

/// Another file creation mask during a scope.
class UmaskScope {
public:
  explicit UmaskScope(mode_t mask);
  UmaskScope(const UmaskScope &) = delete;
  UmaskScope &operator=(const UmaskScope &) = delete;
  ~UmaskScope();

private:
  mode_t before_;
};
