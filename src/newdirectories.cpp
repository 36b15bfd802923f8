#include "newdirectories.h"

#include <algorithm>

#include <sys/stat.h>
#include <unistd.h>

namespace {

/// A directory that mkdir has just made belongs to the effective user and is closed to all others.
bool isOwn(const struct stat &status) {
  return S_ISDIR(status.st_mode) && status.st_uid == geteuid() && (status.st_mode & 077) == 0;
}

} // namespace

bool NewDirectories::make(const std::string &path) {
  if (mkdir(path.c_str(), 0700) != 0)
    return false;
  const std::string name = path.substr(0, path.find_last_not_of('/') + 1);
  struct stat status = {};
  if (lstat(name.c_str(), &status) != 0 || !isOwn(status))
    return true; // it exists, but cannot be opened safely
  made_.push_back({name, identityOf(status)});
  // The umask may have removed permissions of the owner.
  if ((status.st_mode & 0700) != 0700) {
    const HeldFile directory(name, HeldFile::Kind::Directory);
    struct stat held = {};
    if (directory.look(held) && identityOf(held) == identityOf(status)) // GCOVR_EXCL_BR_LINE: an exchange
      static_cast<void>(directory.setMode((held.st_mode & 07777) | 0700));
  }
  return true;
}

void NewDirectories::openToAll(const Directory &directory) {
  const HeldFile held(directory.path, HeldFile::Kind::Directory);
  struct stat status = {};
  if (held.look(status) && isOwn(status) && identityOf(status) == directory.identity)
    static_cast<void>(held.setMode((status.st_mode & 07777) | 0777));
}

NewDirectories::~NewDirectories() {
  std::for_each(made_.rbegin(), made_.rend(), openToAll);
}
