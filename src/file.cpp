#include "file.h"

#include <algorithm>
#include <cerrno>
#include <cstring>

#include <dirent.h>
#include <sys/stat.h>
#include <unistd.h>

#include "logger.h"
#include "utilities.h"

#define LOG_COMPONENT "file.cpp"

namespace {

struct CloseDirectory {
  void operator()(DIR *stream) const { closedir(stream); }
};

bool isAccessible(const std::string &path) {
  return access(path.c_str(), F_OK) == 0;
}

bool endsInSlash(const std::string &path) {
  return !path.empty() && path.back() == '/';
}

/// Position of the last "/" before the final character.
std::size_t slashBeforeEnd(const std::string &path) {
  return path.size() < 2 ? std::string::npos : path.rfind('/', path.size() - 2);
}

/// What a file at its new place is to look like.
struct Attributes {
  mode_t mode = 0755;
  uid_t owner = static_cast<uid_t>(-1);
  gid_t group = static_cast<gid_t>(-1);
};

/// Removes what stands at the target and returns the attributes that the new file inherits from it. A stat
/// alone answers whether anything is there, in one call for each file of a patch; only when it fails for
/// another reason is the existence asked for.
Attributes clearTarget(const std::string &target) {
  Attributes attributes;
  struct stat status = {};
  if (stat(target.c_str(), &status) == 0) {
    attributes = {status.st_mode & 07777, status.st_uid, status.st_gid};
  } else {
    const int error = errno;
    if (error == ENOENT || !isAccessible(target))
      return attributes;
    LOG_TRACE("Unable to lookup file permissions: %s", strerror(error));
  }
  LOG_TRACE("deleting existing target: %s", target.c_str());
  // When the old file stays, the link finds the name taken and says so.
  static_cast<void>(unlink(target.c_str()));
  return attributes;
}

/// Makes one directory with all permissions, whatever the umask.
bool makeOpenDirectory(const std::string &path) {
  LOG_TRACE("creating dir: %s", path.c_str());
  if (mkdir(path.c_str(), 0777) != 0)
    return false;
  struct stat status = {};
  if (stat(path.c_str(), &status) == 0)
    static_cast<void>(chmod(path.c_str(), (status.st_mode & 07777) | 0777));
  return true;
}

/// Whether the directory's own name, without the "/" at its end, is a symbolic link.
bool isLink(const File &directory) {
  std::string path = directory.getPath();
  if (endsInSlash(path))
    path.pop_back();
  struct stat status = {};
  return lstat(path.c_str(), &status) == 0 && S_ISLNK(status.st_mode);
}

bool deleteFiles(File &directory) {
  bool allGone = true;
  for (File *file : *directory.listFiles()) {
    if (file->deleteFile())
      continue;
    LOG_TRACE("Unable to delete file: %s", file->getPath().c_str());
    allGone = false;
  }
  return allGone;
}

bool deleteSubDirectories(File &directory) {
  bool allGone = true;
  for (File *subDirectory : *directory.listSubDirectories())
    allGone = recursiveDelete(subDirectory) && allGone;
  return allGone;
}

std::unique_ptr<OwnedList<File>> copyOf(const std::unique_ptr<OwnedList<File>> &list) {
  if (list == nullptr)
    return nullptr;
  auto copy = std::make_unique<OwnedList<File>>();
  for (const File *file : *list->items())
    copy->append(std::make_unique<File>(*file));
  return copy;
}

} // namespace

File::File(const std::string &path) : path_(path) {
  initialize();
}

File::File(const File &directory, const std::string &name) : path_(directory.path_ + name) {
  initialize();
}

File::File(const File &other)
    : path_(other.path_), exists_(other.exists_), isFile_(other.isFile_), isDirectory_(other.isDirectory_),
      lastModification_(other.lastModification_), size_(other.size_), files_(copyOf(other.files_)),
      subDirectories_(copyOf(other.subDirectories_)) {}

