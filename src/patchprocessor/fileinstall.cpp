// updated_files: the tree of new files, moved to the same places under the home, or listed.
//
// The walk starts at "." inside that tree, so that the path of every entry is relative and can be appended to
// the home. Sub-directories come before files, both in the order in which the system lists them.
#include "patchprocessor/patchprocessor.h"

#include <algorithm>
#include <cstdio>

#include <sys/stat.h>

#include "failure.h"
#include "heldfile.h"
#include "newdirectories.h"
#include "patchprocessor/workingdirectory.h"
#include "signalguard.h"
#include "utilities.h"

#define LOG_COMPONENT "patchprocessor"

namespace {

constexpr const char *UpdatedFiles = "/updated_files";

/// Whether the directory is a link to one above it. Entering it would repeat the walk, and two such links
/// would double it at each of the 40 levels that the system follows.
bool leadsBack(const std::string &path) {
  struct stat directory = {};
  const std::string name = path.substr(0, path.size() - 1);
  if (lstat(name.c_str(), &directory) != 0 || !S_ISLNK(directory.st_mode) ||
      stat(name.c_str(), &directory) != 0)
    return false;
  for (std::size_t slash = path.find('/'); slash < name.size(); slash = path.find('/', slash + 1)) {
    struct stat above = {};
    const std::string nameAbove = path.substr(0, slash);
    if (stat(nameAbove.c_str(), &above) == 0 && identityOf(above) == identityOf(directory))
      return true;
  }
  return false;
}

/// One walk through updated_files. Working directory and home are read once, not for each file.
struct Walk {
  std::string directory;
  std::string home;
  PatchError *err;
  NewDirectories *made; ///< null where nothing is made
};

Walk walkFromHere(PatchError *err, NewDirectories *made = nullptr) {
  return {Util::getCurrentDirectory(), Util::getQuillHome(), err, made};
}

/// Visits the entries of a directory, sub-directories first, up to the first visit that fails.
bool visitEntries(File &directory, const Walk &walk, bool (*visit)(File &entry, const Walk &walk)) {
  if (leadsBack(directory.getPath()))
    return true;
  const auto visitEntry = [&](File *entry) { return visit(*entry, walk); };
  const std::vector<File *> &subDirectories = *directory.listSubDirectories();
  const std::vector<File *> &files = *directory.listFiles();
  return std::all_of(subDirectories.begin(), subDirectories.end(), visitEntry) &&
         std::all_of(files.begin(), files.end(), visitEntry);
}

/// `path` ends in "/": what exists there is a directory.
bool makeTargetDirectory(const std::string &path, const Walk &walk) {
  File target(path);
  if (target.exists())
    return true;
  LOG_INFO_MESSAGE("PP_MAKE_DIR", path.c_str());
  if (target.mkdir(*walk.made))
    return true;
  FAILURE(walk.err, PatchError::CannotMakeDirectory, "ERROR_PP_MAKE_DIR", path.c_str());
  // KEEP(mkdir-null-record): without a record the walk goes on; each file that cannot be moved is reported.
  return walk.err == nullptr;
}

bool installFile(File &file, const std::string &destination, const Walk &walk) {
  const std::string source = file.getAbsolutePath(walk.directory);
  if (!file.moveFile(destination, true))
    return FAILURE(walk.err, PatchError::CannotMoveFile, "ERROR_PP_MOVE_FILE", source.c_str(),
                   destination.c_str());
  LOG_INFO_MESSAGE("PP_MOVE_FILE", source.c_str(), file.getPath().c_str());
  return true;
}

/// Moves an entry, with everything below it.
bool moveTree(File &entry, const Walk &walk) {
  LOG_TRACE("PatchProcessor::moveFile() %s", "entry");
  const std::string destination = walk.home + entry.getPath();
  const bool result = entry.isDirectory()
                          ? makeTargetDirectory(destination, walk) && visitEntries(entry, walk, moveTree)
                          : installFile(entry, destination, walk);
  LOG_TRACE("PatchProcessor::moveFile() %s", "exit");
  return result;
}

/// Lists an entry, with everything below it.
bool listTree(File &entry, const Walk &walk) {
  if (entry.isDirectory())
    return visitEntries(entry, walk, listTree);
  const std::string source = Util::removeDotFromPath(entry.getAbsolutePath(walk.directory));
  const std::string target = Util::removeDotFromPath(walk.home + entry.getPath());
  LOG_INFO("%s --> %s", source.c_str(), target.c_str());
  printf("    %s\n", target.c_str());
  return true;
}

} // namespace

bool PatchProcessor::moveFiles(PatchError *err) {
  LOG_TRACE("PatchProcessor::moveFiles() %s", "entry");
  const std::string source = contentDir() + UpdatedFiles;
  if (!Util::pathExists(source)) {
    LOG_INFO_MESSAGE("PP_NO_FILES");
    return true;
  }
  WorkingDirectory workingDirectory;
  if (!workingDirectory.enter(source, err))
    return false;
  LOG_INFO_MESSAGE("PP_MOVE_FILES", source.c_str(), Util::getQuillHome().c_str());
  // Before the first old file is removed: after a power failure every file is then either the old one or the
  // new one, never an empty one.
  flushToDisk(".");
  mayHaveMoved_ = true;
  File root(".");
  bool result = moveFile(&root, err);
  if (!workingDirectory.leave(err))
    result = false;
  // KEEP(movefiles-exit-name): the result line names the operation without its "s".
  LOG_TRACE("PatchProcessor::moveFile() = %d", result);
  return result;
}

bool PatchProcessor::moveFile(File *entry, PatchError *err) {
  // An interruption would leave a file without its owner and mode, which no repetition could restore.
  const SignalGuard guard;
  NewDirectories made;
  return moveTree(*entry, walkFromHere(err, &made));
}

bool PatchProcessor::listFiles(PatchError *err) {
  LOG_TRACE("PatchProcessor::listFiles() %s", "entry");
  const std::string source = contentDir() + UpdatedFiles;
  bool result = false;
  WorkingDirectory workingDirectory;
  if (!Util::pathExists(source)) {
    // KEEP(list-no-files-false): unlike an installation, the report of a patch without files is not a
    // success.
    LOG_INFO_MESSAGE("PP_NO_FILES");
  } else if (workingDirectory.enter(source, err)) {
    const std::string heading = NLS::getString("PP_LIST_FILES");
    LOG_INFO("%s", heading.c_str());
    printf("\n%s\n", heading.c_str());
    File root(".");
    result = listFile(&root, err);
    if (!workingDirectory.leave(err))
      result = false;
  }
  printf("\n");
  LOG_TRACE("PatchProcessor::listFiles() %s", "exit");
  return result;
}

bool PatchProcessor::listFile(File *entry, PatchError *err) {
  return listTree(*entry, walkFromHere(err));
}
