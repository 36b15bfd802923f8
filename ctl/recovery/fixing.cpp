#include "recovery/fixing.h"

#include <algorithm>
#include <cerrno>
#include <cstring>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include "child.h"
#include "filedescriptor.h"
#include "inputfile.h"
#include "judgement.h"
#include "leftover.h"
#include "transaction/instances.h"
#include "transaction/plan.h"
#include "transaction/saving.h"

namespace {

constexpr std::size_t LargestVersionFile = 1024UL * 1024;

/// The file itself, never what a link leads to.
int setAttributes(const std::string &path, const Attributes &attributes) {
  const FileDescriptor file(path.c_str(), O_RDONLY | O_NOFOLLOW);
  if (!file.isOpen())
    return errno;
  const bool hasOwner = attributes.user >= 0;
  // The mode comes last: a change of owner takes set-id bits away.
  const bool done = (!hasOwner || fchown(file.get(), static_cast<uid_t>(attributes.user),
                                         static_cast<gid_t>(attributes.group)) == 0) &&
                    fchmod(file.get(), attributes.mode) == 0 && fsync(file.get()) == 0;
  return done ? 0 : errno;
}

/// Puts a text into an empty file, and on disk. Where that fails it is empty again: a part of the text would
/// hide that something is missing.
int fill(const std::string &path, const std::string &text) {
  const FileDescriptor file(path.c_str(), O_WRONLY | O_NOFOLLOW);
  if (file.isOpen() && file.write(text) && fsync(file.get()) == 0)
    return 0;
  const int error = errno;
  if (file.isOpen())
    static_cast<void>(!ftruncate(file.get(), 0));
  return error;
}

class Fixer {
public:
  Fixer(const Home &home, const Interruption &found, std::vector<std::string> &messages)
      : home_(home), found_(found), messages_(messages) {}

  /// Files first, so that what is started finds them; the left-over directories when nothing needs them any
  /// more; instances last.
  void fix(std::vector<HomeState> &states) {
    each(states, {"file-missing", "file-twice", "file-attributes"}, &Fixer::fixFile);
    closeAll(states);
    each(states, {"directory-closed"}, &Fixer::fixDirectory);
    each(states, {"level-empty"}, &Fixer::fixLevel);
    each(states, {"result-file-empty"}, &Fixer::fixResult);
    each(states, {"temporary-left"}, &Fixer::fixTemporary);
    fixInstances(states);
  }

private:
  using Fix = bool (Fixer::*)(const HomeState &state);

  void each(std::vector<HomeState> &states, const std::vector<std::string> &names, Fix one) {
    for (HomeState &state : states)
      if (std::find(names.begin(), names.end(), state.state) != names.end())
        state.fixed = (this->*one)(state);
  }

  bool succeeded(const HomeState &state, int error) {
    if (error != 0)
      messages_.push_back(state.path + ": " + strerror(error));
    return error == 0;
  }

  /// Of several patches with this file the one that still has it under tmp was at work, else the last one.
  bool fixFile(const HomeState &state) {
    const InterruptedPatch *owner = nullptr;
    const InterruptedFile *brought = nullptr;
    for (const InterruptedPatch &patch : found_.patches)
      for (const InterruptedFile &file : patch.files)
        if (file.path == state.path && (owner == nullptr || sourceOf(home_, *owner, file.path).empty())) {
          owner = &patch;
          brought = &file;
        }
    return owner != nullptr && fixFile(state, *owner, *brought);
  }

  /// The file gets its owner and mode where it is, in the temporary directory too, before it gets its place.
  bool fixFile(const HomeState &state, const InterruptedPatch &patch, const InterruptedFile &file) {
    const std::string target = home_.at(file.path);
    const std::string source = sourceOf(home_, patch, file.path);
    const bool isMissing = state.state == "file-missing";
    if (isMissing && source.empty()) {
      messages_.push_back(state.path + ": it is in the archive alone: give the same command again");
      return false;
    }
    const std::optional<FileState> now = stateOf(isMissing ? source : target);
    const bool isLink = now && S_ISLNK(now->type);
    const int error =
        isLink ? 0 : setAttributes(isMissing ? source : target, attributesFor(home_, found_, file));
    if (error != 0 || source.empty())
      return succeeded(state, error);
    return succeeded(state, isMissing ? place(source, target) : remove(source));
  }

  static int remove(const std::string &path) { return unlink(path.c_str()) == 0 ? 0 : errno; }

  /// By a new name, or a copy on another file system; a file that has come in the meantime is kept.
  static int place(const std::string &source, const std::string &target) {
    if (link(source.c_str(), target.c_str()) == 0)
      return remove(source);
    if (errno != EXDEV)
      return errno;
    const ChildResult copied =
        runChild({"cp", "-a", "-n", "--", source, target}, {"/usr/bin:/bin", {"LC_ALL=C"}});
    return copied.status == 0 && stateOf(target) ? remove(source) : EIO;
  }

