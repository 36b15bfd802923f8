#include "file.h"

#include <algorithm>
#include <cerrno>
#include <cstring>

#include <dirent.h>
#include <sys/stat.h>
#include <unistd.h>

#include "heldfile.h"
#include "logger.h"
#include "newdirectories.h"
#include "symboliclinks.h"
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

/// Owner, group and mode of a file at its new place.
struct Attributes {
  mode_t mode = 0755;
  uid_t owner = static_cast<uid_t>(-1);
  gid_t group = static_cast<gid_t>(-1);
};

/// The attributes of the target, in one call for each file of a patch. A link is followed, but the set-id
/// bits of its destination are not taken over: the maker of the link chose them.
bool lookUp(const std::string &target, Attributes &attributes) {
  struct stat status = {};
  if (lstat(target.c_str(), &status) != 0)
    return false;
  mode_t inherited = 07777;
  if (S_ISLNK(status.st_mode)) {
    inherited = 01777;
    if (stat(target.c_str(), &status) != 0)
      return false;
  }
  attributes = {status.st_mode & inherited, status.st_uid, status.st_gid};
  return true;
}

/// Removes the target and returns the attributes that the new file inherits from it. Its existence is checked
/// only when they cannot be looked up for another reason than its absence.
Attributes clearTarget(const std::string &target) {
  Attributes attributes;
  if (!lookUp(target, attributes)) {
    const int error = errno;
    if (error == ENOENT || !isAccessible(target))
      return attributes;
    LOG_TRACE("Unable to lookup file permissions: %s", strerror(error));
  }
  LOG_TRACE("deleting existing target: %s", target.c_str());
  // When the old file stays, the link fails and reports that the name is taken.
  static_cast<void>(unlink(target.c_str()));
  return attributes;
}

/// Sets owner and mode; an error number, or 0. The mode is set after the owner, since a change of owner
/// removes set-id bits, and only if the owner could be set.
struct Outcome {
  int owner = 0;
  int mode = 0;
};

Outcome setAttributes(const HeldFile &file, const Attributes &attributes) {
  if (!file.setOwner(attributes.owner, attributes.group))
    return {errno, 0};
  return {0, file.setMode(attributes.mode) ? 0 : errno};
}

Outcome setAttributes(const std::string &path, const Attributes &attributes) {
  if (chown(path.c_str(), attributes.owner, attributes.group) != 0)
    return {errno, 0};
  return {0, chmod(path.c_str(), attributes.mode) == 0 ? 0 : errno};
}

