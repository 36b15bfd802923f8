#include "child.h"

#include <algorithm>
#include <cerrno>
#include <csignal>
#include <cstring>
#include <thread>

#include <fcntl.h>
#include <spawn.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include "judgement.h"
#include "utilities.h"

namespace {

/// A file in memory that a child writes to.
class Capture {
public:
  Capture() : fd_(memfd_create("output", MFD_CLOEXEC)) {
    if (fd_ < 0)
      throw JudgementError(std::string("no memory for the output of a program: ") + strerror(errno));
  }
  Capture(const Capture &) = delete;
  Capture &operator=(const Capture &) = delete;
  ~Capture() { close(fd_); }

  int fd() const { return fd_; }
  std::string text() const {
    struct stat status = {};
    std::string content(fstat(fd_, &status) == 0 ? static_cast<std::size_t>(status.st_size) : 0, '\0');
    std::size_t filled = 0;
    while (filled < content.size()) {
      const ssize_t count =
          pread(fd_, content.data() + filled, content.size() - filled, static_cast<off_t>(filled));
      if (count <= 0)
        break;
      filled += static_cast<std::size_t>(count);
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
  SpawnSetup(const Capture &out, const Capture &err, const std::string &directory) {
    posix_spawn_file_actions_init(&files_);
    posix_spawn_file_actions_addopen(&files_, STDIN_FILENO, "/dev/null", O_RDONLY, 0);
    posix_spawn_file_actions_adddup2(&files_, out.fd(), STDOUT_FILENO);
    posix_spawn_file_actions_adddup2(&files_, err.fd(), STDERR_FILENO);
    if (!directory.empty())
      posix_spawn_file_actions_addchdir_np(&files_, directory.c_str());
    sigset_t all;
    sigset_t none;
    sigfillset(&all);
    sigemptyset(&none);
    posix_spawnattr_init(&attributes_);
    posix_spawnattr_setsigdefault(&attributes_, &all);
    posix_spawnattr_setsigmask(&attributes_, &none);
    posix_spawnattr_setflags(&attributes_, POSIX_SPAWN_SETSIGDEF | POSIX_SPAWN_SETSIGMASK);
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

/// Waits for the end, without taking the status; false when the time is over before.
bool hasEnded(pid_t child, std::chrono::seconds limit) {
  const auto end = std::chrono::steady_clock::now() + limit;
  auto pause = std::chrono::microseconds(200);
  siginfo_t info = {};
  while (waitid(P_PID, static_cast<id_t>(child), &info, WEXITED | WNOWAIT | WNOHANG) == 0 &&
         info.si_pid == 0) {
    if (std::chrono::steady_clock::now() > end)
      return false;
    std::this_thread::sleep_for(pause);
    pause = std::min(2 * pause, std::chrono::microseconds(20000));
  }
  return true;
}

int statusOf(pid_t child) {
  int status = 0;
  while (waitpid(child, &status, 0) < 0)
    if (errno != EINTR)
      return 127;
  return WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
}

} // namespace

ChildResult runChild(const std::vector<std::string> &words, const ChildEnvironment &environment) {
  const std::string program = findProgram(words.front(), environment.path);
  if (program.empty())
    return {127, "", words.front() + ": not found\n", true};
  const Capture out;
  const Capture err;
  const SpawnSetup setup(out, err, environment.directory);
  std::vector<std::string> arguments = words;
  std::vector<std::string> variables = environment.variables;
  variables.push_back("PATH=" + environment.path);
  pid_t child = 0;
  const int error = posix_spawn(&child, program.c_str(), setup.files(), setup.attributes(),
                                pointers(arguments).data(), pointers(variables).data());
  if (error == EAGAIN || error == ENOMEM)
    throw JudgementError("cannot run " + program + ": " + strerror(error));
  if (error != 0)
    return {127, "", program + ": " + strerror(error) + "\n", true};
  const bool isInTime = environment.limit.count() == 0 || hasEnded(child, environment.limit);
  if (!isInTime)
    kill(child, SIGKILL);
  const int status = statusOf(child);
  return {status, out.text(), err.text(), isInTime};
}

std::string findProgram(const std::string &name, const std::string &path) {
  if (name.find('/') != std::string::npos)
    return access(name.c_str(), X_OK) == 0 ? name : "";
  for (const std::string &directory : Util::tokenizeString(path, ":")) {
    const std::string program = directory + "/" + name;
    struct stat status = {};
    if (stat(program.c_str(), &status) == 0 && S_ISREG(status.st_mode) && access(program.c_str(), X_OK) == 0)
      return program;
  }
  return "";
}
