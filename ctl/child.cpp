#include "child.h"

#include <algorithm>
#include <cerrno>
#include <csignal>
#include <cstring>
#include <thread>

#include <fcntl.h>
#include <spawn.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include "filedescriptor.h"
#include "judgement.h"
#include "memoryfile.h"
#include "signals.h"
#include "utilities.h"

namespace {

[[noreturn]] void cannotReadOutput() {
  throw JudgementError(std::string("cannot read the output of a program: ") + strerror(errno));
}

/// A file in memory that a child writes to.
class Capture {
public:
  Capture() : fd_(memoryFile("output")) {
    if (fd_ < 0)
      throw JudgementError(std::string("no memory for the output of a program: ") + strerror(errno));
  }
  Capture(const Capture &) = delete;
  Capture &operator=(const Capture &) = delete;
  ~Capture() { close(fd_); }

  int fd() const { return fd_; }
  std::string text() const {
    struct stat status = {};
    if (fstat(fd_, &status) != 0)
      cannotReadOutput();
    std::string content(static_cast<std::size_t>(status.st_size), '\0');
    std::size_t filled = 0;
    while (filled < content.size()) {
      const ssize_t count =
          pread(fd_, content.data() + filled, content.size() - filled, static_cast<off_t>(filled));
      if (count == 0)
        break;
      if (count < 0 && errno != EINTR)
        cannotReadOutput();
      filled += count < 0 ? 0 : static_cast<std::size_t>(count);
    }
    content.resize(filled);
    return content;
  }

private:
  int fd_;
};

std::vector<char *> pointers(std::vector<std::string> &texts) {
  std::vector<char *> list;
  list.reserve(texts.size() + 1);
  for (std::string &text : texts)
    list.push_back(text.data());
  list.push_back(nullptr);
  return list;
}

/// What the child's descriptors and signals are: set up before, released after the start.
class SpawnSetup {
public:
  SpawnSetup(int out, int err, bool ownSession) {
    posix_spawn_file_actions_init(&files_);
    posix_spawn_file_actions_addopen(&files_, STDIN_FILENO, "/dev/null", O_RDONLY, 0);
    posix_spawn_file_actions_adddup2(&files_, out, STDOUT_FILENO);
    posix_spawn_file_actions_adddup2(&files_, err, STDERR_FILENO);
    sigset_t all;
    sigset_t none;
    sigfillset(&all);
    sigemptyset(&none);
    posix_spawnattr_init(&attributes_);
    posix_spawnattr_setsigdefault(&attributes_, &all);
    posix_spawnattr_setsigmask(&attributes_, &none);
    const int flags = POSIX_SPAWN_SETSIGDEF | POSIX_SPAWN_SETSIGMASK | (ownSession ? POSIX_SPAWN_SETSID : 0);
    posix_spawnattr_setflags(&attributes_, static_cast<short>(flags));
  }
  SpawnSetup(const SpawnSetup &) = delete;
  SpawnSetup &operator=(const SpawnSetup &) = delete;
  ~SpawnSetup() {
    posix_spawn_file_actions_destroy(&files_);
    posix_spawnattr_destroy(&attributes_);
  }

