#include "recovery/states.h"

#include <algorithm>
#include <array>
#include <filesystem>
#include <map>
#include <set>
#include <tuple>

#include <sys/stat.h>

#include "history.h"
#include "look.h"
#include "transaction/plan.h"
#include "utilities.h"
#include "verification.h"

namespace {

namespace fs = std::filesystem;

constexpr std::array<const char *, 13> order = {
    "nothing-applied", "instances-stopped", "files-mixed",   "file-missing", "file-twice",
    "file-attributes", "directory-closed",  "level-old",     "level-empty",  "result-file-empty",
    "history-missing", "applied",           "temporary-left"};

bool hasAttributes(const FileState &now, const Attributes &wanted) {
  return now.mode == wanted.mode && (wanted.user < 0 || now.user == wanted.user) &&
         (wanted.group < 0 || now.group == wanted.group);
}

/// How far one patch has come.
struct Progressed {
  std::size_t added = 0;   ///< new files
  std::size_t missing = 0; ///< old ones that are gone
};

class Teller {
public:
  Teller(const Home &home, const Interruption &found) : home_(home), found_(found) {}

  std::vector<HomeState> tell() {
    tellInstances();
    for (const InterruptedPatch &patch : found_.patches)
      tellPatch(patch);
    for (const std::string &directory : found_.directories)
      tellDirectory(directory);
    tellEmptyFiles();
    for (const std::string &directory : temporaries())
      add("temporary-left", directory);
    std::stable_sort(states_.begin(), states_.end(), [](const HomeState &a, const HomeState &b) {
      return rankOf(a.state) < rankOf(b.state);
    });
    return std::move(states_);
  }

private:
  static std::ptrdiff_t rankOf(const std::string &state) {
    return std::find(order.begin(), order.end(), state) - order.begin();
  }

  void add(const char *state, const std::string &path) {
    const auto known = [&](const HomeState &other) { return other.state == state && other.path == path; };
    if (std::none_of(states_.begin(), states_.end(), known))
      states_.push_back({state, path, false});
  }

  void tellInstances() {
    if (found_.ran.empty())
      return;
    const std::vector<RecordedInstance> running = runningInstances(home_);
    for (const RecordedInstance &instance : found_.ran) {
      if (isAmong(running, instance))
        continue;
      add("instances-stopped", nameOf(instance));
      stopped_.insert(instance.product);
    }
  }

  void tellPatch(const InterruptedPatch &patch) {
    const std::set<std::string> different = differingFiles(patch);
    Progressed progressed;
    for (const InterruptedFile &file : patch.files)
      tellFile(patch, file, different, progressed);
    tellStage(patch, progressed);
  }

  /// The files whose content is not the archive's, without a record. A record tells by the file itself.
  std::set<std::string> differingFiles(const InterruptedPatch &patch) const {
    std::set<std::string> different;
    if (found_.hasRecord)
      return different;
    std::set<std::string> covered;
    Verification verification;
    verifyFiles(home_.path(), patch.patch, covered, verification);
    for (const Difference &difference : verification.differences)
      different.insert(difference.path);
    return different;
  }

  void tellFile(const InterruptedPatch &patch, const InterruptedFile &file,
                const std::set<std::string> &different, Progressed &progressed) {
    const std::optional<FileState> now = stateOf(home_.at(file.path));
    if (!now) {
      if (!file.wasThere)
        return;
      ++progressed.missing;
      add("file-missing", file.path);
      return;
    }
    const std::optional<FileState> source = stateOf(sourceOf(home_, patch, file.path));
    const bool isTwice = source && source->device == now->device && isSameInode(*source, *now);
    if (!isTwice &&
        (found_.hasRecord ? !isNewByRecord(file, *now)
                          : source || !isNewByLog(patch, file) || different.count(file.path) != 0))
      return;
    ++progressed.added;
    if (isTwice)
      add("file-twice", file.path);
    else if (!S_ISLNK(now->type) && hasForeignAttributes(patch, file, *now))
      add("file-attributes", file.path);
  }

  static bool isNewByRecord(const InterruptedFile &file, const FileState &now) {
    return !file.before || !isSameInode(*file.before, now);
  }

  /// Whether a run may have moved it: an old file can have the content of the new one.
  static bool isNewByLog(const InterruptedPatch &patch, const InterruptedFile &file) {
    return patch.facts.hasBegun || patch.facts.moved.count(file.path) != 0;
  }

  /// A file that was moved has what it has to have; without a record only the one at work may not.
  bool hasForeignAttributes(const InterruptedPatch &patch, const InterruptedFile &file,
                            const FileState &now) const {
    if (!found_.hasRecord) {
      const bool isSettled = patch.facts.hasMoved || patch.facts.moved.count(file.path) != 0;
      if (isSettled || now.mode != file.archiveMode)
        return false;
    }
    return !hasAttributes(now, attributesFor(home_, found_, file));
  }

  void tellStage(const InterruptedPatch &patch, const Progressed &progressed) {
    const std::string level = levelIn(home_.at(patch.versionFile));
    const bool allNew = !patch.files.empty() && progressed.added == patch.files.size();
    if (level.empty())
      return; // told by itself
    if (level == patch.levelAfter && (level != patch.levelBefore || allNew))
      tellHistory(patch);
    else if (allNew || (patch.files.empty() && patch.facts.hasMoved))
      add("level-old", patch.versionFile);
    else if (progressed.added + progressed.missing > 0)
      add("files-mixed", patch.versionFile);
    else if (!hasStopped(patch))
      add("nothing-applied", patch.versionFile);
  }

