#include "transaction/saving.h"

#include <algorithm>
#include <cerrno>
#include <cstring>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include "filedescriptor.h"
#include "inputfile.h"
#include "judgement.h"

namespace {

/// Version files, results and histories are small; none comes near this.
constexpr std::size_t LargestCopy = 256UL * 1024 * 1024;

std::string savedPath(const std::string &folder, const std::string &name) {
  return folder + "/before/" + name;
}

/// A copy with all attributes. cp knows those of every file system.
void copyWhole(const std::string &from, const std::string &to) {
  const ChildResult copied = runChild({"cp", "-a", "--", from, to}, {"/usr/bin:/bin", {"LC_ALL=C"}});
  if (copied.status != 0)
    throw RefusalError("cannot save " + from + ": " + copied.err);
}

/// A second name for the file itself, a symbolic link included; a copy where the system gives none.
void saveByLink(const std::string &from, const std::string &to) {
  if (linkat(AT_FDCWD, from.c_str(), AT_FDCWD, to.c_str(), 0) == 0 || errno == EEXIST)
    return;
  if (errno != EXDEV && errno != EPERM && errno != EMLINK && errno != EOPNOTSUPP)
    throw RefusalError("cannot save " + from + ": " + strerror(errno));
  copyWhole(from, to);
}

/// Puts on disk what was written to the file system of `path`; 0 or why it is not there.
int syncSystem(const std::string &path) {
  const FileDescriptor directory(path.c_str(), O_RDONLY | O_DIRECTORY);
  return directory.isOpen() && syncfs(directory.get()) == 0 ? 0 : errno;
}

/// Puts one old file back in place of the new one, atomically. Both may be names of one file, which rename
/// leaves alone.
void putBack(const std::string &saved, const std::string &target) {
  const std::optional<FileState> old = stateOf(saved);
  if (!old)
    return;
  const std::optional<FileState> now = stateOf(target);
  const bool isThere = now && now->device == old->device && now->inode == old->inode;
  const int result = isThere ? unlink(saved.c_str()) : rename(saved.c_str(), target.c_str());
  if (result == 0)
    return;
  if (errno != EXDEV)
    throw JudgementError("cannot put " + target + " back: " + strerror(errno));
  // It was copied, because it is on another file system: copied back beside it, then renamed.
  const std::string beside = target + ".orvpatchctl";
  copyWhole(saved, beside);
  if (rename(beside.c_str(), target.c_str()) != 0)
    throw JudgementError("cannot put " + target + " back: " + strerror(errno));
  static_cast<void>(unlink(saved.c_str()));
}

/// The old file itself, or a copy of it that was put back.
bool isOldFile(const FileState &now, const FileState &before) {
  return isSameInode(now, before) || (now.type == before.type && now.size == before.size &&
                                      now.seconds == before.seconds && now.nanoseconds == before.nanoseconds);
}

/// Whether the path has something else now than the installation left there. Nothing is known of that when
/// the installation was interrupted: what is not the old file is then taken for the new one.
bool isChangedSince(const Record &record, const TouchedFile &file, const FileState &now) {
  const bool isKnown = record.phase == Phase::Installed || record.phase == Phase::Closed;
  return isKnown && !(file.after && isSameFile(*file.after, now));
}

void restoreFile(const std::string &home, const std::string &folder, const Record &record,
                 const TouchedFile &file, std::vector<std::string> &messages) {
  const std::string target = home + file.path;
  const std::optional<FileState> now = stateOf(target);
  const bool isOld = now && file.before && isOldFile(*now, *file.before);
  if (file.before && !stateOf(savedPath(folder, file.saved))) {
    // It is not saved yet, or an undo before this one has put it back.
    if (!isOld)
      messages.push_back(file.path + ": the saved file is gone, left as it is");
    return;
  }
  if (now && !isOld && isChangedSince(record, file, *now)) {
    messages.push_back(file.path + ": changed since the installation, left as it is");
    return;
  }
  if (file.before)
    return putBack(savedPath(folder, file.saved), target);
  if (now && unlink(target.c_str()) != 0)
    messages.push_back(file.path + ": cannot be removed: " + strerror(errno));
}

/// The names that old files were given to keep them. The files stay what they are by now.
void removeSaved(const std::string &folder, const Record &record) {
  for (const TouchedFile &file : record.files)
    if (!file.saved.empty())
      static_cast<void>(unlink(savedPath(folder, file.saved).c_str()));
}

/// Owner and mode of a file that had to be made anew. An ordinary user can give it to no other.
bool giveAttributes(int file, const FileState &before) {
  const bool isGiven =
      fchown(file, static_cast<uid_t>(before.user), static_cast<gid_t>(before.group)) == 0 || errno == EPERM;
  return isGiven && fchmod(file, before.mode) == 0;
}

/// Writes the old content into the file, so that its inode, names and attributes stay, and sets its times
/// back. The content is on disk before the time: a file with the old time has the old content.
void restoreInPlace(const std::string &content, const std::string &target, const FileState &before,
                    bool isMissing) {
  FileDescriptor file(target.c_str(), O_WRONLY | O_CREAT | O_NOFOLLOW);
  const timespec times[2] = {{0, UTIME_OMIT},
                             {static_cast<time_t>(before.seconds), static_cast<long>(before.nanoseconds)}};
  if (!file.isOpen() || !file.write(content) ||
      ftruncate(file.get(), static_cast<off_t>(content.size())) != 0 ||
      (isMissing && !giveAttributes(file.get(), before)) || fsync(file.get()) != 0 ||
      futimens(file.get(), times) != 0 || fsync(file.get()) != 0)
    throw JudgementError("cannot write " + target + ": " + strerror(errno));
}

std::string savedContent(const std::string &saved) {
  const InputFile file(saved);
  if (!file.exists())
    throw JudgementError("the saved file is gone: " + saved);
  return file.content(LargestCopy);
}

void restoreRewritten(const std::string &home, const std::string &folder, const RewrittenFile &file,
                      std::vector<std::string> &messages) {
  const std::string target = home + file.path;
  if (file.isEvidence)
    return;
  if (!file.before) {
    if (unlink(target.c_str()) != 0 && errno != ENOENT && errno != ENOTDIR)
      messages.push_back(file.path + ": cannot be removed: " + strerror(errno));
    return;
  }
  const std::optional<FileState> now = stateOf(target);
  const std::string saved = savedPath(folder, file.saved);
  if (now && isSameFile(*now, *file.before) && !stateOf(saved))
    return; // not saved yet
  // After a power failure the old time is no proof of the old content.
  const std::string content = savedContent(saved);
  if (!now || !isSameFile(*now, *file.before) || InputFile(target).content(LargestCopy) != content)
    restoreInPlace(content, target, *file.before, !now);
}

/// One that holds something else by now stays.
void removeDirectory(const std::string &home, const std::string &path, std::vector<std::string> &messages) {
  if (rmdir((home + path).c_str()) == 0 || errno == ENOENT || errno == ENOTDIR)
    return;
  const bool isFull = errno == ENOTEMPTY || errno == EEXIST;
  messages.push_back(path + (isFull ? ": not empty, left as it is"
                                    : ": cannot be removed: " + std::string(strerror(errno))));
}

std::string asidePath(const std::string &folder, const std::string &directory) {
  return savedPath(folder, directory.substr(directory.find('/') + 1) + ".tmp");
}

/// What the installer left in a temporary directory goes; what lay there before comes back.
void restoreTemporary(const std::string &home, const std::string &folder, const Record &record,
                      const std::string &directory, std::vector<std::string> &messages) {
  const bool wasThere =
      std::find(record.setAside.begin(), record.setAside.end(), directory) != record.setAside.end();
  const std::string saved = asidePath(folder, directory);
  if (wasThere && !stateOf(saved))
    return; // not moved yet, or back already
  const ChildResult removed =
      runChild({"rm", "-rf", "--", home + directory}, {"/usr/bin:/bin", {"LC_ALL=C"}});
  if (removed.status != 0)
    messages.push_back(directory + ": cannot be removed: " + removed.err);
  else if (wasThere && rename(saved.c_str(), (home + directory).c_str()) != 0)
    throw JudgementError("cannot put " + home + directory + " back: " + strerror(errno));
}

} // namespace