void File::initialize() {
  lastModification_ = 0;
  size_ = 0;
  files_.reset();
  subDirectories_.reset();

  // KEEP(root-unknown): exactly one "/" is left out for the look, so the root directory itself, whose name is
  // then empty, does not exist for this class.
  const bool slash = endsInSlash(path_);
  struct stat status = {};
  // Two pointers: of two strings the conditional would make a copy, for every file.
  if (stat(slash ? path_.substr(0, path_.size() - 1).c_str() : path_.c_str(), &status) != 0) {
    const int error = errno;
    if (error != ENOENT && error != ENOTDIR)
      LOG_ERROR("Unable to determine file/directory for path: %s. %s", path_.c_str(), strerror(error));
    exists_ = isFile_ = isDirectory_ = false;
    return;
  }
  isDirectory_ = S_ISDIR(status.st_mode);
  isFile_ = !isDirectory_;
  // What can be looked at is accessible too, unless the "/" that was left out asks for a directory. A call of
  // access for each snapshot would only repeat that, at a twentieth of a large installation's time.
  exists_ = isDirectory_ || !slash;
  lastModification_ = static_cast<std::int32_t>(status.st_mtime);
  size_ = static_cast<std::int32_t>(status.st_size);
  if (isDirectory_ && !slash)
    path_ += '/';
}

bool File::isAbsolute() const {
  return !path_.empty() && path_.front() == '/';
}

std::string File::getAbsolutePath() const {
  return isAbsolute() ? path_ : getAbsolutePath(Util::getCurrentDirectory());
}

std::string File::getAbsolutePath(const std::string &workingDirectory) const {
  if (isAbsolute())
    return path_;
  return workingDirectory + (endsInSlash(workingDirectory) ? "" : "/") + path_;
}

std::string File::getParentPath() const {
  if (!isDirectory_)
    return path_.substr(0, path_.rfind('/') + 1);
  const std::size_t slash = slashBeforeEnd(path_);
  return slash == std::string::npos ? path_ : path_.substr(0, slash + 1);
}

std::string File::getName() const {
  if (isDirectory_) {
    const std::size_t slash = slashBeforeEnd(path_);
    return slash == std::string::npos ? path_ : path_.substr(slash + 1, path_.size() - slash - 2);
  }
  return endsInSlash(path_) ? path_ : path_.substr(path_.rfind('/') + 1);
}

bool File::deleteFile() {
  if (!exists_ || !isFile_)
    return false;
  const int result = unlink(path_.c_str());
  if (result != 0) {
    // KEEP(delete-error-text): the text is that of unlink's result, not of the error number.
    LOG_TRACE("Unable to delete file [%s]: %s", path_.c_str(), strerror(result));
  }
  // KEEP(delete-inverted-exists): the flag says the opposite of what is left on disk; nobody asks it after a
  // deletion.
  exists_ = result == 0;
  return result == 0;
}

bool File::moveFile(const std::string &target, bool overwrite) {
  LOG_TRACE("moveFile %s", "entry");
  const int status = moveTo(target, overwrite);
  LOG_TRACE("moveFile %s", "exit");
  return status == 0;
}

/// Moves the file; 0 or the number of the error that makes the move a failure.
int File::moveTo(const std::string &target, bool overwrite) {
  if (!isFile_ || !exists_) {
    // KEEP(move-missing-source): a source that is not there counts as moved, unlike in copyFile: a rerun
    // meets the files that an interrupted run has moved already.
    LOG_TRACE("%s does not exist or is not a file", path_.c_str());
    return 0;
  }
  const Attributes attributes = overwrite ? clearTarget(target) : Attributes();
  int error = 0;
  if (link(path_.c_str(), target.c_str()) != 0) {
    error = errno;
    LOG_TRACE("unable to link: %s to %s. %s", path_.c_str(), target.c_str(), strerror(error));
    return error;
  }
  if (unlink(path_.c_str()) != 0) {
    error = errno;
    LOG_TRACE("unable to unlink: %s. %s", path_.c_str(), strerror(error));
    return error;
  }
  path_ = target;
  if (chown(target.c_str(), attributes.owner, attributes.group) != 0) {
    error = errno;
    LOG_TRACE("unable to chown for file: %s", target.c_str());
    return error;
  }
  // KEEP(chmod-ignored): a wrong mode, unlike a wrong owner, leaves the move a success.
  if (chmod(target.c_str(), attributes.mode) != 0)
    LOG_TRACE("unable to chmod for file: %s", target.c_str());
  return 0;
}

bool File::copyFile(const std::string &target, bool keepExisting) {
  LOG_TRACE("copyFile %s", "entry");
  const bool linked = linkTo(target, keepExisting);
  LOG_TRACE("copyFile %s", "exit");
  return linked;
}

