#include "symboliclinks.h"

#include <memory>
#include <vector>

#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include "filedescriptor.h"
#include "heldfile.h"

namespace {

using Names = std::vector<std::string>;

constexpr int Reading = O_RDONLY | O_DIRECTORY | O_CLOEXEC;

struct CloseDirectory {
  void operator()(DIR *stream) const { closedir(stream); }
};

/// The entries of an open directory that are links, and those that are directories.
void list(int directory, Names &links, Names &subDirectories) {
  FileDescriptor again(openat(directory, ".", Reading));
  const std::unique_ptr<DIR, CloseDirectory> stream(fdopendir(again.get()));
  if (stream == nullptr)
    return;
  again.release(); // the stream closes it
  while (const dirent *const entry = readdir(stream.get())) {
    const std::string name = entry->d_name;
    struct stat status = {};
    if (name == "." || name == ".." || fstatat(directory, entry->d_name, &status, AT_SYMLINK_NOFOLLOW) != 0)
      continue;
    if (S_ISLNK(status.st_mode))
      links.push_back(name);
    else if (S_ISDIR(status.st_mode))
      subDirectories.push_back(name);
  }
}

/// One walk through a tree by its open directories. Only one is open at a time: a tree may be deeper than the
/// limits of descriptors and of paths.
class Sweep {
public:
  void run(const std::string &root);

private:
  /// A directory on the way down.
  struct Level {
    FileIdentity identity;
    mode_t mode;   ///< as it was found
    bool isOpened; ///< its owner lacked a permission
    Names subDirectories;
  };

  void enter(int directory, const std::string &name);
  void leave();

  FileDescriptor current_{-1};
  std::vector<Level> levels_;
};

void Sweep::run(const std::string &root) {
  enter(AT_FDCWD, root);
  while (!levels_.empty()) {
    Names &next = levels_.back().subDirectories;
    if (next.empty()) {
      leave();
      continue;
    }
    const std::string name = next.back();
    next.pop_back();
    enter(current_.get(), name);
  }
}

/// Enters a directory and removes its links. A directory that is closed to its owner is opened for that,
/// since the next archive would follow its links all the same.
void Sweep::enter(int directory, const std::string &name) {
  const HeldFile held(directory, name, HeldFile::Kind::Directory);
  struct stat status = {};
  if (!held.look(status))
    return;
  Level level = {identityOf(status), status.st_mode & 07777, false, {}};
  level.isOpened = (level.mode & 0700) != 0700 && held.setMode(level.mode | 0700);
  FileDescriptor entered(openat(directory, name.c_str(), Reading | O_NOFOLLOW));
  if (!entered.isOpen()) {
    if (level.isOpened)
      static_cast<void>(held.setMode(level.mode));
    return;
  }
  current_ = std::move(entered);
  Names links;
  list(current_.get(), links, level.subDirectories);
  for (const std::string &link : links)
    static_cast<void>(unlinkat(current_.get(), link.c_str(), 0));
  levels_.push_back(std::move(level));
}

/// Goes back to the directory above. When this one has been moved elsewhere, the walk ends.
void Sweep::leave() {
  const Level left = std::move(levels_.back());
  levels_.pop_back();
  FileDescriptor above(levels_.empty() ? -1 : openat(current_.get(), "..", Reading));
  if (left.isOpened)
    static_cast<void>(fchmod(current_.get(), left.mode));
  current_ = std::move(above);
  struct stat status = {};
  const bool isBack = levels_.empty() ||
                      (fstat(current_.get(), &status) == 0 && identityOf(status) == levels_.back().identity);
  if (!isBack)
    levels_.clear();
}

} // namespace

void removeSymbolicLinks(const std::string &path) {
  const std::string name = path.substr(0, path.find_last_not_of('/') + 1);
  struct stat status = {};
  if (lstat(name.c_str(), &status) != 0)
    return;
  if (S_ISLNK(status.st_mode))
    static_cast<void>(unlink(name.c_str()));
  else
    Sweep().run(name);
}
