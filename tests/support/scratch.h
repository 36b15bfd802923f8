// A private product home for one unit test: a temporary folder, published as QUILLHOME, with its own log.
#pragma once

#include <string>
#include <tuple>
#include <vector>

#include <gtest/gtest.h>

/// One line of the log without its time and source line; the level word is trimmed.
struct LogLine {
  std::string level;
  std::string component;
  std::string message;
};

bool operator==(const LogLine &a, const LogLine &b);
std::ostream &operator<<(std::ostream &out, const LogLine &line);

/// Fixture: a fresh home and log before each test, everything removed after it, the working directory, PATH
/// and the component registry put back.
class ScratchHome : public ::testing::Test {
public:
  /// The home, ending in "/".
  const std::string &home() const { return home_; }

  /// Writes a file under the home, making its directories; returns its path.
  std::string write(const std::string &relativePath, const std::string &content, unsigned mode = 0644) const;
  std::string makeDirectory(const std::string &relativePath) const;
  std::string read(const std::string &path) const;

  /// Everything logged since the last call (the header block, written at set-up, is left out).
  std::vector<LogLine> logLines();
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
  std::vector<int> sourceLines_;
};

/// Whether the tests run as root; a test that needs it starts with REQUIRE_ROOT().
bool runsAsRoot();
#define REQUIRE_ROOT()                                                                                       \
  if (!runsAsRoot())                                                                                         \
  GTEST_SKIP() << "needs root"

/// Shorthand for expectations: trace("file.cpp", "moveFile entry").
LogLine trace(const std::string &component, const std::string &message);
LogLine info(const std::string &component, const std::string &message);
LogLine error(const std::string &component, const std::string &message);