bool File::linkTo(const std::string &target, bool keepExisting) const {
  if (!isFile_ || !exists_) {
    LOG_TRACE("%s does not exist or is not a file", path_.c_str());
    return false;
  }
  // KEEP(copy-flag-sense): the flag has the opposite sense of moveFile's: true keeps an existing target, and
  // the link then fails.
  if (!keepExisting && isAccessible(target)) {
    LOG_TRACE("deleting existing target: %s", target.c_str());
    const int result = unlink(target.c_str());
    if (result != 0)
      LOG_TRACE("Unable to delete file [%s]: %s", target.c_str(), strerror(result));
  }
  if (link(path_.c_str(), target.c_str()) != 0) {
    const int error = errno;
    LOG_TRACE("unable to link: %s to %s. %s", path_.c_str(), target.c_str(), strerror(error));
    return false;
  }
  LOG_TRACE("Successful copy of: %s to %s.", path_.c_str(), target.c_str());
  return true;
}

bool File::mkdir() {
  LOG_TRACE("File::mkdir %s", "entry");
  if (makeMissingDirectories()) {
    if (!endsInSlash(path_))
      path_ += '/';
    isDirectory_ = true;
    exists_ = true;
  }
  // KEEP(mkdir-known-existence): the result is what the object knows: one that existed before stays true even
  // when nothing could be made.
  LOG_TRACE("File::mkdir = %d", exists_);
  return exists_;
}

bool File::makeMissingDirectories() const {
  std::vector<std::string> prefixes;
  std::string prefix = isAbsolute() ? "/" : "";
  for (const std::string &component : Util::tokenizeString(path_, "/")) {
    prefix += component + "/";
    prefixes.push_back(prefix);
  }
  // What is accessible has accessible ancestors: looking from the end asks once for most directories, where
  // looking from the start would ask for every ancestor of each directory of a deep tree again.
  const auto missing = std::find_if(prefixes.rbegin(), prefixes.rend(), isAccessible).base();
  return std::all_of(missing, prefixes.end(), makeOpenDirectory);
}

bool File::rmdir() {
  LOG_TRACE("File::rmdir %s", "entry");
  if (!isDirectory_) {
    LOG_TRACE("%s is not a directory", path_.c_str());
    return false;
  }
  const bool removed = recursiveDelete(this);
  if (removed)
    exists_ = false;
  LOG_TRACE("File::rmdir =%d", removed);
  return removed;
}

std::vector<File *> *File::listFiles() {
  if (files_ == nullptr)
    loadDir();
  return files_->items();
}

std::vector<File *> *File::listSubDirectories() {
  if (subDirectories_ == nullptr)
    loadDir();
  return subDirectories_->items();
}

void File::loadDir() {
  LOG_TRACE("loadDir() %s", "entry");
  files_ = std::make_unique<OwnedList<File>>();
  subDirectories_ = std::make_unique<OwnedList<File>>();
  if (!isDirectory_ || !exists_)
    return;
  const std::unique_ptr<DIR, CloseDirectory> stream(opendir(path_.c_str()));
  if (stream == nullptr)
    return;
  errno = 0; // readdir tells its end from a failure by this alone
  while (const dirent *const entry = readdir(stream.get())) {
    appendEntry(entry->d_name);
    errno = 0;
  }
  const int error = errno;
  if (error != 0)
    LOG_ERROR("Error from readdir: %s", strerror(error));
  LOG_TRACE("loadDir() %s", "exit");
}

void File::appendEntry(const std::string &name) {
  if (name == "." || name == "..")
    return;
  auto entry = std::make_unique<File>(*this, name);
  (entry->isDirectory_ ? subDirectories_ : files_)->append(std::move(entry));
}

bool recursiveDelete(File *directory) {
  // A link that somebody planted in the tree must not empty a foreign directory: it goes straight to rmdir,
  // which refuses it.
  if (!isLink(*directory) && !(deleteFiles(*directory) && deleteSubDirectories(*directory)))
    return false;
  const std::string path = directory->getAbsolutePath();
  if (rmdir(path.c_str()) != 0) {
    const int error = errno;
    LOG_TRACE("Unable to delete directory [%s]: rc = %d, %s", path.c_str(), error, strerror(error));
    return false;
  }
  return true;
}