  /// The patch's own line, of the installation and not of one before it.
  void tellHistory(const InterruptedPatch &patch) {
    std::string name = patch.patch.descriptor->getPatchName();
    Util::trimString(name);
    std::string result;
    for (const HistoryRecord &line : readHistory(home_.path()).records)
      if (line.product == patch.patch.descriptor->getProductCode() && line.name == name &&
          line.target == patch.patch.name.getTarget() &&
          line.platform == patch.patch.name.getFullPlatform() && isOfInstallation(patch, line))
        result = line.result;
    if (result.empty())
      add("history-missing", "patchlogs/patches.hist");
    else if (result == "PASS")
      add("applied", patch.versionFile);
  }

  /// By the record's time; else the log tells whether the line was written. The last one is the last run's,
  /// whenever that was. Of a run that was killed while it wrote, the line has the time of that step.
  bool isOfInstallation(const InterruptedPatch &patch, const HistoryRecord &line) const {
    constexpr int Day = 24 * 3600;
    constexpr int Longest = 60;
    if (found_.hasRecord) {
      const std::vector<std::time_t> moments = momentsOf(line);
      return std::any_of(moments.begin(), moments.end(),
                         [this](std::time_t moment) { return moment >= found_.since; });
    }
    const int second = secondOf(line);
    const bool isOfStep =
        patch.facts.recording >= 0 && second >= 0 && (second - patch.facts.recording + Day) % Day <= Longest;
    return patch.facts.hasRecorded || isOfStep;
  }

  bool hasStopped(const InterruptedPatch &patch) const {
    std::vector<std::string> codes = patch.patch.descriptor->getDependents();
    codes.push_back(patch.patch.descriptor->getProductCode());
    return std::any_of(codes.begin(), codes.end(), [this](const std::string &code) {
      return code == "all" ? !stopped_.empty() : stopped_.count(code) != 0;
    });
  }

  void tellDirectory(const std::string &path) {
    const std::optional<FileState> now = stateOf(home_.at(path));
    if (now && S_ISDIR(now->type) && now->mode == 0700 && modeOfParent(home_, found_, path) != 0700)
      add("directory-closed", path);
  }

  void tellEmptyFiles() {
    listDirectory(home_.at("registry"), [this](const std::string &name) {
      const std::string path = "registry/" + name;
      if (fs::path(name).extension() == ".ver" && isEmptyFile(path))
        add("level-empty", path);
    });
    if (isEmptyFile("vmaorv6/agentdepot/rc.txt"))
      add("result-file-empty", "vmaorv6/agentdepot/rc.txt");
  }

  bool isEmptyFile(const std::string &path) const {
    const std::optional<FileState> now = stateOf(home_.at(path));
    return now && S_ISREG(now->type) && now->size == 0;
  }

  std::set<std::string> temporaries() const {
    const std::vector<std::string> left = home_.leftovers();
    std::set<std::string> all(left.begin(), left.end());
    for (const InterruptedPatch &patch : found_.patches)
      for (const std::string &directory : patch.temporary)
        if (stateOf(home_.at(directory)))
          all.insert(directory);
    return all;
  }

  const Home &home_;
  const Interruption &found_;
  std::vector<HomeState> states_;
  std::set<std::string> stopped_; ///< products with an instance that does not run
};

/// What most regular files of a directory have; the least of them when two are as many.
Attributes commonAttributes(const fs::path &directory, const std::string &without, Attributes unless) {
  std::map<std::tuple<unsigned, std::int64_t, std::int64_t>, std::size_t> counts;
  listDirectory(directory, [&](const std::string &name) {
    const std::optional<FileState> state = stateOf(directory / name);
    if (state && S_ISREG(state->type) && name != without)
      ++counts[{state->mode & 0777U, state->user, state->group}];
  });
  const auto most = std::max_element(counts.begin(), counts.end(),
                                     [](const auto &a, const auto &b) { return a.second < b.second; });
  if (most == counts.end())
    return unless;
  const auto &[mode, user, group] = most->first;
  return {mode, user, group};
}

} // namespace

Attributes attributesFor(const Home &home, const Interruption &found, const InterruptedFile &file) {
  if (file.before && S_ISREG(file.before->type))
    return {file.before->mode, file.before->user, file.before->group};
  if (found.hasRecord || !file.wasThere)
    return {};
  const fs::path path = home.at(file.path);
  return commonAttributes(path.parent_path(), path.filename(), {});
}

std::string sourceOf(const Home &home, const InterruptedPatch &patch, const std::string &path) {
  for (const std::string &directory : patch.temporary) {
    std::string source = home.at(directory);
    source.append("/updated_files/").append(path);
    if (stateOf(source))
      return source;
  }
  return "";
}

unsigned modeOfParent(const Home &home, const Interruption &found, const std::string &path) {
  if (!found.hasRecord)
    return 0777; // as the installer leaves them
  std::string parent = path;
  do {
    const std::size_t slash = parent.rfind('/');
    parent = slash == std::string::npos ? "" : parent.substr(0, slash);
  } while (std::find(found.directories.begin(), found.directories.end(), parent) != found.directories.end());
  const std::optional<FileState> state = stateOf(home.at(parent));
  return state ? state->mode : 0755;
}

std::vector<HomeState> tellStates(const Home &home, const Interruption &found) {
  return Teller(home, found).tell();
}