  /// By the record, all of them at once.
  void closeAll(const std::vector<HomeState> &states) {
    if (found_.hasRecord && std::any_of(states.begin(), states.end(), [](const HomeState &state) {
          return state.state == "directory-closed";
        }))
      closeDirectories(home_.path(), found_.record, messages_);
  }

  bool fixDirectory(const HomeState &state) {
    if (found_.hasRecord) {
      const std::optional<FileState> now = stateOf(home_.at(state.path));
      return now && now->mode != 0700;
    }
    return succeeded(state, setAttributes(home_.at(state.path), {0777, -1, -1}));
  }

  /// From the transaction's copy, else from what the log tells of the file.
  bool fixLevel(const HomeState &state) {
    std::string text;
    for (const RewrittenFile &file : found_.record.rewritten)
      if (file.path == state.path && !file.saved.empty())
        text = InputFile(found_.folder + "/before/" + file.saved).content(LargestVersionFile);
    const auto logged = found_.log.known.find(home_.at(state.path));
    if (text.empty() && logged != found_.log.known.end() && !logged->second.level.empty()) {
      text = "desc = " + codeOf(state.path) + "\nVRMF = " + logged->second.level + "\n";
      for (const std::string &prereq : logged->second.prereqs)
        text += "preReqALL = " + prereq + "\n";
    }
    if (text.empty()) {
      messages_.push_back(state.path + ": neither record nor log tell what it held");
      return false;
    }
    return succeeded(state, fill(home_.at(state.path), text));
  }

  /// The product's name is not in the log: its code stands for it.
  static std::string codeOf(const std::string &versionFile) {
    return "k" + versionFile.substr(versionFile.rfind('/') + 1, 2);
  }

  bool fixResult(const HomeState &state) { return succeeded(state, fill(home_.at(state.path), "0")); }

  bool fixTemporary(const HomeState &state) {
    const std::string held = onlyCopy(state.path);
    if (!held.empty()) {
      messages_.push_back(state.path + ": kept, it may hold the only copy of " + held);
      return false;
    }
    const ChildResult removed =
        runChild({"rm", "-rf", "--", home_.at(state.path)}, {"/usr/bin:/bin", {"LC_ALL=C"}});
    if (removed.status != 0)
      messages_.push_back(state.path + ": " + removed.err);
    return removed.status == 0;
  }

  /// A file that the home lacks, unless it is known to be one that the patch brings to a new place; empty
  /// when there is none.
  std::string onlyCopy(const std::string &directory) const {
    try {
      return onlyCopyIn(home_.path(), directory,
                        [&](const std::string &path) { return isKnownAsNew(directory, path); });
    } catch (const JudgementError &) {
      return "what cannot be read";
    }
  }

  bool isKnownAsNew(const std::string &directory, const std::string &path) const {
    for (const InterruptedPatch &patch : found_.patches) {
      if (std::find(patch.temporary.begin(), patch.temporary.end(), directory) == patch.temporary.end())
        continue;
      const auto file = std::find_if(patch.files.begin(), patch.files.end(),
                                     [&path](const InterruptedFile &other) { return other.path == path; });
      if (file != patch.files.end())
        return !file->wasThere;
    }
    return false;
  }

  void fixInstances(std::vector<HomeState> &states) {
    std::vector<RecordedInstance> wanted;
    for (const RecordedInstance &instance : found_.ran) {
      if (!isIn(states, "instances-stopped", nameOf(instance)))
        continue;
      if (!instance.user.empty())
        wanted.push_back(instance);
      else
        messages_.push_back(nameOf(instance) +
                            ": start it as the user who owns it, which the log does not tell");
    }
    const auto isStopped = [](const HomeState &state) { return state.state == "instances-stopped"; };
    if (wanted.empty())
      return;
    startMissing(home_, wanted, messages_);
    const std::vector<RecordedInstance> running = runningInstances(home_);
    for (HomeState &state : states)
      if (isStopped(state))
        state.fixed = std::any_of(running.begin(), running.end(), [&state](const RecordedInstance &now) {
          return nameOf(now) == state.path;
        });
  }

  static bool isIn(const std::vector<HomeState> &states, const std::string &name, const std::string &path) {
    return std::any_of(states.begin(), states.end(),
                       [&](const HomeState &state) { return state.state == name && state.path == path; });
  }

  const Home &home_;
  const Interruption &found_;
  std::vector<std::string> &messages_;
};

} // namespace

void fixStates(const Home &home, const Interruption &found, std::vector<HomeState> &states,
               std::vector<std::string> &messages) {
  Fixer(home, found, messages).fix(states);
}
