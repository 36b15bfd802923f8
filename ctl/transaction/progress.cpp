#include "transaction/progress.h"

#include <algorithm>
#include <cmath>

#include <sys/ioctl.h>

#include "judgement.h"
#include "text.h"

namespace {

std::size_t columnsOf(FILE *stream) {
  winsize window = {};
  return ioctl(fileno(stream), TIOCGWINSZ, &window) == 0 && window.ws_col > 1 ? window.ws_col : 80;
}

std::string minutes(long seconds) {
  const std::string rest = std::to_string(seconds % 60);
  return std::to_string(seconds / 60) + (rest.size() == 1 ? ":0" : ":") + rest;
}

} // namespace

std::optional<long> secondsLeft(std::size_t done, std::size_t all, double seconds) {
  if (done == 0 || seconds < 1)
    return std::nullopt;
  const double rest = all > done ? static_cast<double>(all - done) : 0;
  return std::lround(seconds * rest / static_cast<double>(done));
}

Progress::Progress(const std::string &home, FILE *stream, bool isLive)
    : home_(home), stream_(stream), isLive_(isLive) {}

void Progress::begin(const std::string &step) {
  poll();
  follower_.reset();
  log_.reset();
  step_ = step;
  part_.clear();
  if (step == "install")
    follow();
  if (isLive_)
    show();
  else
    fprintf(stream_, "%s\n", step.c_str());
}

/// From what is in the log now on.
void Progress::follow() {
  try {
    const InputFile file(logPath(home_));
    follower_ = std::make_unique<LogFollower>(logPath(home_), file.exists() ? file.size() : 0);
    log_ = std::make_unique<RunLog>(static_cast<RunEvents &>(*this));
  } catch (const JudgementError &) {
    follower_.reset();
  }
}

void Progress::poll() {
  if (follower_ == nullptr)
    return;
  try {
    static_cast<void>(follower_->poll(*log_));
    log_->settle();
  } catch (const JudgementError &) {
    follower_.reset();
  }
  if (isMoving_ && !movingSince_ && moved_ > movedBefore_) {
    movingSince_ = std::chrono::steady_clock::now();
    movedBefore_ = moved_;
  }
  if (isLive_)
    show();
}

void Progress::onStepBegan(const LogStep &step) {
  isMoving_ = step.name == "moveFiles";
  movingSince_.reset();
  movedBefore_ = moved_;
  part_ = step.name;
  if (!isLive_)
    fprintf(stream_, "%s: %s%s%s\n", step_.c_str(), terminalText(step.patch).c_str(),
            step.patch.empty() ? "" : ": ", part_.c_str());
}

void Progress::onFileMoved(const std::string &) {
  moved_ = std::min(moved_ + 1, files_); // two patches may bring the same file
}

std::string Progress::line() const {
  std::string text = step_ + (part_.empty() ? "" : ": " + part_);
  if (part_.empty() || files_ == 0)
    return text;
  text += ", " + std::to_string(moved_) + " of " + std::to_string(files_) + " files";
  if (!isMoving_ || !movingSince_)
    return text;
  const std::chrono::duration<double> spent = std::chrono::steady_clock::now() - *movingSince_;
  const std::optional<long> left = secondsLeft(moved_ - movedBefore_, files_ - movedBefore_, spent.count());
  return left ? text + ", " + minutes(*left) + " left" : text;
}

/// Writes the line over the one that stands there.
void Progress::show() {
  std::string text = line();
  text.resize(std::min(text.size(), columnsOf(stream_) - 1));
  const std::size_t length = text.size();
  text.resize(std::max(length, shown_), ' ');
  fprintf(stream_, "\r%s", text.c_str());
  fflush(stream_);
  shown_ = length;
}

void Progress::wipe() {
  if (isLive_ && shown_ > 0)
    fprintf(stream_, "\r%*s\r", static_cast<int>(shown_), "");
  fflush(stream_);
  shown_ = 0;
}

void Progress::end() {
  poll();
  follower_.reset();
  log_.reset();
  wipe();
}