bool makeDirectory(const std::string &path, NewDirectories &made) {
  LOG_TRACE("creating dir: %s", path.c_str());
  return made.make(path);
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
      isRegular_(other.isRegular_), lastModification_(other.lastModification_), size_(other.size_),
      files_(copyOf(other.files_)), subDirectories_(copyOf(other.subDirectories_)) {}

void File::initialize() {
  lastModification_ = 0;
  size_ = 0;
  files_.reset();
  subDirectories_.reset();

  // KEEP(root-unknown): exactly one "/" is left out for the look, so the root directory itself, whose name is
  // then empty, does not exist for this class.
  const bool slash = endsInSlash(path_);
  struct stat status = {};
  const std::string name = slash ? path_.substr(0, path_.size() - 1) : path_;
  if (stat(name.c_str(), &status) != 0) {
    const int error = errno;
    if (error != ENOENT && error != ENOTDIR)
      LOG_ERROR("Unable to determine file/directory for path: %s. %s", path_.c_str(), strerror(error));
    exists_ = isFile_ = isDirectory_ = isRegular_ = false;
    return;
  }
  isDirectory_ = S_ISDIR(status.st_mode);
  isFile_ = !isDirectory_;
  isRegular_ = S_ISREG(status.st_mode);
  // A path with a status is accessible too, unless the "/" that was left out requires a directory. This saves
  // a call of access for each snapshot.
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
  // KEEP(delete-inverted-exists): the flag is the opposite of the state on disk; no caller uses it after a
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
  // Opened before anything changes: owner and mode reach this file, even if another user exchanges its name.
  const HeldFile source(path_, isRegular_ ? HeldFile::Kind::Regular : HeldFile::Kind::Other);
  const Attributes attributes = overwrite ? clearTarget(target) : Attributes();
  Outcome outcome;
  // Without a descriptor the name in the temporary directory is the safest way.
  if (!source.isHeld() && !source.isLink())
    outcome = setAttributes(path_, attributes);
  const int error = linkAndUnlink(target);
  if (error != 0)
    return error;
  path_ = target;
  if (source.isHeld())
    outcome = setAttributes(source, attributes);
  else if (source.isLink()) // the link itself is moved, and followed from its new place
    outcome = setAttributes(target, attributes);
  // KEEP(chmod-ignored): a wrong mode, unlike a wrong owner, leaves the move a success.
  if (outcome.owner != 0)
    LOG_TRACE("unable to chown for file: %s", target.c_str());
  else if (outcome.mode != 0)
    LOG_TRACE("unable to chmod for file: %s", target.c_str());
  return outcome.owner;
}

/// Gives the file its new name and removes the old one; 0 or an error number.
int File::linkAndUnlink(const std::string &target) const {
  int error = 0;
  if (link(path_.c_str(), target.c_str()) != 0) {
    error = errno;
    LOG_TRACE("unable to link: %s to %s. %s", path_.c_str(), target.c_str(), strerror(error));
  } else if (unlink(path_.c_str()) != 0) {
    error = errno;
    LOG_TRACE("unable to unlink: %s. %s", path_.c_str(), strerror(error));
  }
  return error;
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
  NewDirectories made;
  return mkdir(made);
}

bool File::mkdir(NewDirectories &made) {
  LOG_TRACE("File::mkdir %s", "entry");
  if (makeMissingDirectories(made)) {
    if (!endsInSlash(path_))
      path_ += '/';
    isDirectory_ = true;
    exists_ = true;
  }
  // KEEP(mkdir-known-existence): the result is the object's flag: it stays true for a path that existed
  // before, even when nothing could be made.
  LOG_TRACE("File::mkdir = %d", exists_);
  return exists_;
}

bool File::makeMissingDirectories(NewDirectories &made) const {
  const std::vector<std::string> components = Util::tokenizeString(path_, "/");
  std::vector<std::string> prefixes;
  std::string prefix = isAbsolute() ? "/" : "";
  for (const std::string &component : components) {
    prefix += component + "/";
    prefixes.push_back(prefix);
  }
  // An accessible path has accessible ancestors: a look from the end takes one call for most directories,
  // where a look from the start would take one for every ancestor.
  const auto missing = std::find_if(prefixes.rbegin(), prefixes.rend(), isAccessible).base();
  // After "." and ".." only, a missing prefix may exist once the ones before it are made.
  bool isNew = true;
  return std::all_of(missing, prefixes.end(), [&](const std::string &path) {
    const std::string &component = components[static_cast<std::size_t>(&path - prefixes.data())];
    isNew = isNew && component != "." && component != "..";
    return (!isNew && isAccessible(path)) || makeDirectory(path, made);
  });
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
  else
    removeSymbolicLinks(path_);
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
  errno = 0; // only this distinguishes the end from a failure of readdir
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
  // A link that was planted in the tree must not empty a foreign directory: it goes straight to rmdir, which
  // refuses it.
  const bool isReady = isLink(*directory) || (deleteFiles(*directory) && deleteSubDirectories(*directory));
  if (!isReady)
    return false;
  const std::string path = directory->getAbsolutePath();
  if (rmdir(path.c_str()) != 0) {
    const int error = errno;
    LOG_TRACE("Unable to delete directory [%s]: rc = %d, %s", path.c_str(), error, strerror(error));
    return false;
  }
  return true;
}
