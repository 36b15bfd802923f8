#include "utilities.h"

#include <algorithm>
#include <cctype>
#include <cerrno>
#include <climits>
#include <cstdlib>
#include <cstring>
#include <deque>
#include <memory>

#include <fcntl.h>
#include <pwd.h>
#include <sys/stat.h>
#include <sys/utsname.h>
#include <unistd.h>

#include "filedescriptor.h"
#include "logger.h"
#include "process.h"

#define LOG_COMPONENT "utilities.cpp"

namespace {

/// The status of a process that ends for want of memory.
enum ExitStatus { OutOfMemory = 71 };

/// Fills `buffer` up to the end of the file; the number of bytes read, or -1 with the reason in errno.
ssize_t readUpTo(const FileDescriptor &file, char *buffer, std::size_t size) {
  std::size_t filled = 0;
  while (filled < size) {
    const ssize_t count = file.read(buffer + filled, size - filled);
    if (count < 0)
      return -1;
    if (count == 0)
      break;
    filled += static_cast<std::size_t>(count);
  }
  return static_cast<ssize_t>(filled);
}

/// The whole content of an open file as a new NUL-terminated buffer; 0 or an error number.
int readContent(const FileDescriptor &file, const char *name, char **buffer) {
  const off_t size = lseek(file.get(), 0, SEEK_END);
  // KEEP(size-limit): a file from the limit of a 32-bit size on is refused; nothing that the product reads
  // whole comes near it.
  if (size < 0 || size >= INT_MAX || lseek(file.get(), 0, SEEK_SET) != 0)
    return EINVAL;
  const auto capacity = static_cast<std::size_t>(size);
  std::unique_ptr<char, decltype(&free)> content(static_cast<char *>(malloc(capacity + 1)), &free);
  if (content == nullptr) {
    LOG_ERROR("Unable to allocate file buffer: %s", name);
    return EINVAL;
  }
  const ssize_t count = readUpTo(file, content.get(), capacity);
  if (count < 0)
    return errno; // a part of a file is not the file, and must not be written back
  content.get()[count] = '\0';
  *buffer = content.release();
  return 0;
}

int readRegularFile(const char *name, char **buffer) {
  struct stat status = {};
  if (name == nullptr) {
    LOG_ERROR("filename omitted");
    return EINVAL;
  }
  if (stat(name, &status) != 0) {
    const int error = errno;
    LOG_ERROR("unable to stat file: %s", name);
    return error != 0 ? error : EINVAL;
  }
  if (S_ISDIR(status.st_mode)) {
    LOG_TRACE("Directory specified instead of a file: %s", name);
    return EINVAL;
  }
  // A pipe or device has no size to seek to, and opening one may wait for ever.
  if (!S_ISREG(status.st_mode)) {
    LOG_TRACE("Special file specified instead of a file: %s", name);
    return EINVAL;
  }
  const FileDescriptor file(name, O_RDONLY);
  if (!file.isOpen()) {
    LOG_ERROR("unable to open file: %s", name);
    return EINVAL;
  }
  return readContent(file, name, buffer);
}

} // namespace

std::string Util::getQuillHome() {
  const char *const home = getenv("QUILLHOME");
  return home == nullptr ? "" : home;
}

std::string Util::getHostName() {
  utsname host = {};
  if (uname(&host) != 0)
    return "";
  const std::string node = host.nodename;
  return node.substr(0, node.find('.'));
}

std::string Util::getUserName() {
  const passwd *const user = getpwuid(getuid());
  return user == nullptr ? "" : user->pw_name;
}

void Util::trimString(std::string &s) {
  static const char *const whiteSpace = "\r\n\t ";
  s.erase(s.find_last_not_of(whiteSpace) + 1);
  s.erase(0, s.find_first_not_of(whiteSpace));
}

std::vector<std::string> Util::tokenizeString(const std::string &s, const char *delimiters) {
  std::vector<std::string> tokens;
  const char *rest = s.c_str();
  while (*(rest += strspn(rest, delimiters)) != '\0') {
    const std::size_t length = strcspn(rest, delimiters);
    tokens.emplace_back(rest, length);
    rest += length;
  }
  return tokens;
}

std::string Util::removeDotFromPath(const std::string &path) {
  std::string result = path;
  const std::size_t dot = result.find("/./");
  if (dot != std::string::npos)
    result.erase(dot, 2);
  return result;
}

