// log: orvpatch.log cut into runs; one run with its steps, programs and errors; a run at work.
#include <chrono>
#include <cstdio>
#include <string>
#include <thread>

#include <CLI/CLI.hpp>
#include <nlohmann/json.hpp>

#include "commands/command.h"
#include "commands/commands.h"
#include "home.h"
#include "logfile.h"
#include "runoutput.h"
#include "runprocess.h"
#include "table.h"

namespace {

using Json = nlohmann::ordered_json;

struct LogOptions {
  std::string run; ///< a number, "last", or empty for a list
  bool errors = false;
  bool steps = false;
  bool follow = false;
};

/// What one call works on: the log as it was when it began, so that two looks at it see the same.
struct Log {
  Log(const Home &home, const LogOptions &chosen, const OutputOptions &form)
      : path(logPath(home.path())), file(path), size(file.size()), dates(readHistory(home.path())),
        options(chosen), output(form) {
    if (!file.exists())
      throw JudgementError("there is no log: " + path);
  }

  std::string path;
  InputFile file;
  std::uint64_t size;
  RunDates dates;
  LogOptions options;
  OutputOptions output;
};

bool isListed(const LogOptions &options, const DatedRun &dated) {
  return !options.errors || dated.run.errors > 0;
}

void listAsDocument(const Log &log) {
  // All is read once before the first byte is written; a document of a million runs is not held in memory.
  eachRun(log.file, log.size, log.dates, [](const DatedRun &) {});
  const char *before = "\n    ";
  printf("{\n  \"runs\": [");
  eachRun(log.file, log.size, log.dates, [&](const DatedRun &dated) {
    if (isListed(log.options, dated)) {
      printf("%s%s", before, runDocument(dated).dump().c_str());
      before = ",\n    ";
    }
  });
  printf("\n  ]\n}\n");
}

void list(const Log &log) {
  Columns columns(runHeading());
  std::size_t count = 0;
  eachRun(log.file, log.size, log.dates, [&](const DatedRun &dated) {
    if (isListed(log.options, dated)) {
      columns.measure(runCells(dated));
      ++count;
    }
  });
  if (count == 0) {
    printf("No runs.\n");
    return;
  }
  columns.printHeading();
  eachRun(log.file, log.size, log.dates, [&](const DatedRun &dated) {
    if (isListed(log.options, dated))
      columns.print(runCells(dated));
  });
}

bool isShown(const LogOptions &options, const LogMessage &message) {
  return options.errors ? message.level == LogLevel::Error : !options.steps;
}

template <class Item>
Json listOf(const std::vector<Item> &items, Json (*document)(const Item &)) {
  Json list = Json::array();
  for (const Item &item : items)
    list.push_back(document(item));
  return list;
}

/// The run's own fields, its steps and programs, then its messages as they are read.
void showAsDocument(const Log &log, const RunDetails &details) {
  Json document = runDocument(details.dated);
  document["steps"] = listOf<LogStep>(details.steps, stepDocument);
  document["children"] = listOf<LogChild>(details.children, childDocument);
  std::string text = document.dump(2);
  text.erase(text.rfind("\n}"));
  printf("%s,\n  \"messages\": [", text.c_str());
  const char *before = "\n    ";
  eachMessage(log.file, details, [&](const LogMessage &message) {
    if (isShown(log.options, message)) {
      printf("%s%s", before, messageDocument(message).dump().c_str());
      before = ",\n    ";
    }
  });
  printf("\n  ]\n}\n");
}

void printErrors(const Log &log, const RunDetails &details) {
  if (details.dated.run.errors == 0)
    return;
  printf("\nErrors\n");
  eachMessage(log.file, details, [](const LogMessage &message) {
    if (message.level == LogLevel::Error)
      printMessage(message, "  ");
  });
}

void show(const Log &log, const RunDetails &details) {
  if (log.output.json) {
    showAsDocument(log, details);
    return;
  }
  const bool all = log.options.steps == log.options.errors;
  printRun(details.dated);
  if (all || log.options.steps) {
    printSteps(details.steps);
    printChildren(details.children);
  }
  if (all || log.options.errors)
    printErrors(log, details);
}

/// Prints what happens in a run at work, a line for each step that ends and for each error.
class Progress : public RunEvents {
public:
  explicit Progress(const OutputOptions &output) : palette_(output), isQuiet_(output.json) {}

