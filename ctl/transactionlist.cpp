#include "transactionlist.h"

#include <algorithm>
#include <cerrno>
#include <cstring>

#include <nlohmann/json.hpp>
#include <unistd.h>

#include "inputfile.h"
#include "judgement.h"
#include "look.h"

namespace {

using Json = nlohmann::json;

/// Some hundred bytes for each file of a patch.
constexpr std::size_t LargestRecord = 256UL * 1024 * 1024;

/// The text of a member; empty when it is missing or something else.
std::string textOf(const Json &object, const char *key) {
  const auto found = object.find(key);
  return found != object.end() && found->is_string() ? found->get<std::string>() : "";
}

std::optional<std::time_t> timeOf(const Json &object, const char *key) {
  tm parts = {};
  const std::string text = textOf(object, key);
  const char *const end = strptime(text.c_str(), "%Y-%m-%dT%H:%M:%S", &parts);
  if (end == nullptr || (*end != 'Z' && *end != '.'))
    return std::nullopt;
  return timegm(&parts);
}

void addPatches(const Json &record, TransactionSummary &summary) {
  const auto patches = record.find("patches");
  if (patches == record.end() || !patches->is_array())
    return;
  for (const Json &patch : *patches)
    if (patch.is_object())
      summary.patches.push_back({textOf(patch, "product"), textOf(patch, "target")});
}

std::optional<TransactionSummary> summaryOf(const Json &record) {
  if (!record.is_object())
    return std::nullopt;
  const std::optional<std::time_t> started = timeOf(record, "started");
  TransactionSummary summary;
  summary.id = textOf(record, "id");
  if (summary.id.empty() || !started)
    return std::nullopt;
  summary.started = *started;
  summary.ended = timeOf(record, "ended");
  summary.verdict = textOf(record, "verdict");
  summary.undoes = textOf(record, "undoes");
  addPatches(record, summary);
  return summary;
}

std::optional<TransactionSummary> readRecord(const std::string &path) {
  try {
    return summaryOf(Json::parse(InputFile(path).content(LargestRecord), nullptr, false));
  } catch (const JudgementError &) {
    if (access(path.c_str(), R_OK) == 0)
      throw;
    return std::nullopt; // closed to this user: the history itself can be told without it
  }
}

bool wasAtWork(const TransactionSummary &transaction, std::time_t moment) {
  return transaction.started <= moment && (!transaction.ended || moment <= *transaction.ended);
}

bool made(const TransactionSummary &transaction, const HistoryRecord &record,
          const std::vector<std::time_t> &moments) {
  return std::any_of(moments.begin(), moments.end(),
                     [&](std::time_t moment) { return wasAtWork(transaction, moment); }) &&
         std::any_of(transaction.patches.begin(), transaction.patches.end(),
                     [&record](const TransactionPatch &patch) {
                       return patch.product == record.product && patch.target == record.target;
                     });
}

} // namespace

std::vector<TransactionSummary> readTransactions(const std::string &home) {
  std::vector<TransactionSummary> transactions;
  const std::string folder = home + "patchlogs/transactions";
  if (access(folder.c_str(), R_OK | X_OK) != 0 && errno == EACCES)
    return transactions;
  listDirectory(folder, [&](const std::string &name) {
    if (std::optional<TransactionSummary> summary = readRecord(folder + "/" + name + "/record.json"))
      transactions.push_back(*std::move(summary));
  });
  std::sort(transactions.begin(), transactions.end(),
            [](const TransactionSummary &a, const TransactionSummary &b) {
              return std::tie(a.started, a.id) < std::tie(b.started, b.id);
            });
  return transactions;
}

const TransactionSummary *transactionOf(const HistoryRecord &record,
                                        const std::vector<TransactionSummary> &transactions) {
  const std::vector<std::time_t> moments = momentsOf(record);
  const auto found =
      std::find_if(transactions.rbegin(), transactions.rend(), [&](const TransactionSummary &candidate) {
        return candidate.undoes.empty() && made(candidate, record, moments);
      });
  return found == transactions.rend() ? nullptr : &*found;
}

bool isUndone(const TransactionSummary &transaction, const std::vector<TransactionSummary> &transactions) {
  return transaction.verdict == "undone" ||
         std::any_of(transactions.begin(), transactions.end(),
                     [&transaction](const TransactionSummary &other) {
                       return other.undoes == transaction.id && other.verdict == "undone";
                     });
}
