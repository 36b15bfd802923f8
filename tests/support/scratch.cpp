#include "scratch.h"

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <ostream>
#include <regex>
#include <sstream>

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
  startPath_ = valueOf("PATH");
  setenv("QUILLHOME", home_.c_str(), 1);
  unsetenv("PATCH_DEBUG");
  glbLogToSTDOUT = false;
  logInit();
  logOffset_ = read(glbLogFileName).size();
}

void ScratchHome::TearDown() {
  delete ORVComponentRegistry::getInstance();
  fs::current_path(startDirectory_);
  setenv("PATH", startPath_.c_str(), 1);
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

std::vector<LogLine> ScratchHome::logLines() {
  static const std::regex prefix(R"(^(ERROR|INFO |TRACE) \d\d:\d\d:\d\d \(([^,]*),(\d+)\): )");
  const std::string all = read(glbLogFileName);
  std::istringstream text(all.substr(logOffset_));
  logOffset_ = all.size();
  sourceLines_.clear();
  std::vector<LogLine> lines;
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

bool runsAsRoot() { return geteuid() == 0; }

LogLine trace(const std::string &component, const std::string &message) {
  return {"TRACE", component, message};
}
LogLine info(const std::string &component, const std::string &message) {
  return {"INFO", component, message};
}
LogLine error(const std::string &component, const std::string &message) {
  return {"ERROR", component, message};
}