  bool isOver() const { return isOver_; }
  const LogRun &ended() const { return ended_; } ///< the run, once it is over

  void onStepEnded(const LogStep &step) override {
    if (isQuiet_)
      return;
    const std::string result = resultName(step.result);
    const std::string files = step.files == 0 ? "" : ", " + std::to_string(step.files) + " files";
    printf("%s  %-22s %s, %ld s%s\n", clockText(step.time).c_str(), step.name.c_str(),
           (step.result == StepResult::Failed ? palette_.error(result) : result).c_str(), step.seconds,
           files.c_str());
  }

  void onMessage(const LogMessage &message) override {
    if (!isQuiet_ && message.level == LogLevel::Error)
      printMessage(message, "");
  }

  void onVerdict(const LogRun &run) override { end(run); }
  /// Another one begins: from here on it cannot be told what this one writes.
  void onRunEnded(const LogRun &run) override { end(run); }

private:
  void end(const LogRun &run) {
    if (!isOver_)
      ended_ = run;
    isOver_ = true;
  }

  Palette palette_;
  bool isQuiet_;
  bool isOver_ = false;
  LogRun ended_;
};

/// Waits for the verdict of the run, or for the end of its process; the run as it then is.
LogRun waitFor(const Log &log, const LogRun &run) {
  constexpr std::chrono::milliseconds Interval(200);
  Progress progress(log.output);
  RunLog runs(progress, run.offset, run.number == 0 ? 0 : run.number - 1);
  LogFollower follower(log.path, run.offset);
  for (bool isAtWork = true; !progress.isOver();) {
    const bool hasMore = follower.poll(runs);
    runs.settle();
    fflush(stdout);
    if (hasMore)
      continue;
    if (!isAtWork)
      break;
    // What it wrote last may have come since: one more look after its end.
    isAtWork = run.pid && isStillAtWork(*run.pid, follower.modified());
    if (isAtWork)
      std::this_thread::sleep_for(Interval);
  }
  return progress.isOver() ? progress.ended() : runs.run();
}

void follow(const Home &home, const LogOptions &options, Invocation &invocation) {
  const Log before(home, options, invocation.output);
  LogRun run = findRun(before.file, before.size, before.dates, LastRun).dated.run;
  const bool wasAtWork = !run.hasEnded;
  if (wasAtWork)
    run = waitFor(before, run);
  if (wasAtWork && !invocation.output.json) {
    printRun({run, {}});
  } else {
    const Log log(home, options, invocation.output);
    show(log, findRun(log.file, log.size, log.dates, run.number));
  }
  invocation.status = run.hasEnded && run.status == 0 ? Good : Findings;
}

std::size_t numberOf(const std::string &text) {
  return text == "last" ? LastRun : static_cast<std::size_t>(std::stoul(text));
}

void log(const std::string &path, const LogOptions &options, Invocation &invocation) {
  const Home home(path);
  if (options.follow) {
    follow(home, options, invocation);
    return;
  }
  const Log log(home, options, invocation.output);
  if (!options.run.empty() || options.steps)
    show(log, findRun(log.file, log.size, log.dates, numberOf(options.run.empty() ? "last" : options.run)));
  else if (invocation.output.json)
    listAsDocument(log);
  else
    list(log);
}

std::string checkRun(const std::string &text) {
  const bool isNumber =
      !text.empty() && text.size() < 10 && text.find_first_not_of("0123456789") == std::string::npos;
  return isNumber || text == "last" ? "" : "no number of a run, nor \"last\": " + text;
}

} // namespace

void addLog(CLI::App &application, Invocation &invocation) {
  CLI::App *const command =
      addCommand(application, invocation, "log",
                 "Print the runs of the log, or one with its steps, programs and errors");
  const std::shared_ptr<std::string> path = addHome(*command);
  const auto options = std::make_shared<LogOptions>();
  CLI::Option *const run = command->add_option("run", options->run, "Number of a run, or last")
                               ->check(CLI::Validator(checkRun, "", "run"))
                               ->option_text("[RUN]");
  command->add_flag("--errors", options->errors,
                    "Of a run only its errors; of the list only runs with errors");
  command->add_flag("--steps", options->steps, "Of a run, the last one if none is given, only its steps");
  command->add_flag("--follow", options->follow, "Follow the last run until it ends")->excludes(run);
  command->callback([path, options, &invocation] { log(*path, *options, invocation); });
}
