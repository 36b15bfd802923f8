#include "look.h"

#include <cerrno>
#include <cstring>
#include <memory>

#include <dirent.h>
#include <fcntl.h>

#include "judgement.h"

namespace {

struct CloseDirectory {
  void operator()(DIR *directory) const { closedir(directory); }
};

bool isAbsence(int error) {
  return error == ENOENT || error == ENOTDIR || error == ELOOP || error == ENAMETOOLONG;
}

std::optional<struct stat> look(const std::string &path, int flags) {
  struct stat status = {};
  if (fstatat(AT_FDCWD, path.c_str(), &status, flags) == 0)
    return status;
  if (isAbsence(errno))
    return std::nullopt;
  throw JudgementError("cannot look at " + path + ": " + strerror(errno));
}

} // namespace

std::optional<struct stat> lookAt(const std::string &path) {
  return look(path, AT_SYMLINK_NOFOLLOW);
}

std::optional<struct stat> lookBehind(const std::string &path) {
  return look(path, 0);
}

bool isDirectory(const std::string &path) {
  const std::optional<struct stat> status = lookBehind(path);
  return status && S_ISDIR(status->st_mode);
}

bool listDirectory(const std::string &path, const std::function<void(const std::string &name)> &each) {
  const std::unique_ptr<DIR, CloseDirectory> directory(opendir(path.c_str()));
  if (directory == nullptr) {
    if (isAbsence(errno))
      return false;
    throw JudgementError("cannot read " + path + ": " + strerror(errno));
  }
  errno = 0; // only this tells the end from a failure
  while (const dirent *const entry = readdir(directory.get())) {
    const std::string name = entry->d_name;
    if (name != "." && name != "..")
      each(name);
    errno = 0;
  }
  if (errno != 0)
    throw JudgementError("cannot read " + path + ": " + strerror(errno));
  return true;
}
