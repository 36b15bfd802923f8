// The records of earlier transactions, as far as the history needs them.
#pragma once

#include <ctime>
#include <optional>
#include <string>
#include <vector>

#include "history.h"

struct TransactionPatch {
  std::string product;
  std::string target;
};

struct TransactionSummary {
  std::string id;
  std::time_t started = 0;
  std::optional<std::time_t> ended; ///< none when it was killed
  std::vector<TransactionPatch> patches;
  std::string verdict; ///< "applied", "undone", ...
  std::string undoes;  ///< the transaction that this one took back; empty for others
};

/// In the order of their start. Empty when there is no folder of transactions or when it is closed to the
/// user: it is its owner's alone. What is no record of this program is passed over.
std::vector<TransactionSummary> readTransactions(const std::string &home);

/// The transaction that made this attempt: the last one that was at work at its time on a patch of this
/// product and target. Null when there is none.
const TransactionSummary *transactionOf(const HistoryRecord &record,
                                        const std::vector<TransactionSummary> &transactions);

/// Whether the transaction was taken back, by itself or by a later one.
bool isUndone(const TransactionSummary &transaction, const std::vector<TransactionSummary> &transactions);
