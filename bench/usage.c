// Runs a command and writes its costs to the file named first: wall seconds, user and system CPU seconds of
// it and of the children that it waited for, and its peak memory in KiB. Ends with the command's exit status.
//
//   usage RESULT-FILE COMMAND...
//
// It is a separate program because the kernel counts the memory that a process had before it executed the
// command: started by an interpreter, every command would seem to need the interpreter's memory.
#define _GNU_SOURCE
#include <stdio.h>
#include <stdlib.h>
#include <sys/resource.h>
#include <sys/wait.h>
#include <time.h>
#include <unistd.h>

static double secondsOf(struct timeval time) {
  return (double)time.tv_sec + (double)time.tv_usec / 1e6;
}

static double now(void) {
  struct timespec time;
  clock_gettime(CLOCK_MONOTONIC, &time);
  return (double)time.tv_sec + (double)time.tv_nsec / 1e9;
}

static void fail(const char *what) {
  perror(what);
  exit(127);
}

int main(int argc, char **argv) {
  if (argc < 3) {
    fprintf(stderr, "usage: %s RESULT-FILE COMMAND...\n", argv[0]);
    return 127;
  }
  const double start = now();
  const pid_t child = fork();
  if (child < 0)
    fail("fork");
  if (child == 0) {
    execvp(argv[2], argv + 2);
    fail(argv[2]);
  }
  int status = 0;
  struct rusage usage;
  if (wait4(child, &status, 0, &usage) != child)
    fail("wait4");
  const double wall = now() - start;
  FILE *const result = fopen(argv[1], "w");
  if (result == NULL)
    fail(argv[1]);
  fprintf(result, "%.6f %.6f %.6f %ld\n", wall, secondsOf(usage.ru_utime), secondsOf(usage.ru_stime),
          usage.ru_maxrss);
  if (fclose(result) != 0)
    fail(argv[1]);
  return WIFEXITED(status) ? WEXITSTATUS(status) : 126;
}