void saveFiles(const std::string &home, const std::string &folder, Record &record) {
  for (const TouchedFile &file : record.files)
    if (file.before)
      saveByLink(home + file.path, savedPath(folder, file.saved));
  for (const RewrittenFile &file : record.rewritten)
    if (file.before)
      copyWhole(home + file.path, savedPath(folder, file.saved));
  for (const std::string &directory : record.setAside)
    if (rename((home + directory).c_str(), asidePath(folder, directory).c_str()) != 0)
      throw RefusalError("cannot set " + directory + " aside: " + strerror(errno));
  if (const int error = syncSystem(home))
    throw RefusalError("cannot put on disk what was saved: " + std::string(strerror(error)));
}

void bringBackSetAside(const std::string &home, const std::string &folder, const Record &record) {
  for (const std::string &directory : record.setAside) {
    const std::string saved = asidePath(folder, directory);
    std::string place = home;
    place += directory;
    if (stateOf(saved) && rename(saved.c_str(), place.c_str()) != 0)
      throw JudgementError(std::string("cannot put ").append(place).append(" back, it is ").append(saved) +
                           ": " + strerror(errno));
  }
}

void noteInstalled(const std::string &home, Record &record) {
  for (TouchedFile &file : record.files)
    file.after = stateOf(home + file.path);
}

void restoreFiles(const std::string &home, const std::string &folder, const Record &record,
                  std::vector<std::string> &messages) {
  if (record.phase == Phase::Prepared) {
    // The installer was not started: what differs from the record is the work of others.
    removeSaved(folder, record);
  } else {
    for (const TouchedFile &file : record.files)
      restoreFile(home, folder, record, file, messages);
    for (const RewrittenFile &file : record.rewritten)
      restoreRewritten(home, folder, file, messages);
  }
  for (const std::string &directory : record.temporary)
    restoreTemporary(home, folder, record, directory, messages);
  for (auto directory = record.directories.rbegin(); directory != record.directories.rend(); ++directory)
    removeDirectory(home, directory->path, messages);
  if (const int error = syncSystem(home))
    messages.push_back("the old files may not be on disk: " + std::string(strerror(error)));
}

void closeDirectories(const std::string &home, const Record &record, std::vector<std::string> &messages) {
  for (const NewDirectory &made : record.directories) {
    const std::size_t slash = made.path.rfind('/');
    const std::string parent = home + (slash == std::string::npos ? "" : made.path.substr(0, slash));
    const FileDescriptor directory((home + made.path).c_str(), O_RDONLY | O_DIRECTORY | O_NOFOLLOW);
    if (!directory.isOpen() && errno == ENOENT)
      continue; // the installation did not come to it
    struct stat status = {};
    // An ordinary user can give neither owner nor a foreign group: the mode is set all the same.
    const bool isClosed = directory.isOpen() && stat(parent.c_str(), &status) == 0 &&
                          (fchown(directory.get(), status.st_uid, status.st_gid) == 0 || errno == EPERM) &&
                          fchmod(directory.get(), status.st_mode & 07777) == 0;
    if (!isClosed)
      messages.push_back(made.path + ": owner and mode cannot be set: " + strerror(errno));
  }
}
