#include "systemcalls.h"

#include <algorithm>
#include <cerrno>
#include <cstdarg>
#include <cstdint>
#include <cstdio>
#include <ctime>
#include <list>

#include <dirent.h>
#include <fcntl.h>
#include <pwd.h>
#include <sys/stat.h>
#include <sys/utsname.h>
#include <unistd.h>

namespace {

struct Call {
  std::string name;
  std::string object;
};

struct State {
  std::list<PlannedFailure> failures; // a list: tests keep references to its elements
  std::vector<Call> journal;
  std::size_t transferLimit = SIZE_MAX;
  std::size_t readableBytes = SIZE_MAX;
  bool answersUser = false;
  uid_t user = 0;
  std::string userName;
  time_t now = -1;
  std::string nodeName;
};

State &state() {
  static State &instance = *new State; // calls are made until the very end of the process
  return instance;
}

// Outside of the state: malloc may not allocate to find out whether it has to fail.
std::size_t failingAllocation = SIZE_MAX;

bool fails(const std::string &call, const std::string &object = "") {
  state().journal.push_back({call, object});
  return std::any_of(state().failures.begin(), state().failures.end(),
                     [&](PlannedFailure &failure) { return failure.strikes(call, object); });
}

} // namespace

bool PlannedFailure::strikes(const std::string &call, const std::string &object) {
  if (call != call_ || (!object_.empty() && object != object_))
    return false;
  if (after_ > 0) {
    --after_;
    return false;
  }
  if (times_ == 0)
    return false;
  if (times_ > 0)
    --times_;
  errno = errorNumber_;
  return true;
}

PlannedFailure &failCall(const std::string &call, int errorNumber) {
  return state().failures.emplace_back(call, errorNumber);
}

void failAllocationOf(std::size_t size) {
  failingAllocation = size;
}
void limitTransfers(std::size_t bytes) {
  state().transferLimit = bytes;
}
void endReadsAfter(std::size_t bytes) {
  state().readableBytes = bytes;
}
void answerNodeName(const std::string &name) {
  state().nodeName = name;
}

void answerUser(uid_t user) {
  state().answersUser = true;
  state().user = user;
}

void answerUserName(const std::string &name) {
  state().userName = name;
}

void answerTime(time_t now) {
  state().now = now;
}

void restoreSystemCalls() {
  state() = State();
  failingAllocation = SIZE_MAX;
}

std::vector<std::string> callsAmong(const std::vector<std::string> &names) {
  std::vector<std::string> calls;
  for (const Call &call : state().journal)
    if (std::find(names.begin(), names.end(), call.name) != names.end())
      calls.push_back(call.name);
  return calls;
}

int callsOf(const std::string &name, const std::string &object) {
  const auto &journal = state().journal;
  return static_cast<int>(std::count_if(journal.begin(), journal.end(), [&](const Call &call) {
    return call.name == name && (object.empty() || call.object == object);
  }));
}

