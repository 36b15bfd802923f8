#include "scratch.h"

#include <algorithm>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <ostream>
#include <regex>
#include <sstream>
#include <tuple>

#include <sys/stat.h>
#include <unistd.h>

#include "logger.h"
#include "orvcomponentregistry.h"

namespace fs = std::filesystem;

namespace {

std::string valueOf(const char *variable) {
  const char *value = getenv(variable);
  return value == nullptr ? "" : value;
}

/// Gives back the permissions that a test took away; without them an ordinary user could not remove the tree.
void makeRemovable(const std::string &directory) {
  std::error_code ignored;
  fs::permissions(directory, fs::perms::owner_all, fs::perm_options::add, ignored);
  fs::recursive_directory_iterator entry(directory, ignored);
  for (; entry != fs::recursive_directory_iterator(); entry.increment(ignored))
    if (entry->is_directory(ignored) && !entry->is_symlink(ignored))
      fs::permissions(entry->path(), fs::perms::owner_all, fs::perm_options::add, ignored);
}

} // namespace

bool operator==(const LogLine &a, const LogLine &b) {
  return std::tie(a.level, a.component, a.message) == std::tie(b.level, b.component, b.message);
}

std::ostream &operator<<(std::ostream &out, const LogLine &line) {
  return out << line.level << " (" << line.component << ") [" << line.message << "]";
}

void ScratchHome::SetUp() {
  std::string pattern = fs::temp_directory_path().string() + "/orvpatch-unit-XXXXXX";
  ASSERT_NE(mkdtemp(pattern.data()), nullptr);
  home_ = pattern + "/";
  startDirectory_ = fs::current_path().string();
  fs::current_path("/"); // the checkout may lie where another user, whom a test may become, cannot return to
  startPath_ = valueOf("PATH");
  setenv("QUILLHOME", home_.c_str(), 1);
  unsetenv("PATCH_DEBUG");
  glbLogToSTDOUT = false;
  logInit();
  logOffset_ = read(glbLogFileName).size();
  startDescriptors_ = openDescriptors();
}

void ScratchHome::TearDown() {
  EXPECT_EQ(openDescriptors(), startDescriptors_) << "a descriptor was left open";
  glbLogToSTDOUT = false;
  glbLogFileName = "/dev/null"; // the registry logs, and the test may have made its log unwritable
  delete ORVComponentRegistry::getInstance();
  fs::current_path(startDirectory_);
  setenv("PATH", startPath_.c_str(), 1);
  makeRemovable(home_);
  std::error_code ignored;
  fs::remove_all(home_, ignored);
}

std::string ScratchHome::write(const std::string &relativePath, const std::string &content,
                               unsigned mode) const {
  const std::string path = home_ + relativePath;
  fs::create_directories(fs::path(path).parent_path());
  std::ofstream(path, std::ios::binary) << content;
  chmod(path.c_str(), mode);
  return path;
}

std::string ScratchHome::makeDirectory(const std::string &relativePath) const {
  fs::create_directories(home_ + relativePath);
  return home_ + relativePath;
}

std::string ScratchHome::read(const std::string &path) const {
  std::ifstream in(path, std::ios::binary);
  std::ostringstream content;
  content << in.rdbuf();
  return content.str();
}

LogLines ScratchHome::logLines() {
  static const std::regex prefix(R"(^(ERROR|INFO |TRACE) \d\d:\d\d:\d\d \(([^,]*),(\d+)\): )");
  const std::string all = read(glbLogFileName);
  std::istringstream text(all.substr(logOffset_));
  logOffset_ = all.size();
  sourceLines_.clear();
  LogLines lines;
  std::smatch match;
  for (std::string line; std::getline(text, line);) {
    if (std::regex_search(line, match, prefix)) {
      const std::string level = match[1];
      lines.push_back({level == "INFO " ? "INFO" : level, match[2], match.suffix()});
      sourceLines_.push_back(std::stoi(match[3]));
    } else if (!lines.empty()) {
      lines.back().message += "\n" + line; // a message of several lines
    }
  }
  return lines;
}

LogLines ScratchHome::logLinesOf(const std::string &component) {
  LogLines lines = logLines();
  lines.erase(std::remove_if(lines.begin(), lines.end(),
                             [&](const LogLine &line) { return line.component != component; }),
              lines.end());
  return lines;
}

bool runsAsRoot() {
  return geteuid() == 0;
}

LogLine trace(const std::string &component, const std::string &message) {
  return {"TRACE", component, message};
}
LogLine info(const std::string &component, const std::string &message) {
  return {"INFO", component, message};
}
LogLine error(const std::string &component, const std::string &message) {
  return {"ERROR", component, message};
}

LogLines framed(const LogLine &entry, const LogLines &between, const LogLine &exit) {
  LogLines lines = {entry};
  lines.insert(lines.end(), between.begin(), between.end());
  lines.push_back(exit);
  return lines;
}

LogLines withoutPointers(LogLines lines) {
  static const std::regex pointer(R"(\(0x[0-9a-f]+\))");
  for (LogLine &line : lines)
    line.message = std::regex_replace(line.message, pointer, "(buffer)");
  return lines;
}

bool isThere(const std::string &path) {
  return fs::exists(fs::symlink_status(path));
}

mode_t modeOf(const std::string &path) {
  struct stat status {};
  EXPECT_EQ(stat(path.c_str(), &status), 0) << path;
  return status.st_mode & 07777;
}

bool sameFile(const std::string &a, const std::string &b) {
  std::error_code ignored;
  return fs::equivalent(a, b, ignored);
}

std::size_t openDescriptors() {
  const fs::directory_iterator descriptors("/proc/self/fd");
  return static_cast<std::size_t>(std::distance(begin(descriptors), end(descriptors)));
}

UmaskScope::UmaskScope(mode_t mask) : before_(umask(mask)) {}
UmaskScope::~UmaskScope() {
  umask(before_);
}
