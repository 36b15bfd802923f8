// How far a transaction is. On a terminal one line that is written over: the step, of the installer's steps
// the one at work, files moved of all, and the time left. Elsewhere a line a step.
//
// What the installer does is taken from its log while it runs. A log that cannot be followed takes nothing
// but the details: no transaction ends for it.
#pragma once

#include <chrono>
#include <cstddef>
#include <cstdio>
#include <memory>
#include <optional>
#include <string>

#include "logfile.h"
#include "runlog.h"

/// Seconds until all is done, when so much took so long; none before that says anything.
std::optional<long> secondsLeft(std::size_t done, std::size_t all, double seconds);

class Progress : private RunEvents {
public:
  /// `home` ends in "/". `isLive`: the stream is a terminal.
  Progress(const std::string &home, FILE *stream, bool isLive);
  Progress(const Progress &) = delete;
  Progress &operator=(const Progress &) = delete;
  ~Progress() override { wipe(); }

  /// How many files the patches bring.
  void expect(std::size_t files) { files_ = files; }
  /// A step begins; the one before it has ended.
  void begin(const std::string &step);
  /// Something may have happened.
  void poll();
  /// Nothing more comes: the line goes.
  void end();

private:
  void onStepBegan(const LogStep &step) override;
  void onFileMoved(const std::string &path) override;
  void follow();
  void show();
  void wipe();
  std::string line() const;

  std::string home_;
  FILE *stream_;
  bool isLive_;
  std::string step_;
  std::string part_; ///< the installer's step
  std::size_t files_ = 0;
  std::size_t moved_ = 0;
  bool isMoving_ = false;
  /// When the first files of the step were seen to be moved, and how many that were: before them the
  /// installer waits for the disk.
  std::optional<std::chrono::steady_clock::time_point> movingSince_;
  std::size_t movedBefore_ = 0;
  std::size_t shown_ = 0; ///< length of the line on the terminal
  std::unique_ptr<RunLog> log_;
  std::unique_ptr<LogFollower> follower_;
};
