// history: the attempts to install patches in a home, with what was taken back.
#include <algorithm>
#include <cstdio>
#include <string>
#include <vector>

#include <CLI/CLI.hpp>
#include <nlohmann/json.hpp>

#include "commands/command.h"
#include "commands/commands.h"
#include "history.h"
#include "home.h"
#include "table.h"
#include "text.h"
#include "transactionlist.h"
#include "utilities.h"

namespace {

using Json = nlohmann::ordered_json;

struct HistoryOptions {
  std::string product; ///< empty for all
  bool failedOnly = false;
  std::string since; ///< "YYYY-MM-DD"; empty for all
};

/// A record without a time is no younger than any day.
bool isWanted(const HistoryRecord &record, const HistoryOptions &options) {
  return (options.product.empty() ||
          Util::toLower(record.product) == Util::normalizeProductCode(options.product)) &&
         (!options.failedOnly || record.result == "FAIL") && dayOf(record) >= options.since;
}

Json documentOf(const HistoryRecord &record, const std::vector<TransactionSummary> &transactions) {
  const TransactionSummary *const transaction = transactionOf(record, transactions);
  return {{"product", jsonText(record.product)},
          {"platform", jsonText(record.platform)},
          {"target", jsonText(record.target)},
          {"name", jsonText(record.name)},
          {"result", record.result},
          {"user", jsonText(record.user)},
          {"time", record.time.empty() ? Json(nullptr) : Json(record.time)},
          {"transaction", transaction == nullptr ? Json(nullptr) : Json(jsonText(transaction->id))},
          {"undone", transaction != nullptr && isUndone(*transaction, transactions)},
          {"line", record.line}};
}

Json documentOf(const std::vector<HistoryRecord> &records, const std::vector<ForeignLine> &foreign,
                const std::vector<TransactionSummary> &transactions) {
  Json list = Json::array();
  for (const HistoryRecord &record : records)
    list.push_back(documentOf(record, transactions));
  Json others = Json::array();
  for (const ForeignLine &line : foreign)
    others.push_back({{"line", line.line}, {"text", jsonText(line.text)}});
  return {{"records", list}, {"foreign", others}};
}

std::string resultOf(const HistoryRecord &record, const TransactionSummary *transaction,
                     const std::vector<TransactionSummary> &transactions) {
  return record.result + (transaction != nullptr && isUndone(*transaction, transactions) ? ", undone" : "");
}

void print(const std::vector<HistoryRecord> &records, const std::vector<ForeignLine> &foreign,
           const std::vector<TransactionSummary> &transactions) {
  Table table({"TIME", "PRODUCT", "PLATFORM", "TARGET", "RESULT", "USER", "TRANSACTION", "NAME"});
  for (const HistoryRecord &record : records) {
    const TransactionSummary *const transaction = transactionOf(record, transactions);
    table.add({record.time.empty() ? "-" : record.time, terminalText(record.product),
               terminalText(record.platform), terminalText(record.target),
               resultOf(record, transaction, transactions), terminalText(record.user),
               transaction == nullptr ? "-" : terminalText(transaction->id), terminalText(record.name)});
  }
  if (table.isEmpty())
    printf("No records.\n");
  table.print();
  for (const ForeignLine &line : foreign)
    printf("line %zu is no record: %s\n", line.line, terminalText(line.text).c_str());
}

void history(const std::string &path, const HistoryOptions &options, const Invocation &invocation) {
  const Home home(path);
  const History read = readHistory(home.path());
  std::vector<HistoryRecord> records;
  std::copy_if(read.records.begin(), read.records.end(), std::back_inserter(records),
               [&options](const HistoryRecord &record) { return isWanted(record, options); });
  const std::vector<TransactionSummary> transactions = readTransactions(home.path());
  if (invocation.output.json)
    printDocument(documentOf(records, read.foreign, transactions));
  else
    print(records, read.foreign, transactions);
}

/// A message for what is no day; empty when it is one.
std::string checkDay(const std::string &text) {
  tm parts = {};
  const char *const end = strptime(text.c_str(), "%Y-%m-%d", &parts);
  char again[16] = "";
  if (end != nullptr && *end == '\0')
    static_cast<void>(strftime(again, sizeof again, "%Y-%m-%d", &parts));
  // A day that the month does not have is moved into the next one by timegm.
  const int day = parts.tm_mday;
  static_cast<void>(timegm(&parts));
  return text == again && parts.tm_mday == day ? "" : "no day of the form YYYY-MM-DD: " + text;
}

} // namespace

void addHistory(CLI::App &application, Invocation &invocation) {
  CLI::App *const command = addCommand(application, invocation, "history",
                                       "Print the attempts to install patches, with what was taken back");
  const std::shared_ptr<std::string> path = addHome(*command);
  const auto options = std::make_shared<HistoryOptions>();
  command->add_option("--product", options->product, "Only patches of this product: kyn or yn")
      ->option_text("CODE");
  command->add_flag("--failed", options->failedOnly, "Only attempts that failed");
  command->add_option("--since", options->since, "Only attempts of this day and later: 2026-03-09")
      ->check(CLI::Validator(checkDay, "", "day"))
      ->option_text("DATE");
  command->callback([path, options, &invocation] { history(*path, *options, invocation); });
}
