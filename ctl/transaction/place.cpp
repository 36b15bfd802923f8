#include "transaction/place.h"

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <ctime>
#include <filesystem>

#include <sys/stat.h>
#include <unistd.h>

#include "judgement.h"
#include "look.h"
#include "transaction/record.h"

namespace {

namespace fs = std::filesystem;

void makeDirectory(const std::string &path, mode_t mode) {
  if (mkdir(path.c_str(), mode) != 0 && errno != EEXIST)
    throw RefusalError("cannot make " + path + ": " + strerror(errno));
}

/// A user who can change the folder can change what an undo puts back.
void demandPrivate(const std::string &path) {
  struct stat status = {};
  if (lstat(path.c_str(), &status) != 0)
    throw RefusalError("cannot look at " + path + ": " + strerror(errno));
  if (!S_ISDIR(status.st_mode))
    throw RefusalError(path + " is no directory: remove it");
  if (status.st_uid != geteuid() || (status.st_mode & 0077) != 0)
    throw RefusalError(path + " is not closed to other users, or belongs to one of them");
}

std::string nameOfNow() {
  const std::time_t now = std::time(nullptr);
  tm parts = {};
  char text[32] = "";
  if (gmtime_r(&now, &parts) != nullptr)
    static_cast<void>(strftime(text, sizeof text, "%Y%m%dT%H%M%SZ", &parts));
  return std::string(text) + "-" + std::to_string(getpid());
}

/// A folder without a record is one of a transaction that was killed before it had changed anything.
bool hasEnded(const std::string &folder) {
  return !stateOf(folder + "/record.json") || readRecord(folder).phase == Phase::Closed;
}

} // namespace

TransactionPlace::TransactionPlace(const std::string &home) : root_(home + "patchlogs/transactions") {
  makeDirectory(home + "patchlogs", 0755);
  makeDirectory(root_, 0700);
  demandPrivate(root_);
}

std::vector<std::string> TransactionPlace::ids() const {
  std::vector<std::string> names;
  listDirectory(root_, [&](const std::string &name) {
    const std::optional<FileState> state = stateOf(folderOf(name));
    if (state && S_ISDIR(state->type))
      names.push_back(name);
  });
  std::sort(names.begin(), names.end());
  return names;
}

std::string TransactionPlace::create() const {
  const std::string id = nameOfNow();
  for (const char *folder : {"", "/before", "/patches"})
    if (mkdir((folderOf(id) + folder).c_str(), 0700) != 0)
      throw RefusalError("cannot make " + folderOf(id) + folder + ": " + strerror(errno));
  return id;
}

// The record first: one that is only removed in part must not pass for one that can be undone.
void TransactionPlace::remove(const std::string &id) const {
  const std::string record = folderOf(id) + "/record.json";
  if (unlink(record.c_str()) != 0 && errno != ENOENT)
    throw JudgementError("cannot remove " + record + ": " + strerror(errno));
  std::error_code error;
  fs::remove_all(folderOf(id), error);
  if (error)
    throw JudgementError("cannot remove " + folderOf(id) + ": " + error.message());
}

void TransactionPlace::keepNewest(std::size_t count) const {
  const std::vector<std::string> all = ids();
  for (std::size_t i = 0; i + count < all.size(); ++i)
    if (hasEnded(folderOf(all[i])))
      remove(all[i]);
}
