#include "transaction/undoing.h"

#include <algorithm>
#include <ctime>
#include <set>

#include "homelock.h"
#include "judgement.h"
#include "processes.h"
#include "signals.h"
#include "text.h"
#include "transaction/instances.h"
#include "transaction/page.h"
#include "transaction/place.h"
#include "transaction/plan.h"
#include "transaction/saving.h"
#include "utilities.h"

namespace {

bool isUndoable(const Record &record) {
  return record.action == "apply" && record.verdict != "undone" && record.verdict != "refused";
}

/// The records of all transactions, oldest first. A folder without one is of a transaction that was killed
/// before it had changed anything.
std::vector<Record> readRecords(const TransactionPlace &place) {
  std::vector<Record> records;
  for (const std::string &id : place.ids())
    if (stateOf(place.folderOf(id) + "/record.json"))
      records.push_back(readRecord(place.folderOf(id)));
  return records;
}

std::set<std::string> pathsOf(const Record &record) {
  std::set<std::string> paths;
  for (const TouchedFile &file : record.files)
    paths.insert(file.path);
  for (const RewrittenFile &file : record.rewritten)
    if (!file.isEvidence && file.path != "vmaorv6/agentdepot/rc.txt")
      paths.insert(file.path);
  return paths;
}

/// A later transaction that has put its own file over one of this one's must go first.
void demandNewest(const std::vector<Record> &records, const Record &record) {
  const std::set<std::string> paths = pathsOf(record);
  for (const Record &later : records) {
    if (later.id <= record.id || !isUndoable(later))
      continue;
    for (const std::string &path : pathsOf(later))
      if (paths.count(path) != 0)
        throw RefusalError(path + " was changed by the later transaction " + later.id + ": undo that first");
  }
}

Record choose(const std::vector<Record> &records, const std::string &id) {
  const auto found = std::find_if(records.rbegin(), records.rend(), [&id](const Record &record) {
    return id.empty() ? isUndoable(record) : record.id == id;
  });
  if (found == records.rend())
    throw RefusalError(id.empty() ? "no transaction that could be undone" : "no transaction " + id);
  if (!isUndoable(*found))
    throw RefusalError("the transaction " + found->id + " has nothing to undo");
  demandNewest(records, *found);
  return *found;
}

Record recordOfUndo(const Home &home, const Record &undone, const std::string &id) {
  Record record;
  record.id = id;
  record.action = "undo";
  record.undoes = undone.id;
  record.home = home.path();
  record.user = Util::getUserName();
  record.started = utcTime(std::time(nullptr));
  record.patches = undone.patches;
  record.before = runningInstances(home);
  record.phase = Phase::Installing;
  return record;
}

bool isInterrupted(const Record &record, const std::vector<Record> &records) {
  if (!isUndoable(record))
    return false;
  return record.phase != Phase::Closed ||
         std::any_of(records.begin(), records.end(), [&record](const Record &other) {
           return other.undoes == record.id && other.phase != Phase::Closed;
         });
}

void markUndone(const TransactionPlace &place, Record record, const std::vector<std::string> &messages) {
  record.verdict = "undone";
  record.phase = Phase::Closed;
  record.messages.insert(record.messages.end(), messages.begin(), messages.end());
  if (record.ended.empty())
    record.ended = utcTime(std::time(nullptr));
  writePage(place.folderOf(record.id), record);
  writeRecord(place.folderOf(record.id), record);
}

} // namespace

std::vector<std::string> takeBackInterrupted(const Home &home) {
  const TransactionPlace place(home.path());
  const std::vector<Record> records = readRecords(place);
  std::vector<std::string> ids;
  for (auto record = records.rbegin(); record != records.rend(); ++record) {
    if (!isInterrupted(*record, records))
      continue;
    demandNoRun(home.path()); // the installer outlives a caller that is killed
    std::vector<std::string> messages;
    if (!takeBack(home, place.folderOf(record->id), *record, messages))
      throw RefusalError("the interrupted transaction " + record->id +
                         " cannot be taken back: " + messages.front());
    markUndone(place, *record, messages);
    ids.push_back(record->id);
  }
  return ids;
}

bool takeBack(const Home &home, const std::string &folder, const Record &record,
              std::vector<std::string> &messages) {
  const std::size_t before = messages.size();
  static_cast<void>(stopInstances(home, record.dependents, messages));
  restoreFiles(home.path(), folder, record, messages);
  startMissing(home, record.before, messages);
  return messages.size() == before;
}

Record undoTransaction(const Home &home, const std::string &id) {
  const HomeLock lock(home.path());
  demandNoRun(home.path());
  const TransactionPlace place(home.path());
  const Record undone = choose(readRecords(place), id);
  Record record = recordOfUndo(home, undone, place.create());
  const std::string folder = place.folderOf(record.id);
  outlastInterruptions();
  writeRecord(folder, record);

  const bool whole = takeBack(home, place.folderOf(undone.id), undone, record.messages);
  record.after = runningInstances(home);
  record.verdict = whole ? "undone" : "incomplete";
  record.ended = utcTime(std::time(nullptr));
  record.phase = Phase::Closed;
  writePage(folder, record);
  writeRecord(folder, record);
  // One that was taken back only in part may be undone again, once what stood in the way is gone.
  if (whole)
    markUndone(place, undone, record.messages);
  return record;
}
