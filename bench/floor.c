// The floor under an installation: the work that its design requires, and nothing else.
//
//   floor install|install-at|report HOME VERSION-FILE FILES LINES BYTES ARCHIVE...
//
// First, for every archive: extract the descriptor. Then, archive by archive: remove what is in the temporary
// directory, extract everything, put it on disk, look at each entry of the tree, open it, link it to its
// place under the home, unlink the replaced file and the temporary name, set owner and mode of the open file,
// put the moves on disk, rewrite the version file and append to the history with an fsync each, remove the
// temporary tree. A report prints the places and moves nothing. Spread over the FILES files, LINES log lines
// of BYTES bytes in all are written, each by one open, one write and one close.
//
// install-at uses names relative to the open home and log directory, which saves the system the look-up of
// the full path. The design does not do so: another process may replace a directory that is kept open. The
// difference is the price.
//
// No message is formatted, each failure ends the program, entries are in the order of the system: all other
// work of a program is its own. HOME ends in "/"; all paths are absolute.
#define _GNU_SOURCE
#include <dirent.h>
#include <fcntl.h>
#include <limits.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

// A path below the home, and its tail below the working directory: "/opt/orv/./bin/tool", "./bin/tool". One
// copy of the last component makes both names of a file.
static char path[PATH_MAX];
static char *below;

// The place of a file under the home, and the log: the directory to start from, and the name from there.
static int homeDirectory = AT_FDCWD, logDirectory = AT_FDCWD;
static const char *target = path, *logName;

static char temporary[PATH_MAX];
static char logFile[PATH_MAX];
static char history[PATH_MAX];
static const char *versionFile;
static size_t filesLeft, linesLeft, bytesLeft;

static void check(int succeeded, const char *what) {
  if (succeeded)
    return;
  perror(what);
  exit(1);
}

static void place(char *where, const char *home, const char *name) {
  check(snprintf(where, PATH_MAX, "%s%s", home, name) < PATH_MAX, name);
}

// The temporary directory of one archive.
static void placeTemporary(const char *home, int number) {
  char name[32];
  snprintf(name, sizeof name, "tmp/%d", number);
  place(temporary, home, name);
}

static int openDirectory(const char *name) {
  const int directory = open(name, O_RDONLY | O_DIRECTORY | O_CLOEXEC);
  check(directory >= 0, name);
  return directory;
}

static void writeTo(int directory, const char *file, int flags, const char *text, size_t length,
                    int (*flush)(int)) {
  const int descriptor = openat(directory, file, O_WRONLY | O_CREAT | O_CLOEXEC | flags, 0666);
  check(descriptor >= 0 && write(descriptor, text, length) == (ssize_t)length, file);
  if (flush != NULL)
    check(flush(descriptor) == 0, file);
  close(descriptor);
}

// The share of one file in the remaining log lines, each of their mean length.
static void writeLines(void) {
  static char text[65536];
  for (size_t share = linesLeft / filesLeft--; share > 0; --share) {
    const size_t length = bytesLeft / linesLeft--;
    bytesLeft -= length;
    writeTo(logDirectory, logName, O_APPEND, text, length, NULL);
  }
}

static void putOnDisk(const char *name) {
  const int directory = openDirectory(name);
  check(syncfs(directory) == 0, name);
  close(directory);
}

static void extract(const char *archive, const char *member) {
  check(mkdir(temporary, 0777) == 0 || access(temporary, F_OK) == 0, temporary);
  check(chdir(temporary) == 0, temporary);
  const pid_t child = fork();
  check(child >= 0, "fork");
  if (child == 0) {
    execlp("tar", "tar", "-xf", archive, member, (char *)NULL);
    _exit(127);
  }
  int status = 0;
  check(waitpid(child, &status, 0) == child && status == 0, archive);
}

// Actions for a directory before its entries, for each file, for a directory after its entries.
struct visitor {
  void (*enter)(void);
  void (*file)(void);
  void (*leave)(void);
};

