// One path on disk: a snapshot of its type, size and time, its entries when it is a directory, and the few
// operations that an installation needs.
//
// The constructors take the snapshot; it is refreshed only where an operation says so. Nothing here fills an
// error record: an operation returns false, the log has the reason, and the caller formats the message.
// "Moving" and "copying" are hard links: no data is ever copied, and no file reaches another file system.
#pragma once

#include <cstdint>
#include <memory>
#include <string>
#include <vector>

#include "ownedlist.h"

class NewDirectories;

class File {
public:
  explicit File(const std::string &path);
  /// The entry `name` of `directory`, whose path already ends in "/".
  File(const File &directory, const std::string &name);
  /// Copies the listings too, as far as they are loaded.
  File(const File &other);
  File &operator=(const File &) = delete;
  virtual ~File() = default;

  /// Takes the snapshot anew and forgets the listings.
  void initialize();

  bool exists() const { return exists_; }
  /// Anything that is not a directory: links are followed, and a device or pipe counts as a file.
  bool isFile() const { return isFile_; }
  bool isDirectory() const { return isDirectory_; }
  /// The path as given; that of a directory ends in "/".
  std::string getPath() const { return path_; }
  /// Seconds since the epoch, 0 when unknown; 32 bits, as is the size in bytes.
  std::int32_t getLastModification() const { return lastModification_; }
  std::int32_t getSize() const { return size_; }

  bool isAbsolute() const;
  /// The path itself, or the working directory before it; nothing is normalised.
  std::string getAbsolutePath() const;
  /// The same for a given working directory.
  std::string getAbsolutePath(const std::string &workingDirectory) const;
  /// Up to and including the "/" before the last component; see the source for paths without one.
  std::string getParentPath() const;
  /// The last component, without the "/" that ends a directory's path.
  std::string getName() const;

  /// Unlinks an existing file; true exactly when that succeeded. Afterwards exists() is inverted.
  bool deleteFile();
  /// Links the file to `target` and unlinks the source. A target that exists is replaced when `overwrite` is
  /// true, and its owner, group and permission mode are kept (those of a link's destination, less its set-id
  /// bits); any other new file gets mode 0755. A missing source counts as moved. Afterwards the path is the
  /// target's, and the flags are unchanged.
  bool moveFile(const std::string &target, bool overwrite);
  /// Links the file to `target` too. With `keepExisting` an existing target makes it fail.
  bool copyFile(const std::string &target, bool keepExisting);
  /// Makes the directory and its missing parents, each with mode 0777 whatever the umask. True when the
  /// object exists in the end, as far as it knows.
  bool mkdir();
  /// The same, but new directories stay closed to other users until `made` is destroyed.
  bool mkdir(NewDirectories &made);
  /// Removes the directory and everything below it. Never follows a symbolic link; if anything stays, all
  /// links of the tree are still removed.
  bool rmdir();

  /// Entries that are not directories, in the order of the system; loaded once, owned by this object.
  std::vector<File *> *listFiles();
  /// Entries that are directories, likewise.
  std::vector<File *> *listSubDirectories();
  /// Builds both lists; they are empty if the path cannot be opened as a directory.
  void loadDir();

private:
  int moveTo(const std::string &target, bool overwrite);
  int linkAndUnlink(const std::string &target) const;
  bool linkTo(const std::string &target, bool keepExisting) const;
  bool makeMissingDirectories(NewDirectories &made) const;
  void appendEntry(const std::string &name);

  std::string path_;
  bool exists_ = false;
  bool isFile_ = false;
  bool isDirectory_ = false;
  bool isRegular_ = false; ///< neither a directory nor a device, pipe or socket
  std::int32_t lastModification_ = 0;
  std::int32_t size_ = 0;
  std::unique_ptr<OwnedList<File>> files_;
  std::unique_ptr<OwnedList<File>> subDirectories_;
};

/// Deletes the files of a directory, then its sub-directories, then the directory, going on after a failure
/// as far as possible. True only when everything was deleted.
bool recursiveDelete(File *directory);
