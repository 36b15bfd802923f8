#include "process.h"

#include <cerrno>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <cstring>

#include <fcntl.h>
#include <sys/wait.h>
#include <unistd.h>

#include "logger.h"

#define LOG_COMPONENT "process.cpp"

namespace {

enum PipeEnd { ReadEnd = 0, WriteEnd = 1 };

/// The two pipes of one child; ends that are still open are closed by the destructor.
struct Pipes {
  int out[2] = {-1, -1};
  int err[2] = {-1, -1};

  Pipes() = default;
  Pipes(const Pipes &) = delete;
  Pipes &operator=(const Pipes &) = delete;
  ~Pipes() {
    closeEnd(ReadEnd);
    closeEnd(WriteEnd);
  }

  void closeEnd(PipeEnd end) {
    for (int *fd : {&out[end], &err[end]}) {
      if (*fd >= 0)
        close(*fd);
      *fd = -1;
    }
  }
};

/// Output that a child can print before it is read: with this size, which the system gives root, a tar that
/// warns of every member of a large archive still ends. Other users mostly get 1 MiB.
constexpr int LargestPipe = 16 * 1024 * 1024;
/// The size of a new pipe, with pages of 4 KiB.
constexpr int UsualPipe = 64 * 1024;

/// Makes a pipe as large as the system allows. A refusal leaves it as it was.
void enlarge(int end) {
  for (int size = LargestPipe; size > UsualPipe && fcntl(end, F_SETPIPE_SZ, size) < 0; size /= 2) {
  }
}

/// False, with both ends -1 and the reason in errno, when no pipe can be made.
bool makePipe(int *ends) {
  ends[ReadEnd] = ends[WriteEnd] = -1;
  if (pipe(ends) != 0)
    return false;
  enlarge(ends[WriteEnd]);
  // The child has ended before its output is read, so all of it is in the pipe. A program that it left
  // running may still hold the other end: an empty pipe then means no output, and must not be waited for.
  static_cast<void>(fcntl(ends[ReadEnd], F_SETFL, O_NONBLOCK));
  return true;
}

/// The caller's disposition of SIGPIPE.
void (*callersPipeSignal)(int) = SIG_DFL;

[[noreturn]] void runChild(char **argv, Pipes &pipes) {
  pipes.closeEnd(ReadEnd);
  if (dup2(pipes.out[WriteEnd], STDOUT_FILENO) < 0)
    LOG_ERROR("Error duping STDOUT");
  if (dup2(pipes.err[WriteEnd], STDERR_FILENO) < 0)
    LOG_ERROR("Error duping STDERR");
  static_cast<void>(signal(SIGPIPE, callersPipeSignal));
  execvp(argv[0], argv); // NOLINT(clang-analyzer-core.NonNullParamChecker): the vector names its program
  const int error = errno;
  LOG_ERROR("error calling execvp = %d: %s", error, strerror(error));
  exit(error);
}

/// Waits for the end of this child; false, with a line in the log, when the system reports none. Other
/// children, left by a shell that has replaced itself by this program, are reaped and forgotten.
bool waitFor(pid_t child, int *status) {
  pid_t ended = 0;
  do
    ended = wait(status);
  while (ended != child && (ended >= 0 || errno == EINTR));
  if (ended == child)
    return true;
  const int error = errno;
  LOG_ERROR("Error waiting for process %d: %s", static_cast<int>(child), strerror(error));
  return false;
}

/// One read of at most 4096 bytes, up to the first NUL among them; the rest of a longer output is dropped.
std::string readOnce(int fd) {
  char buffer[4096];
  ssize_t count = 0;
  do
    count = read(fd, buffer, sizeof buffer);
  while (count < 0 && errno == EINTR);
  return count <= 0 ? std::string() : std::string(buffer, strnlen(buffer, static_cast<std::size_t>(count)));
}

void deliver(const std::string &output, std::string *destination, FILE *stream) {
  if (destination != nullptr)
    destination->append(output);
  else
    fprintf(stream, "%s", output.c_str());
}

} // namespace

void ignoreWriteSignals() {
  const auto before = signal(SIGPIPE, SIG_IGN);
  if (before != SIG_ERR) // GCOVR_EXCL_BR_LINE: both signals exist
    callersPipeSignal = before;
  static_cast<void>(signal(SIGXFSZ, SIG_IGN));
}

bool createPipes(int *outPipe, int *errPipe) {
  // KEEP(pipes-always-true): a missing pipe costs the child's output, not the run.
  if (!makePipe(outPipe))
    LOG_ERROR("Error creating stdOutPipe: %s", strerror(errno));
  if (!makePipe(errPipe))
    LOG_ERROR("Error creating stdErrPipe: %s", strerror(errno));
  return true;
}

bool runCommand(char **argv, int *rc, std::string *out, std::string *err) {
  LOG_TRACE("runCommand %s", "entry");
  for (int i = 0; argv[i] != nullptr; ++i)
    LOG_TRACE("cmdArray[%d]: %s", i, argv[i]);
  Pipes pipes;
  static_cast<void>(createPipes(pipes.out, pipes.err));

  // A child that cannot execute its program ends with exit(), which would write buffered output a second
  // time.
  fflush(stdout);
  fflush(stderr);
  const pid_t child = fork();
  if (child < 0) {
    LOG_ERROR("Error calling fork - exiting prematurely");
    return false;
  }
  if (child == 0)
    runChild(argv, pipes);

  pipes.closeEnd(WriteEnd);
  // KEEP(wait-before-read): the end comes before the reading, so a child that writes more than a pipe holds,
  // here up to 16 MiB, waits for ever. Commands of a patch are expected to be silent.
  int status = 0;
  if (!waitFor(child, &status))
    return false;
  deliver(readOnce(pipes.out[ReadEnd]), out, stdout);
  deliver(readOnce(pipes.err[ReadEnd]), err, stderr);
  // KEEP(signal-is-zero): bits 8 to 15 are zero for a child that a signal ended, which callers take as
  // success.
  if (rc != nullptr)
    *rc = (status >> 8) & 0xff;
  LOG_TRACE("runCommand %s", "exit");
  return true;
}

bool runCommand(const std::vector<std::string> &words, CommandResult &result) {
  std::vector<std::string> storage = words;
  std::vector<char *> argv;
  argv.reserve(storage.size() + 1);
  for (std::string &word : storage)
    argv.push_back(word.data());
  argv.push_back(nullptr);
  return runCommand(argv.data(), &result.rc, &result.out, &result.err);
}
