// The record of a transaction: what was about to happen, what happened, and what an undo needs to take it
// back.
//
// It is on disk before the first change, and written anew, whole, at each turn: a reader finds the old one or
// the new one. Paths are relative to the home.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include <nlohmann/json_fwd.hpp>

#include "child.h"
#include "finding.h"
#include "verification.h"

/// What stands at a path, as far as a later change can be told by it.
struct FileState {
  unsigned type = 0; ///< the type bits of the mode
  unsigned mode = 0;
  std::int64_t user = 0;
  std::int64_t group = 0;
  std::int64_t size = 0;
  std::int64_t seconds = 0; ///< time of the last change of the content
  std::int64_t nanoseconds = 0;
  std::uint64_t device = 0;
  std::uint64_t inode = 0;
};

/// The state of what is at `path` itself; none where nothing is. JudgementError when that cannot be told.
std::optional<FileState> stateOf(const std::string &path);
/// The same file with the same content: inode, type, size and time. The number of a device is not compared:
/// another mount or another start of the system may give it another one.
bool isSameFile(const FileState &a, const FileState &b);
/// The same file, whatever its content is by now.
bool isSameInode(const FileState &a, const FileState &b);

/// A file that a patch brings.
struct TouchedFile {
  std::string path;
  std::optional<FileState> before; ///< none for a new file
  std::optional<FileState> after;  ///< known once the installation has ended
  std::string saved;               ///< name below before/; empty for a new file
};

/// A file that is written in place: version files, the OS agent's result, the history.
struct RewrittenFile {
  std::string path;
  std::optional<FileState> before;
  std::string saved;
  bool isEvidence = false; ///< kept as it is by an undo: the history
};

/// A directory that was not there before.
struct NewDirectory {
  std::string path;
};

struct RecordedPatch {
  std::string file;
  std::string sha256;
  std::string product;
  std::string target;
  std::string name;
  std::string levelBefore;
  std::string levelAfter;
  std::string result;      ///< PASS, FAIL, or empty when the patch's turn did not come
  std::string versionFile; ///< that holds its level
};

struct RecordedInstance {
  std::string product;
  std::string name;
  std::string pid;
  std::string user;
};

/// "kyn one"; of the default instance "kyn".
std::string nameOf(const RecordedInstance &instance);
/// Whether the list has the instance, as whichever process.
bool isAmong(const std::vector<RecordedInstance> &list, const RecordedInstance &instance);

struct RecordedStep {
  std::string step;
  double seconds = 0;
  std::string result;
};

/// Where a transaction stands. An undo looks at the home whatever the phase says: a kill may come at any
/// time.
enum class Phase { Prepared, Installing, Installed, Closed };

struct Record {
  std::string id;
  std::string action; ///< "apply" or "undo"
  std::string undoes; ///< id of the transaction that an undo takes back
  std::string home;
  std::string user;
  std::string started;
  std::string ended;
  Phase phase = Phase::Prepared;
  std::vector<RecordedPatch> patches;
  FindingList findings;
  std::vector<RecordedStep> steps;
  std::vector<TouchedFile> files;
  std::vector<RewrittenFile> rewritten;
  std::vector<NewDirectory> directories; ///< parents before what they hold
  std::vector<std::string> temporary;    ///< temporary directories of the patches, "tmp/kyn"
  std::vector<std::string> setAside;     ///< those that were there before: they are moved below before/
  std::vector<std::string> dependents;   ///< products whose instances the patches stop
  std::vector<std::string> otherChanges; ///< paths that changed and are not the patches': commands did that
  std::vector<RecordedInstance> before;
  std::vector<RecordedInstance> after;
  ChildResult installer;
  std::vector<Difference> differences;
  std::vector<std::string> messages; ///< what an undo left alone, and why
  std::string verdict;               ///< applied, refused, failed, incomplete or undone; empty while it runs
  bool dryRun = false;
};

nlohmann::ordered_json toJson(const Record &record);
/// JudgementError for a text that is no record.
Record parseRecord(const std::string &text);

/// Puts a file with this content, on disk, in the place of the one at `path`; 0 or why it cannot.
int replaceFile(const std::string &path, const std::string &content);

/// Writes record.json in the transaction's folder, whole, and puts its name on disk. JudgementError when it
/// cannot.
void writeRecord(const std::string &folder, const Record &record);
/// JudgementError when there is none.
Record readRecord(const std::string &folder);
