// Changes the order in which a program sees the entries of a directory. Preloaded by LD_PRELOAD;
// ORVPATCH_LISTING is "reversed", or a number: the seed of an order that depends on the names alone.

#include <dirent.h>
#include <dlfcn.h>
#include <linux/magic.h>
#include <sys/vfs.h>

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <functional>
#include <map>
#include <mutex>
#include <string>
#include <vector>

namespace {

struct Listing {
  std::vector<std::vector<char>> entries; // each one a dirent, as long as its name demands
  std::size_t next = 0;
  int error = 0; // what ended the real listing
};

// Never destroyed: a program may list directories while it ends.
std::map<DIR *, Listing> &listings() {
  static auto *const all = new std::map<DIR *, Listing>;
  return *all;
}

std::mutex &lock() {
  static auto *const only = new std::mutex;
  return *only;
}

template <typename Function>
Function real(const char *name) {
  return reinterpret_cast<Function>(dlsym(RTLD_NEXT, name));
}

dirent *entryOf(std::vector<char> &bytes) {
  return reinterpret_cast<dirent *>(bytes.data());
}

std::size_t rankOf(std::vector<char> &bytes, const std::string &seed) {
  const std::size_t mixed = std::hash<std::string>()(seed + "/" + entryOf(bytes)->d_name);
  return (mixed ^ (mixed >> 31U)) * 0x9E3779B97F4A7C15U; // names that differ at their end lie apart
}

void arrange(std::vector<std::vector<char>> &entries) {
  const char *const wanted = getenv("ORVPATCH_LISTING");
  if (wanted == nullptr)
    return;
  const std::string order = wanted;
  if (order == "reversed")
    std::reverse(entries.begin(), entries.end());
  else
    std::sort(entries.begin(), entries.end(),
              [&order](auto &left, auto &right) { return rankOf(left, order) < rankOf(right, order); });
}

bool holdsProcesses(DIR *directory) {
  struct statfs system = {};
  return fstatfs(dirfd(directory), &system) == 0 && system.f_type == PROC_SUPER_MAGIC;
}

Listing readAll(DIR *directory) {
  static const auto realReaddir = real<dirent *(*)(DIR *)>("readdir");
  Listing listing;
  errno = 0;
  while (const dirent *const entry = realReaddir(directory)) {
    const char *const bytes = reinterpret_cast<const char *>(entry);
    listing.entries.emplace_back(bytes, bytes + entry->d_reclen);
  }
  listing.error = errno;
  if (!holdsProcesses(directory))
    arrange(listing.entries);
  return listing;
}

dirent *nextEntry(DIR *directory) {
  const std::lock_guard<std::mutex> guard(lock());
  const int before = errno;
  auto found = listings().find(directory);
  if (found == listings().end())
    found = listings().emplace(directory, readAll(directory)).first;
  Listing &listing = found->second;
  const bool atEnd = listing.next == listing.entries.size();
  errno = atEnd && listing.error != 0 ? listing.error : before;
  return atEnd ? nullptr : entryOf(listing.entries[listing.next++]);
}

void forget(DIR *directory) {
  const std::lock_guard<std::mutex> guard(lock());
  listings().erase(directory);
}

} // namespace

extern "C" {

dirent *readdir(DIR *directory) {
  return nextEntry(directory);
}

// The same structure on the systems that the tests run on.
static_assert(sizeof(dirent) == sizeof(dirent64), "a program for large files reads another structure");
dirent64 *readdir64(DIR *directory) {
  return reinterpret_cast<dirent64 *>(nextEntry(directory));
}

void rewinddir(DIR *directory) {
  forget(directory);
  real<void (*)(DIR *)>("rewinddir")(directory);
}

int closedir(DIR *directory) {
  forget(directory);
  return real<int (*)(DIR *)>("closedir")(directory);
}
}