std::string Util::toLower(const std::string &s) {
  std::string lower = s;
  std::transform(lower.begin(), lower.end(), lower.begin(),
                 [](unsigned char c) { return static_cast<char>(std::tolower(c)); });
  return lower;
}

std::string Util::normalizeProductCode(const std::string &code) {
  const std::string lower = toLower(code);
  return lower.size() == 2 ? "k" + lower : lower;
}

bool Util::pathExists(const std::string &path) {
  LOG_TRACE("Util::pathExists(%s) %s", path.c_str(), "entry");
  const bool found = access(path.c_str(), F_OK) == 0;
  if (!found)
    LOG_TRACE("Path does not exist: %s", path.c_str());
  LOG_TRACE("Util::pathExists(%s) %s", path.c_str(), "exit");
  return found;
}

std::string Util::getTempDir(const std::string &name) {
  return getQuillHome() + "tmp/" + name;
}

std::string Util::getCurrentDirectory() {
  char buffer[4096];
  return getcwd(buffer, sizeof buffer) == nullptr ? "" : buffer;
}

bool Util::setCurrentDirectory(const std::string &dir) {
  return chdir(dir.c_str()) == 0;
}

int Util::readFile(const char *name, char **buffer) {
  const char *const shownName = name == nullptr ? "(null)" : name;
  LOG_TRACE("Util::readFile(%s) %s", shownName, "entry");
  *buffer = nullptr;
  const int result = readRegularFile(name, buffer);
  LOG_TRACE("Util::readFile(%s)=%d(%p) %s", shownName, result, static_cast<void *>(*buffer), "exit");
  return result;
}

int Util::readFileByLines(const char *name, std::vector<std::string> &lines) {
  LOG_TRACE("Util::readFileByLines(%s) %s", name == nullptr ? "(null)" : name, "entry");
  lines.clear();
  char *content = nullptr;
  const int result = readFile(name, &content);
  if (result != 0)
    return result;
  const std::unique_ptr<char, decltype(&free)> owner(content, &free);
  const char *start = content;
  for (const char *end = strchr(start, '\n'); end != nullptr; end = strchr(start, '\n')) {
    const char *const textEnd = end > start && end[-1] == '\r' ? end - 1 : end;
    if (textEnd > start)
      lines.emplace_back(start, textEnd);
    start = end + 1;
  }
  // KEEP(final-empty-line): what follows the last line end counts as a line even when it is empty; the
  // version file's rewriting relies on it.
  lines.emplace_back(start);
  LOG_TRACE("Util::readFileByLines(%s) %s", name, "exit");
  return 0;
}

void Util::setEnvironment(const std::string &name, const std::string &value) {
  // The environment points at the strings to the end of the process, so they are never released; kept here,
  // replaced ones stay reachable for leak checkers.
  static auto *const strings = new std::deque<std::string>; // GCOVR_EXCL_BR_LINE: there is one thread
  strings->push_back(name + "=" + value);
  // Its only failure is want of memory, and with the old home or search path the wrong files would be used.
  if (putenv(strings->back().data()) != 0) // GCOVR_EXCL_BR_LINE: a process without memory leaves no counts
    endWithoutMemory();                    // GCOVR_EXCL_LINE: the same
}

// GCOVR_EXCL_START: _exit leaves no counts; tests/faults/test_conditions.py lets the memory run out.
void Util::endWithoutMemory() {
  static constexpr char message[] = "orvpatch: out of memory\n";
  static_cast<void>(!write(STDERR_FILENO, message, sizeof message - 1));
  _exit(OutOfMemory);
}
// GCOVR_EXCL_STOP

bool Util::isVEMSInstalled() {
  return pathExists(getQuillHome() + "config/.ConfigData/kqaenv");
}

bool Util::isVEPSInstalled(std::string arch) {
  return pathExists(getQuillHome() + "registry/pt" + arch + ".ver");
}

bool Util::isVEPDInstalled(std::string arch) {
  return pathExists(getQuillHome() + "registry/dk" + arch + ".ver");
}

bool Util::isManageGUIRunning() {
  const std::string command = "ps -ef | grep -v grep | grep -c " + getQuillHome() + "classes/wbt.jar";
  CommandResult grep;
  const bool ran = runCommand({"/bin/sh", "-c", command}, grep);
  if (!ran || grep.rc != 0)
    return false;
  const std::vector<std::string> lines = tokenizeString(grep.out, "\n\r");
  return lines.size() == 1 && atoi(lines.front().c_str()) != 0;
}