static void walk(const struct visitor *visitor) {
  char *const end = path + strlen(path);
  visitor->enter();
  DIR *const directory = opendir(below);
  check(directory != NULL, below);
  *end = '/';
  for (const struct dirent *entry; (entry = readdir(directory)) != NULL;) {
    if (strcmp(entry->d_name, ".") == 0 || strcmp(entry->d_name, "..") == 0)
      continue;
    strcpy(end + 1, entry->d_name);
    struct stat status;
    check(stat(below, &status) == 0, below);
    if (S_ISDIR(status.st_mode))
      walk(visitor);
    else
      visitor->file();
  }
  closedir(directory);
  *end = '\0';
  visitor->leave();
}

static void walkFrom(const char *directory, const struct visitor *visitor) {
  check(chdir(directory) == 0, directory);
  strcpy(below, ".");
  walk(visitor);
}

static void nothing(void) {}

static void makeDirectory(void) {
  struct stat status;
  if (stat(path, &status) != 0)
    check(mkdir(path, 0777) == 0 && stat(path, &status) == 0 && chmod(path, 0777) == 0, path);
}

static void moveFile(void) {
  struct stat old;
  const int source = open(below, O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC);
  check(source >= 0, below);
  if (fstatat(homeDirectory, target, &old, 0) == 0)
    check(unlinkat(homeDirectory, target, 0) == 0, path);
  else
    old = (struct stat){.st_mode = 0755, .st_uid = (uid_t)-1, .st_gid = (gid_t)-1};
  check(linkat(AT_FDCWD, below, homeDirectory, target, 0) == 0, path);
  check(unlink(below) == 0, below);
  check(fchown(source, old.st_uid, old.st_gid) == 0, path);
  check(fchmod(source, old.st_mode & 07777) == 0, path);
  close(source);
  writeLines();
}

static void listFile(void) {
  printf("    %s\n", path);
  writeLines();
}

static void removeFile(void) {
  check(unlink(below) == 0, below);
}

static void removeDirectory(void) {
  const int isTop = strcmp(below, ".") == 0;
  check(rmdir(isTop ? temporary : below) == 0, below);
}

static void removeTemporary(void) {
  static const struct visitor removing = {nothing, removeFile, removeDirectory};
  walkFrom(temporary, &removing);
}

static void rewriteVersionFile(void) {
  char text[4096];
  const int file = open(versionFile, O_RDONLY | O_CLOEXEC);
  const ssize_t length = file < 0 ? -1 : read(file, text, sizeof text);
  check(length > 0, versionFile);
  close(file);
  writeTo(AT_FDCWD, versionFile, O_TRUNC, text, (size_t)length, fsync);
}

static void install(void) {
  static const struct visitor moving = {makeDirectory, moveFile, nothing};
  static const char line[] = "code | platform | kind | name of the patch    | PASS | user | date\n";
  putOnDisk(temporary);
  walkFrom("updated_files", &moving);
  putOnDisk(".");
  rewriteVersionFile();
  writeTo(AT_FDCWD, history, O_APPEND, line, strlen(line), fsync);
}

static void report(void) {
  static const struct visitor listing = {nothing, listFile, nothing};
  walkFrom("updated_files", &listing);
}

static void nameFromDirectories(const char *home) {
  char logs[PATH_MAX];
  place(logs, home, "patchlogs");
  homeDirectory = openDirectory(home);
  target = below;
  logDirectory = openDirectory(logs);
  logName = "orvpatch.log";
}

static size_t numberOf(const char *text) {
  return strtoul(text, NULL, 10);
}

int main(int argc, char **argv) {
  check(argc > 7, "arguments");
  const int installing = strcmp(argv[1], "report") != 0;
  const char *const home = argv[2];
  place(path, home, "");
  below = path + strlen(path);
  place(logFile, home, "patchlogs/orvpatch.log");
  logName = logFile;
  place(history, home, "patchlogs/patches.hist");
  versionFile = argv[3];
  filesLeft = numberOf(argv[4]);
  linesLeft = numberOf(argv[5]);
  bytesLeft = numberOf(argv[6]);

  if (strcmp(argv[1], "install-at") == 0)
    nameFromDirectories(home);
  for (int i = 7; i < argc; ++i) {
    placeTemporary(home, i);
    extract(argv[i], "patch.ini");
  }
  for (int i = 7; i < argc; ++i) {
    placeTemporary(home, i);
    removeTemporary();
    extract(argv[i], NULL);
    installing ? install() : report();
    removeTemporary();
  }
  return 0;
}