  const posix_spawn_file_actions_t *files() const { return &files_; }
  const posix_spawnattr_t *attributes() const { return &attributes_; }

private:
  posix_spawn_file_actions_t files_ = {};
  posix_spawnattr_t attributes_ = {};
};

int exitStatus(int status) {
  return WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
}

int statusOf(pid_t child) {
  int status = 0;
  while (waitpid(child, &status, 0) < 0)
    if (errno != EINTR)
      return 127;
  return exitStatus(status);
}

/// Waits for the end, without taking the status; false when the time is over, or an interruption comes,
/// before. A wait in the system would not see the interruption that comes just before it.
bool endsWithin(pid_t child, std::chrono::seconds limit) {
  using Clock = std::chrono::steady_clock;
  const auto end = limit.count() == 0 ? Clock::time_point::max() : Clock::now() + limit;
  auto pause = std::chrono::microseconds(200);
  siginfo_t info = {};
  for (;;) {
    const int result = waitid(P_PID, static_cast<id_t>(child), &info, WEXITED | WNOWAIT | WNOHANG);
    if (result == 0 ? info.si_pid != 0 : errno != EINTR)
      return true;
    if (Clock::now() > end || wasInterrupted())
      return false;
    std::this_thread::sleep_for(pause);
    pause = std::min(2 * pause, std::chrono::microseconds(20000));
  }
}

/// 0, or why the program was not started.
int start(const std::string &program, const std::vector<std::string> &words,
          const ChildEnvironment &environment, const SpawnSetup &setup, pid_t &child) {
  std::vector<std::string> arguments = words;
  std::vector<std::string> variables = environment.variables;
  variables.push_back("PATH=" + environment.path);
  return posix_spawn(&child, program.c_str(), setup.files(), setup.attributes(), pointers(arguments).data(),
                     pointers(variables).data());
}

/// The command as a shell's that changes the directory first: the C libraries of older systems cannot start a
/// program elsewhere.
std::vector<std::string> inDirectory(const std::string &directory, const std::string &program,
                                     const std::vector<std::string> &words) {
  std::vector<std::string> command = {"sh", "-c", R"(cd -- "$0" && exec "$@")", directory, program};
  command.insert(command.end(), words.begin() + 1, words.end());
  return command;
}

} // namespace

ChildResult runChild(const std::vector<std::string> &words, const ChildEnvironment &environment) {
  const std::string program = findProgram(words.front(), environment.path);
  if (program.empty())
    return {127, "", words.front() + ": not found\n", true};
  const Capture out;
  const Capture err;
  const SpawnSetup setup(out.fd(), err.fd(), false);
  pid_t child = 0;
  const int error =
      environment.directory.empty()
          ? start(program, words, environment, setup, child)
          : start("/bin/sh", inDirectory(environment.directory, program, words), environment, setup, child);
  if (error == EAGAIN || error == ENOMEM)
    throw JudgementError("cannot run " + program + ": " + strerror(error));
  if (error != 0)
    return {127, "", program + ": " + strerror(error) + "\n", true};
  const bool isInTime = endsWithin(child, environment.limit);
  if (!isInTime)
    kill(child, SIGKILL);
  const int status = statusOf(child);
  stopIfInterrupted();
  return {status, out.text(), err.text(), isInTime};
}

BackgroundChild::BackgroundChild(const std::vector<std::string> &words, const ChildEnvironment &environment,
                                 const std::string &outFile, const std::string &errFile) {
  const FileDescriptor out(outFile.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_NOFOLLOW);
  const FileDescriptor err(errFile.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_NOFOLLOW);
  if (!out.isOpen() || !err.isOpen())
    throw JudgementError("cannot write " + outFile + ": " + strerror(errno));
  const SpawnSetup setup(out.get(), err.get(), true);
  const int error = start(words.front(), words, environment, setup, child_);
  if (error != 0)
    throw JudgementError("cannot run " + words.front() + ": " + strerror(error));
}

bool BackgroundChild::hasEnded(int milliseconds) {
  for (int waited = 0; child_ != 0; waited += 10) {
    int status = 0;
    const pid_t ended = waitpid(child_, &status, WNOHANG);
    if (ended != 0 && !(ended < 0 && errno == EINTR)) {
      status_ = ended < 0 ? 127 : exitStatus(status);
      child_ = 0;
    } else if (waited >= milliseconds) {
      return false;
    } else {
      usleep(10000);
    }
  }
  return true;
}

std::string findProgram(const std::string &name, const std::string &path) {
  if (name.find('/') != std::string::npos)
    return access(name.c_str(), X_OK) == 0 ? name : "";
  for (const std::string &directory : Util::tokenizeString(path, ":")) {
    std::string program = directory;
    program.append("/").append(name);
    struct stat status = {};
    if (stat(program.c_str(), &status) == 0 && S_ISREG(status.st_mode) && access(program.c_str(), X_OK) == 0)
      return program;
  }
  return "";
}