extern "C" {

// The linker gives the calls of the program to __wrap_NAME, and the system's function to __real_NAME.
pid_t __real_fork();
int __real_pipe(int *ends);
int __real_fcntl(int descriptor, int command, ...);
int __real_dup2(int from, int to);
pid_t __real_wait(int *status);
int __real_execvp(const char *program, char *const *argv);
int __real_open(const char *path, int flags, ...);
ssize_t __real_read(int descriptor, void *buffer, size_t size);
ssize_t __real_write(int descriptor, const void *buffer, size_t size);
int __real_close(int descriptor);
int __real_fsync(int descriptor);
off_t __real_lseek(int descriptor, off_t offset, int whence);
int __real_access(const char *path, int mode);
int __real_openat(int directory, const char *path, int flags, ...);
int __real_fchown(int descriptor, uid_t owner, gid_t group);
int __real_fchmod(int descriptor, mode_t mode);
int __real_ftruncate(int descriptor, off_t length);
int __real_syncfs(int descriptor);
int __real_link(const char *source, const char *target);
int __real_unlink(const char *path);
int __real_chown(const char *path, uid_t owner, gid_t group);
int __real_chmod(const char *path, mode_t mode);
int __real_mkdir(const char *path, mode_t mode);
int __real_rmdir(const char *path);
DIR *__real_opendir(const char *path);
dirent *__real_readdir(DIR *directory);
char *__real_getcwd(char *buffer, size_t size);
int __real_chdir(const char *path);
int __real_putenv(char *variable);
uid_t __real_getuid();
passwd *__real_getpwuid(uid_t user);
int __real_uname(utsname *host);
time_t __real_time(time_t *now);
tm *__real_localtime(const time_t *time);
tm *__real_localtime_r(const time_t *time, tm *result);
void *__real_malloc(size_t size);

pid_t __wrap_fork() {
  return fails("fork") ? -1 : __real_fork();
}

int __wrap_pipe(int *ends) {
  return fails("pipe") ? -1 : __real_pipe(ends);
}

// The commands that the program gives take a number or nothing.
int __wrap_fcntl(int descriptor, int command, ...) {
  va_list arguments;
  va_start(arguments, command);
  const long value = va_arg(arguments, long);
  va_end(arguments);
  return fails("fcntl", std::to_string(command)) ? -1 : __real_fcntl(descriptor, command, value);
}

int __wrap_dup2(int from, int to) {
  return fails("dup2", std::to_string(to)) ? -1 : __real_dup2(from, to);
}

pid_t __wrap_wait(int *status) {
  return fails("wait") ? -1 : __real_wait(status);
}

int __wrap_execvp(const char *program, char *const *argv) {
  return fails("execvp", program) ? -1 : __real_execvp(program, argv);
}

int __wrap_open(const char *path, int flags, ...) {
  va_list arguments;
  va_start(arguments, flags);
  const mode_t mode = (flags & O_CREAT) != 0 ? va_arg(arguments, mode_t) : 0;
  va_end(arguments);
  return fails("open", path) ? -1 : __real_open(path, flags, mode);
}

ssize_t __wrap_read(int descriptor, void *buffer, size_t size) {
  if (fails("read"))
    return -1;
  const ssize_t count =
      __real_read(descriptor, buffer, std::min({size, state().transferLimit, state().readableBytes}));
  if (count > 0)
    state().readableBytes -= static_cast<std::size_t>(count);
  return count;
}

// A transfer limit of nothing makes a write answer 0.
ssize_t __wrap_write(int descriptor, const void *buffer, size_t size) {
  return fails("write") ? -1 : __real_write(descriptor, buffer, std::min(size, state().transferLimit));
}

// A close that is made to fail has closed the descriptor all the same. One that fails by itself was given
// what is not open: closed twice, or never opened.
int __wrap_close(int descriptor) {
  const int result = __real_close(descriptor);
  if (result != 0)
    state().journal.push_back({"close of nothing", std::to_string(descriptor)});
  return fails("close") ? -1 : result;
}

int __wrap_fsync(int descriptor) {
  return fails("fsync") ? -1 : __real_fsync(descriptor);
}

off_t __wrap_lseek(int descriptor, off_t offset, int whence) {
  return fails("lseek") ? -1 : __real_lseek(descriptor, offset, whence);
}

int __wrap_access(const char *path, int mode) {
  return fails("access", path) ? -1 : __real_access(path, mode);
}

// The names that an optimized build gives to calls without a mode, so that the library can check that none is
// due.
int __real___open_2(const char *path, int flags);
int __real___openat_2(int directory, const char *path, int flags);

int __wrap___open_2(const char *path, int flags) {
  return fails("open", path) ? -1 : __real___open_2(path, flags);
}

int __wrap___openat_2(int directory, const char *path, int flags) {
  return fails("openat", path) ? -1 : __real___openat_2(directory, path, flags);
}

// Before glibc 2.33 these three are no functions of the library: a part of every program translates them into
// calls that name the version of the structure.
#if __GLIBC_PREREQ(2, 33)
int __real_stat(const char *path, struct stat *status);
int __real_lstat(const char *path, struct stat *status);
int __real_fstatat(int directory, const char *path, struct stat *status, int flags);

int __wrap_stat(const char *path, struct stat *status) {
  return fails("stat", path) ? -1 : __real_stat(path, status);
}

int __wrap_lstat(const char *path, struct stat *status) {
  return fails("lstat", path) ? -1 : __real_lstat(path, status);
}

int __wrap_fstatat(int directory, const char *path, struct stat *status, int flags) {
  return fails("fstatat", path) ? -1 : __real_fstatat(directory, path, status, flags);
}
#else
int __real___xstat(int version, const char *path, struct stat *status);
int __real___lxstat(int version, const char *path, struct stat *status);
int __real___fxstatat(int version, int directory, const char *path, struct stat *status, int flags);

int __wrap___xstat(int version, const char *path, struct stat *status) {
  return fails("stat", path) ? -1 : __real___xstat(version, path, status);
}

int __wrap___lxstat(int version, const char *path, struct stat *status) {
  return fails("lstat", path) ? -1 : __real___lxstat(version, path, status);
}

int __wrap___fxstatat(int version, int directory, const char *path, struct stat *status, int flags) {
  return fails("fstatat", path) ? -1 : __real___fxstatat(version, directory, path, status, flags);
}
#endif

int __wrap_openat(int directory, const char *path, int flags, ...) {
  va_list arguments;
  va_start(arguments, flags);
  const mode_t mode = (flags & O_CREAT) != 0 ? va_arg(arguments, mode_t) : 0;
  va_end(arguments);
  return fails("openat", path) ? -1 : __real_openat(directory, path, flags, mode);
}

int __wrap_fchown(int descriptor, uid_t owner, gid_t group) {
  return fails("fchown") ? -1 : __real_fchown(descriptor, owner, group);
}

int __wrap_fchmod(int descriptor, mode_t mode) {
  return fails("fchmod") ? -1 : __real_fchmod(descriptor, mode);
}

int __wrap_ftruncate(int descriptor, off_t length) {
  return fails("ftruncate") ? -1 : __real_ftruncate(descriptor, length);
}

int __wrap_syncfs(int descriptor) {
  return fails("syncfs") ? -1 : __real_syncfs(descriptor);
}

int __wrap_link(const char *source, const char *target) {
  return fails("link", source) ? -1 : __real_link(source, target);
}

int __wrap_unlink(const char *path) {
  return fails("unlink", path) ? -1 : __real_unlink(path);
}

int __wrap_chown(const char *path, uid_t owner, gid_t group) {
  return fails("chown", path) ? -1 : __real_chown(path, owner, group);
}

int __wrap_chmod(const char *path, mode_t mode) {
  return fails("chmod", path) ? -1 : __real_chmod(path, mode);
}

int __wrap_mkdir(const char *path, mode_t mode) {
  return fails("mkdir", path) ? -1 : __real_mkdir(path, mode);
}

int __wrap_rmdir(const char *path) {
  return fails("rmdir", path) ? -1 : __real_rmdir(path);
}

DIR *__wrap_opendir(const char *path) {
  return fails("opendir", path) ? nullptr : __real_opendir(path);
}

dirent *__wrap_readdir(DIR *directory) {
  return fails("readdir") ? nullptr : __real_readdir(directory);
}

char *__wrap_getcwd(char *buffer, size_t size) {
  return fails("getcwd") ? nullptr : __real_getcwd(buffer, size);
}

int __wrap_chdir(const char *path) {
  return fails("chdir", path) ? -1 : __real_chdir(path);
}

int __wrap_putenv(char *variable) {
  return fails("putenv", variable) ? -1 : __real_putenv(variable);
}

uid_t __wrap_getuid() {
  return state().answersUser ? state().user : __real_getuid();
}

passwd *__wrap_getpwuid(uid_t user) {
  if (fails("getpwuid", std::to_string(user)))
    return nullptr;
  if (state().userName.empty())
    return __real_getpwuid(user);
  static passwd entry;
  entry = {};
  entry.pw_name = state().userName.data();
  entry.pw_uid = user;
  return &entry;
}

int __wrap_uname(utsname *host) {
  const int result = fails("uname") ? -1 : __real_uname(host);
  if (result == 0 && !state().nodeName.empty())
    std::snprintf(host->nodename, sizeof host->nodename, "%s", state().nodeName.c_str());
  return result;
}

time_t __wrap_time(time_t *now) {
  const time_t answer = state().now == -1 ? __real_time(nullptr) : state().now;
  if (now != nullptr)
    *now = answer;
  return answer;
}

tm *__wrap_localtime(const time_t *time) {
  return fails("localtime") ? nullptr : __real_localtime(time);
}

tm *__wrap_localtime_r(const time_t *time, tm *result) {
  return fails("localtime") ? nullptr : __real_localtime_r(time, result);
}

void *__wrap_malloc(size_t size) {
  if (size != failingAllocation)
    return __real_malloc(size);
  errno = ENOMEM;
  return nullptr;
}

} // extern "C"
