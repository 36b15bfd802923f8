#include "processes.h"

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <fstream>

#include <pwd.h>
#include <sys/stat.h>
#include <unistd.h>

#include "judgement.h"
#include "look.h"

namespace {

[[noreturn]] void cannotTell(const std::string &path) {
  throw JudgementError("cannot tell which installers run: " + path + ": " + strerror(errno));
}

/// A process that has ended meanwhile, or one that other users may not see.
bool hasEnded(int error) {
  return error == ENOENT || error == ESRCH || error == EACCES || error == EPERM;
}

std::vector<std::string> wordsOf(const std::string &pid) {
  std::ifstream file("/proc/" + pid + "/cmdline", std::ios::binary);
  if (!file && !hasEnded(errno))
    cannotTell("/proc/" + pid);
  std::vector<std::string> words;
  for (std::string word; std::getline(file, word, '\0');)
    words.push_back(word);
  if (file.bad() && !hasEnded(errno))
    cannotTell("/proc/" + pid);
  return words;
}

std::string baseName(const std::string &path) {
  return path.substr(path.rfind('/') + 1);
}

/// The place that a word of the process's command line names, seen from its working directory.
std::string placeOf(const std::string &pid, const std::string &path) {
  const std::string seen = path.empty() || path.front() != '/' ? "/proc/" + pid + "/cwd/" + path : path;
  char *const resolved = realpath(seen.c_str(), nullptr);
  if (resolved == nullptr && !hasEnded(errno) && errno != ENOTDIR && errno != ELOOP && errno != ENAMETOOLONG)
    cannotTell(seen);
  const std::string place = resolved == nullptr ? "" : resolved;
  free(resolved);
  return place;
}

/// The words from the installer's name on; an interpreter or emulator may stand before them.
bool isInstallerOn(const std::string &pid, const std::vector<std::string> &words, const std::string &home) {
  const auto program = std::find_if(words.begin(), words.end(),
                                    [](const std::string &word) { return baseName(word) == "orvpatch"; });
  if (words.end() - program != 5)
    return false;
  const auto option = std::find(program, words.end(), "-h");
  return option != words.end() && option + 1 != words.end() && placeOf(pid, *(option + 1)) == home;
}

std::string joined(const std::vector<std::string> &words) {
  std::string text;
  for (const std::string &word : words)
    text += (text.empty() ? "" : " ") + word;
  return text;
}

} // namespace

std::vector<std::string> installerRuns(const std::string &home) {
  std::vector<std::string> runs;
  const std::string place = placeOf("self", home);
  listDirectory("/proc", [&](const std::string &pid) {
    if (pid.find_first_not_of("0123456789") != std::string::npos || pid == std::to_string(getpid()))
      return;
    const std::vector<std::string> words = wordsOf(pid);
    if (isInstallerOn(pid, words, place))
      runs.push_back("process " + pid + ": " + joined(words));
  });
  return runs;
}

void demandNoRun(const std::string &home) {
  const std::vector<std::string> runs = installerRuns(home);
  if (!runs.empty())
    throw RefusalError("an installation is at work: " + runs.front());
}

bool ownerOf(const std::string &pid, uid_t &user) {
  struct stat status = {};
  if (pid.empty() || pid.find_first_not_of("0123456789") != std::string::npos ||
      stat(("/proc/" + pid).c_str(), &status) != 0)
    return false;
  user = status.st_uid;
  return true;
}

std::string loginName(uid_t user) {
  const passwd *const account = getpwuid(user);
  return account == nullptr ? std::to_string(user) : account->pw_name;
}
