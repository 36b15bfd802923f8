#include "transaction/plan.h"

#include <algorithm>
#include <iterator>
#include <set>

#include "checksums.h"
#include "dependents.h"
#include "judgement.h"
#include "packages.h"
#include "updatedfiles.h"
#include "utilities.h"

namespace {

RecordedPatch recordedPatch(const Home &home, const Patch &patch) {
  const PatchDescriptor &descriptor = *patch.descriptor;
  return {patch.file,
          sha256OfFile(patch.path),
          descriptor.getProductCode(),
          patch.name.getTarget(),
          descriptor.getPatchName(),
          levelIn(versionFileOf(home, patch)),
          descriptor.getVersion()->getDottedVersionString(),
          "",
          versionFileOf(home, patch).substr(home.path().size())};
}

/// The directories above a path, from the top.
std::vector<std::string> ancestors(const std::string &path) {
  std::vector<std::string> found;
  for (std::size_t slash = path.find('/'); slash != std::string::npos; slash = path.find('/', slash + 1))
    found.push_back(path.substr(0, slash));
  return found;
}

/// Collects what the patches bring; a later patch's file of the same path is one file.
class Plan {
public:
  Plan(const Home &home, Record &record) : home_(home), record_(record) {}

  void addMembers(const Patch &patch) {
    for (const auto &[path, index] : updatedFiles(patch.members)) {
      const Member::Type type = patch.members[index].type;
      for (const std::string &directory : ancestors(path))
        addDirectory(directory);
      if (type == Member::Type::Directory)
        addDirectory(path);
      else
        addFile(path);
    }
  }

  void addRewritten(const std::string &path, bool isEvidence) {
    if (!seen_.insert(path).second)
      return;
    const std::optional<FileState> before = stateOf(home_.at(path));
    record_.rewritten.push_back({path, before, before ? nextName() : "", isEvidence});
  }

  void addDirectory(const std::string &path) {
    if (seen_.insert(path).second && !stateOf(home_.at(path)))
      record_.directories.push_back({path});
  }

private:
  void addFile(const std::string &path) {
    if (!seen_.insert(path).second)
      return;
    const std::optional<FileState> before = stateOf(home_.at(path));
    record_.files.push_back({path, before, std::nullopt, before ? nextName() : ""});
  }

  std::string nextName() { return std::to_string(++names_); }

  const Home &home_;
  Record &record_;
  std::set<std::string> seen_;
  std::size_t names_ = 0;
};

/// The undo removes its directory: what is no plain name must not be built into a path.
bool isPlainName(const std::string &code) {
  return !code.empty() && code != "." && code != ".." && code.find('/') == std::string::npos;
}

std::string temporaryDirectory(const std::string &code) {
  if (!isPlainName(code))
    throw RefusalError("a product code that is no name of a directory: " + code);
  return "tmp/" + code;
}

std::vector<RecordedInstance> instancesOf(const std::vector<InstalledComponent> &components) {
  std::vector<RecordedInstance> running;
  for (const InstalledComponent &component : components)
    for (const RunningInstance &instance : component.instances)
      running.push_back({component.code, instance.name, instance.pid, instance.user});
  return running;
}

} // namespace

std::string levelIn(const std::string &versionFile) {
  std::vector<std::string> lines;
  static_cast<void>(Util::readFileByLines(versionFile.c_str(), lines));
  std::string level;
  for (const std::string &line : lines)
    if (line.rfind("VRMF", 0) == 0 && line.find('=') != std::string::npos)
      level = line.substr(line.find('=') + 1);
  Util::trimString(level);
  return level.empty() ? "" : Version(level).getDottedVersionString();
}

void planReport(const Home &home, const std::string &path, Record &record) {
  if (!stateOf(home.at("tmp")))
    record.directories.push_back({"tmp"});
  std::set<std::string> codes;
  for (const std::string &file : patchFiles(path)) {
    const Patch patch = readPatch(file);
    codes.insert(patch.name.getProduct());
    if (patch.descriptor != nullptr)
      codes.insert(patch.descriptor->getProductCode());
  }
  for (const std::string &code : codes)
    if (isPlainName(code) && !stateOf(home.at("tmp/" + code)))
      record.temporary.push_back("tmp/" + code);
}

void planInstallation(const Home &home, const std::vector<Patch> &patches, Record &record) {
  record.directories.clear();
  Plan plan(home, record);
  plan.addDirectory("tmp");
  std::set<std::string> temporary;
  std::set<std::string> dependents;
  const std::vector<InstalledComponent> components = home.components();
  for (const Patch &patch : patches) {
    record.patches.push_back(recordedPatch(home, patch));
    plan.addMembers(patch);
    plan.addRewritten(versionFileOf(home, patch).substr(home.path().size()), false);
    temporary.insert(temporaryDirectory(patch.name.getProduct()));
    temporary.insert(temporaryDirectory(patch.descriptor->getProductCode()));
    for (const DependentInstance &dependent : dependentInstances(patch, components))
      dependents.insert(dependent.code);
  }
  plan.addRewritten("vmaorv6/agentdepot/rc.txt", false);
  plan.addRewritten("patchlogs/patches.hist", true);
  record.temporary.assign(temporary.begin(), temporary.end());
  record.dependents.assign(dependents.begin(), dependents.end());
  std::copy_if(temporary.begin(), temporary.end(), std::back_inserter(record.setAside),
               [&home](const std::string &directory) { return stateOf(home.at(directory)).has_value(); });
  record.before = instancesOf(components);
}

std::vector<RecordedInstance> runningInstances(const Home &home) {
  return instancesOf(home.components());
}
