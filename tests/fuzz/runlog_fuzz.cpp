// The log of a home, any bytes: its runs are the same however the bytes come, and every event can be printed.
#include <algorithm>

#include <nlohmann/json.hpp>

#include "fuzz.h"
#include "runlog.h"
#include "runoutput.h"

namespace {

/// Writes every event down, and holds what must be true of each.
class Events : public RunEvents {
public:
  explicit Events(const std::string &input) : input_(input) {}

  const std::string &told() const { return told_; }
  bool isBalanced() const { return runs_ == 0 && steps_ == 0; }

  void onRunBegan(const LogRun &run) override {
    REQUIRE(runs_++ == 0);
    REQUIRE(run.number == 0 ? run.offset == 0
                            : fuzz::startsWith(input_.substr(run.offset), std::string(78, '=')));
    REQUIRE(run.number == 0 || run.number == last_ + 1);
    REQUIRE((run.number == 0) == !run.pid);
    last_ = run.number;
    lines_ = 0;
  }

  void onRunEnded(const LogRun &run) override {
    REQUIRE(--runs_ == 0 && steps_ == 0);
    REQUIRE(run.lines == lines_ && run.errors <= run.lines);
    REQUIRE(run.hasEnded || !run.status);
    REQUIRE(!run.isMixed || run.hasEnded);
    tell(runDocument({run, {}}));
    told_ += runCells({run, {}}).back();
  }

  void onVerdict(const LogRun &run) override { REQUIRE(runs_ == 1 && run.hasEnded); }
  void onStepBegan(const LogStep &step) override {
    REQUIRE(steps_++ == 0);
    name_ = step.name;
  }

  void onStepEnded(const LogStep &step) override {
    REQUIRE(--steps_ == 0 && step.name == name_);
    REQUIRE(step.seconds >= 0);
    tell(stepDocument(step));
  }

  void onChildEnded(const LogChild &child) override {
    REQUIRE(child.seconds >= 0);
    tell(childDocument(child));
  }

  void onMessage(const LogMessage &message) override {
    ++lines_;
    REQUIRE(message.text.size() <= LogReader::LongestMessage);
    REQUIRE(message.time >= -1 && message.time < 24 * 3600);
    REQUIRE(message.omitted > 0 || message.text.empty() || fuzz::contains(input_, message.text));
    tell(messageDocument(message));
  }

  void onFileMoved(const std::string &path) override { told_ += "moved " + path + "\n"; }
  void onAttempt(const LogAttempt &attempt) override { told_ += "attempt " + attempt.patch + "\n"; }

private:
  /// A text that is no UTF-8 could not be dumped.
  void tell(const nlohmann::ordered_json &document) { told_ += document.dump() + "\n"; }

  const std::string &input_;
  std::string told_;
  std::string name_;
  int runs_ = 0;
  int steps_ = 0;
  std::size_t last_ = 0;
  std::size_t lines_ = 0;
};

std::string readInPieces(const std::string &input, std::size_t piece, bool settles) {
  Events events(input);
  RunLog log(events);
  for (std::size_t at = 0; at < input.size(); at += piece) {
    log.feed(std::string_view(input).substr(at, piece));
    if (settles)
      log.settle();
  }
  log.finish();
  REQUIRE(events.isBalanced());
  return events.told();
}

} // namespace

void check(const std::string &input) {
  const std::string whole = readInPieces(input, std::max<std::size_t>(input.size(), 1), false);
  REQUIRE(readInPieces(input, 1, false) == whole);
  REQUIRE(readInPieces(input, 80, false) == whole);
  // Settled in the middle of a message, its other lines are strays: only that nothing breaks.
  static_cast<void>(readInPieces(input, 50, true));
}
