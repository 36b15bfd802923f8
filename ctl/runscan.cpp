#include "runscan.h"

#include <utility>

#include "judgement.h"
#include "logfile.h"

namespace {

/// Keeps the day of the run at work: none when its attempts do not agree.
class DatedEvents : public RunEvents {
public:
  explicit DatedEvents(const RunDates &dates) : dates_(dates) {}

  void onRunBegan(const LogRun &run) override {
    user_ = run.user;
    date_ = {};
    disagrees_ = false;
  }

  void onAttempt(const LogAttempt &attempt) override {
    const RunDate found = dates_.dateOf(attempt, user_);
    if (date_.day.empty())
      date_ = found;
    else if (!found.day.empty() && found.day != date_.day)
      disagrees_ = true;
  }

protected:
  DatedRun dated(const LogRun &run) const {
    // The attempts of another run may be among those of a mixed one.
    return {run, disagrees_ || run.isMixed ? RunDate() : date_};
  }

private:
  const RunDates &dates_;
  std::string user_;
  RunDate date_;
  bool disagrees_ = false;
};

class Visitor : public DatedEvents {
public:
  Visitor(const RunDates &dates, const std::function<void(const DatedRun &)> &visit)
      : DatedEvents(dates), visit_(visit) {}

  void onRunEnded(const LogRun &run) override { visit_(dated(run)); }

private:
  const std::function<void(const DatedRun &)> &visit_;
};

class Finder : public DatedEvents {
public:
  Finder(const RunDates &dates, std::size_t number) : DatedEvents(dates), number_(number) {}

  bool hasFound() const { return hasFound_; }
  RunDetails &found() { return found_; }

  void onRunBegan(const LogRun &run) override {
    DatedEvents::onRunBegan(run);
    // The one before it ends here, if it is the one that is looked for.
    if (hasFound_ && found_.end == 0)
      found_.end = run.offset;
    current_ = {};
  }

  void onStepEnded(const LogStep &step) override { current_.steps.push_back(step); }
  void onChildEnded(const LogChild &child) override { current_.children.push_back(child); }

  void onRunEnded(const LogRun &run) override {
    if (number_ != LastRun && number_ != run.number)
      return;
    hasFound_ = true;
    found_ = std::exchange(current_, {});
    found_.dated = dated(run);
  }

private:
  std::size_t number_;
  bool hasFound_ = false;
  RunDetails found_;
  RunDetails current_;
};

class MessageVisitor : public RunEvents {
public:
  explicit MessageVisitor(const std::function<void(const LogMessage &)> &visit) : visit_(visit) {}
  void onMessage(const LogMessage &message) override { visit_(message); }

private:
  const std::function<void(const LogMessage &)> &visit_;
};

} // namespace

void eachRun(const InputFile &log, std::uint64_t size, const RunDates &dates,
             const std::function<void(const DatedRun &)> &visit) {
  Visitor visitor(dates, visit);
  RunLog runs(visitor);
  feedLog(log, 0, size, runs);
  runs.finish();
}

RunDetails findRun(const InputFile &log, std::uint64_t size, const RunDates &dates, std::size_t number) {
  Finder finder(dates, number);
  RunLog runs(finder);
  feedLog(log, 0, size, runs);
  runs.finish();
  if (!finder.hasFound())
    throw JudgementError(number == LastRun ? "the log holds no run"
                                           : "the log holds no run " + std::to_string(number));
  if (finder.found().end == 0)
    finder.found().end = size;
  return std::move(finder.found());
}

void eachMessage(const InputFile &log, const RunDetails &details,
                 const std::function<void(const LogMessage &)> &visit) {
  MessageVisitor visitor(visit);
  RunLog runs(visitor, details.dated.run.offset);
  feedLog(log, details.dated.run.offset, details.end, runs);
  runs.finish();
}
