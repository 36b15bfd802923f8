#include "transaction/summary.h"

#include <algorithm>

#include "text.h"

namespace {

std::size_t replacedFiles(const Record &record) {
  return static_cast<std::size_t>(
      std::count_if(record.files.begin(), record.files.end(),
                    [](const TouchedFile &file) { return file.before.has_value(); }));
}

void printPatches(const Record &record, FILE *stream) {
  for (const RecordedPatch &patch : record.patches)
    fprintf(stream, "  %-8s %-5s %s -> %s  %s  %s\n", terminalText(patch.product).c_str(),
            patch.target.c_str(), patch.levelBefore.c_str(), patch.levelAfter.c_str(),
            terminalText(patch.name).c_str(), patch.result.c_str());
}

} // namespace

void printPlan(const Record &record, FILE *stream) {
  printPatches(record, stream);
  for (const RecordedInstance &instance : record.before)
    if (std::find(record.dependents.begin(), record.dependents.end(), instance.product) !=
        record.dependents.end())
      fprintf(stream, "  stops    %s %s\n", terminalText(instance.product).c_str(),
              terminalText(instance.name).c_str());
  fprintf(stream, "  files    %zu new, %zu replaced\n", record.files.size() - replacedFiles(record),
          replacedFiles(record));
}

void printRecord(const Record &record, const OutputOptions &options) {
  const Palette palette(options);
  const bool isGood = record.verdict == "applied" || (record.verdict == "undone" && record.action == "undo");
  if (record.dryRun)
    printPlan(record, stdout);
  printFindings(record.findings, options);
  printf("%s\n", isGood || record.dryRun ? record.verdict.c_str() : palette.error(record.verdict).c_str());
  printPatches(record, stdout);
  for (const Difference &difference : record.differences)
    printf("  %s: %s: %s\n", difference.kind.c_str(), terminalText(difference.path).c_str(),
           terminalText(difference.text).c_str());
  for (const std::string &message : record.messages)
    printf("  %s\n", terminalText(message).c_str());
  if (!record.installer.err.empty())
    printf("%s", record.installer.err.c_str());
  if (record.verdict != "refused")
    printf("record: patchlogs/transactions/%s/record.json\n", record.id.c_str());
}
