#include "runoutput.h"

#include <cstdio>

#include <nlohmann/json.hpp>

#include "table.h"
#include "text.h"

namespace {

using Json = nlohmann::ordered_json;

Json orNull(const std::string &text) {
  return text.empty() ? Json(nullptr) : Json(jsonText(text));
}

template <class Number>
Json orNull(const std::optional<Number> &number) {
  return number ? Json(*number) : Json(nullptr);
}

std::string orDash(const std::string &text) {
  return text.empty() ? "-" : terminalText(text);
}

template <class Number>
std::string orDash(const std::optional<Number> &number) {
  return number ? std::to_string(*number) : "-";
}

std::string remarkOf(const LogRun &run) {
  if (run.isMixed)
    return "mixed with another run";
  if (run.number == 0)
    return "start is lost";
  return run.hasEnded ? "" : "did not end";
}

std::string commandText(const LogChild &child) {
  std::string text;
  for (const std::string &word : child.words)
    text += (text.empty() ? "" : " ") + (word.empty() ? "''" : terminalText(word));
  return text;
}

/// The installer asks ps about every process of the run information; that is of no interest to a reader.
bool isQuestionToPs(const LogChild &child) {
  return !child.words.empty() && (child.words.front() == "ps" || child.words.back().rfind("ps -ef", 0) == 0);
}

} // namespace

nlohmann::ordered_json runDocument(const DatedRun &dated) {
  const LogRun &run = dated.run;
  return {{"number", run.number},
          {"user", orNull(run.user)},
          {"pid", orNull(run.pid)},
          {"host", orNull(run.host)},
          {"action", orNull(run.action)},
          {"path", orNull(run.path)},
          {"status", orNull(run.status)},
          {"ended", run.hasEnded},
          {"mixed", run.isMixed},
          {"errors", run.errors},
          {"lines", run.lines},
          {"strays", run.strays},
          {"date", orNull(dated.date.day)},
          {"dateFrom", dated.date.day.empty()
                           ? Json(nullptr)
                           : Json("patchlogs/patches.hist, line " + std::to_string(dated.date.line))},
          {"time", orNull(clockText(run.time))},
          {"seconds", run.seconds}};
}

nlohmann::ordered_json stepDocument(const LogStep &step) {
  return {{"patch", jsonText(step.patch)},        {"step", step.name},
          {"time", orNull(clockText(step.time))}, {"seconds", step.seconds},
          {"result", resultName(step.result)},    {"files", step.files}};
}

nlohmann::ordered_json childDocument(const LogChild &child) {
  Json words = Json::array();
  for (const std::string &word : child.words)
    words.push_back(jsonText(word));
  return {{"command", words},
          {"step", orNull(child.step)},
          {"time", orNull(clockText(child.time))},
          {"seconds", child.seconds},
          {"status", orNull(child.status)}};
}

nlohmann::ordered_json messageDocument(const LogMessage &message) {
  return {{"level", levelName(message.level)},        {"time", orNull(clockText(message.time))},
          {"component", jsonText(message.component)}, {"line", message.line},
          {"text", jsonText(message.text)},           {"omitted", message.omitted}};
}

std::vector<std::string> runHeading() {
  return {"RUN", "DATE", "TIME", "USER", "PID", "ACTION", "STATUS", "ERRORS", "LINES", "REMARK", "PATH"};
}

std::vector<std::string> runCells(const DatedRun &dated) {
  const LogRun &run = dated.run;
  return {std::to_string(run.number),
          orDash(dated.date.day),
          orDash(clockText(run.time)),
          orDash(run.user),
          orDash(run.pid),
          orDash(run.action),
          orDash(run.status),
          std::to_string(run.errors),
          std::to_string(run.lines),
          remarkOf(run),
          orDash(run.path)};
}

void printRun(const DatedRun &dated) {
  const LogRun &run = dated.run;
  printf("run %zu: %s %s\n", run.number, orDash(run.action).c_str(), orDash(run.path).c_str());
  printf("  by %s on %s, process %s\n", orDash(run.user).c_str(), orDash(run.host).c_str(),
         orDash(run.pid).c_str());
  if (dated.date.day.empty())
    printf("  day not known, %s\n", orDash(clockText(run.time)).c_str());
  else
    printf("  %s (by line %zu of patches.hist), %s\n", dated.date.day.c_str(), dated.date.line,
           orDash(clockText(run.time)).c_str());
  const std::string remark = remarkOf(run);
  printf("  status %s, %ld s, %zu errors, %zu lines%s%s\n", orDash(run.status).c_str(), run.seconds,
         run.errors, run.lines, remark.empty() ? "" : "; ", remark.c_str());
}

void printSteps(const std::vector<LogStep> &steps) {
  Table table({"STEP", "TIME", "SECONDS", "RESULT", "FILES", "PATCH"});
  for (const LogStep &step : steps)
    table.add({step.name, orDash(clockText(step.time)), std::to_string(step.seconds), resultName(step.result),
               step.files == 0 ? "" : std::to_string(step.files), orDash(step.patch)});
  if (!table.isEmpty())
    printf("\n");
  table.print();
}

void printChildren(const std::vector<LogChild> &children) {
  Table table({"PROGRAM IN", "TIME", "SECONDS", "STATUS", "COMMAND"});
  for (const LogChild &child : children)
    if (!isQuestionToPs(child))
      table.add({orDash(child.step), orDash(clockText(child.time)), std::to_string(child.seconds),
                 orDash(child.status), commandText(child)});
  if (!table.isEmpty())
    printf("\n");
  table.print();
}

void printMessage(const LogMessage &message, const std::string &indent) {
  std::string text = message.text;
  text.erase(text.find_last_not_of('\n') + 1);
  printf("%s%s %s (%s,%ld): ", indent.c_str(), levelName(message.level),
         orDash(clockText(message.time)).c_str(), terminalText(message.component).c_str(), message.line);
  for (std::size_t end = text.find('\n'); end != std::string::npos; end = text.find('\n')) {
    printf("%s\n%s  ", terminalText(text.substr(0, end)).c_str(), indent.c_str());
    text.erase(0, end + 1);
  }
  printf("%s\n", terminalText(text).c_str());
  if (message.omitted > 0)
    printf("%s  (%zu bytes more)\n", indent.c_str(), message.omitted);
}

const char *resultName(StepResult result) {
  switch (result) {
  case StepResult::Passed:
    return "passed";
  case StepResult::Failed:
    return "failed";
  default:
    return "open";
  }
}
