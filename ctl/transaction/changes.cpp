#include "transaction/changes.h"

#include <algorithm>
#include <filesystem>
#include <set>

#include <sys/stat.h>
#include <unistd.h>

#include "history.h"
#include "judgement.h"
#include "text.h"
#include "utilities.h"

namespace {

namespace fs = std::filesystem;

bool isLeftOut(const std::string &path) {
  return path == "patchlogs" || path == "tmp" || path == "config/.ConfigData/RunInfo";
}

std::map<std::string, FileState> look(const Home &home, const Record &record) {
  std::set<std::string> named;
  for (const TouchedFile &file : record.files)
    named.insert(file.path);
  for (const RewrittenFile &file : record.rewritten)
    named.insert(file.path);
  for (const NewDirectory &directory : record.directories)
    named.insert(directory.path);
  std::map<std::string, FileState> found;
  std::error_code error;
  fs::recursive_directory_iterator entry(home.path(), fs::directory_options::skip_permission_denied, error);
  for (const fs::recursive_directory_iterator end; !error && entry != end; entry.increment(error)) {
    const std::string path = entry->path().string().substr(home.path().size());
    if (isLeftOut(path)) {
      entry.disable_recursion_pending();
      continue;
    }
    if (named.count(path) != 0 || access(entry->path().parent_path().c_str(), X_OK) != 0)
      continue; // what a directory holds that is closed to this user cannot be compared
    if (const std::optional<FileState> state = stateOf(entry->path()))
      found.emplace(path, *state);
  }
  if (error)
    throw JudgementError("cannot look through " + home.path() + ": " + error.message());
  return found;
}

/// The size and times of a directory change with what it holds, which is told by itself.
bool isSame(const FileState &a, const FileState &b) {
  const bool sameOwner = a.type == b.type && a.mode == b.mode && a.user == b.user && a.group == b.group;
  return sameOwner && (S_ISDIR(a.type) || isSameFile(a, b));
}

} // namespace

void HomeChanges::lookBefore(const Home &home, const Record &record) {
  before_ = look(home, record);
}

std::vector<std::string> HomeChanges::others(const Home &home, const Record &record) const {
  const std::map<std::string, FileState> now = look(home, record);
  std::vector<std::string> changed;
  for (const auto &[path, state] : before_) {
    const auto found = now.find(path);
    if (found == now.end() || !isSame(state, found->second))
      changed.push_back(path);
  }
  for (const auto &[path, state] : now)
    if (before_.count(path) == 0)
      changed.push_back(path);
  std::sort(changed.begin(), changed.end());
  return changed;
}

void noteResults(const Home &home, Record &record) {
  const std::vector<HistoryRecord> records = readHistory(home.path()).records;
  // The installation's own lines are the last ones; each patch writes one, in the order of the patches, and a
  // failure ends them. Lines of before are told apart by their time.
  std::size_t line = records.size();
  for (auto patch = record.patches.rbegin(); patch != record.patches.rend(); ++patch) {
    if (line == 0)
      return;
    const HistoryRecord &last = records[line - 1];
    std::string name = patch->name;
    Util::trimString(name);
    const std::vector<std::time_t> moments = momentsOf(last);
    const bool isNew = std::any_of(moments.begin(), moments.end(), [&record](std::time_t moment) {
      return utcTime(moment) >= record.started;
    });
    if (!isNew || last.product != patch->product || last.target != patch->target || last.name != name)
      continue;
    patch->result = last.result;
    --line;
  }
}

void verifyAttributes(const TouchedFile &file, const FileState &now, Verification &verification) {
  if (S_ISLNK(now.type))
    return;
  const bool isReplaced = file.before && !S_ISLNK(file.before->type);
  const unsigned mode = isReplaced ? file.before->mode : 0755;
  if ((isReplaced || !file.before) && now.mode != mode)
    verification.add(file.path, "mode", "the mode is " + octalMode(now.mode) + ", not " + octalMode(mode));
  const std::optional<FileState> &owned = isReplaced ? file.before : file.after;
  if (owned && (now.user != owned->user || now.group != owned->group))
    verification.add(file.path, "owner",
                     "it belongs to " + std::to_string(now.user) + ":" + std::to_string(now.group) +
                         ", not to " + std::to_string(owned->user) + ":" + std::to_string(owned->group));
}
