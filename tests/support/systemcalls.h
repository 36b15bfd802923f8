// Replacements for system calls, in the test program that wrapped.cmake links with them. Each records the
// call and passes it on to the system, unless a test makes it fail.
#pragma once

#include <cstddef>
#include <string>
#include <vector>

#include <sys/types.h>

#include "scratch.h"

/// When a call fails; without any condition, always.
class PlannedFailure {
public:
  PlannedFailure(std::string call, int errorNumber) : call_(std::move(call)), errorNumber_(errorNumber) {}

  /// Only for this object of the call: its (first) path, the user id, the descriptor that dup2 replaces, or
  /// the command of fcntl.
  PlannedFailure &on(std::string object) {
    object_ = std::move(object);
    return *this;
  }
  /// So many calls still succeed.
  PlannedFailure &after(int calls) {
    after_ = calls;
    return *this;
  }
  /// So many calls fail, those that follow succeed.
  PlannedFailure &times(int calls) {
    times_ = calls;
    return *this;
  }

  /// Whether this call of this object is one of those that fail; sets errno when it is.
  bool strikes(const std::string &call, const std::string &object);

private:
  std::string call_;
  int errorNumber_;
  std::string object_;
  int after_ = 0;
  int times_ = -1;
};

/// Lets a call fail from now on. Calls with a pointer as their result yield null.
PlannedFailure &failCall(const std::string &call, int errorNumber);
/// Lets an allocation of exactly this size fail.
void failAllocationOf(std::size_t size);
/// Lets reads and writes transfer at most so many bytes each.
void limitTransfers(std::size_t bytes);
/// Lets reads find the end of the file after so many bytes in all.
void endReadsAfter(std::size_t bytes);
/// Results of getuid, getpwuid, time and uname.
void answerUser(uid_t user);
void answerUserName(const std::string &name);
void answerTime(time_t now);
void answerNodeName(const std::string &name);
/// Restores the system's behaviour of every call and forgets the recorded calls.
void restoreSystemCalls();

/// The names of the calls since the last restoring, in order, as far as they are among these.
std::vector<std::string> callsAmong(const std::vector<std::string> &names);
/// How often a call was made since then: at all, or for one object.
int callsOf(const std::string &name, const std::string &object = "");

/// Fixture for tests that let system calls fail.
class SystemCallTest : public ScratchHome {
protected:
  void SetUp() override {
    ScratchHome::SetUp();
    restoreSystemCalls();
  }
  void TearDown() override {
    restoreSystemCalls();
    ScratchHome::TearDown();
  }
};
