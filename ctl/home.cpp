#include "home.h"

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <memory>
#include <tuple>
#include <utility>

#include <sys/stat.h>
#include <unistd.h>

#include "judgement.h"
#include "logger.h"
#include "look.h"
#include "orvcomponentregistry.h"
#include "patchfilename.h"
#include "process.h"
#include "utilities.h"

namespace {

constexpr const char *RunInfo = "config/.ConfigData/RunInfo";

bool contains(std::string_view text, std::string_view piece) {
  return text.find(piece) != std::string_view::npos;
}

/// Also when the look at it fails for another reason than its absence: then it counts as one that cannot be
/// read.
bool mayBeRegularFile(const std::string &path) {
  struct stat status = {};
  if (stat(path.c_str(), &status) == 0)
    return S_ISREG(status.st_mode);
  return errno != ENOENT && errno != ENOTDIR && errno != ELOOP;
}

/// Listens to the installer's units, which go on without what they cannot read but say so in their trace.
class FailureWatch {
public:
  explicit FailureWatch(const std::string &home)
      : home_(home), before_(setLogSink([this](std::string_view line) { look(line); })) {}
  FailureWatch(const FailureWatch &) = delete;
  FailureWatch &operator=(const FailureWatch &) = delete;
  ~FailureWatch() { static_cast<void>(setLogSink(std::move(before_))); }

  /// JudgementError with the first failure, or when nothing was read of a registry that has version files:
  /// the installer takes a directory that cannot be opened for an empty one.
  void check(const std::vector<std::string> &versionFiles) const {
    if (!failure_.empty())
      throw JudgementError(failure_);
    if (!hasReadVersionFile_ && !versionFiles.empty())
      throw JudgementError("cannot read " + home_ + "registry");
  }

private:
  void look(std::string_view line) {
    hasReadVersionFile_ = hasReadVersionFile_ || contains(line, "): ORVComponentRegistry::buildComponent(");
    if (!failure_.empty())
      return;
    if (contains(line, "): Could not read "))
      lookAtVersionFile(line);
    else if (contains(line, "): unable to read RunInfo file") && access((home_ + RunInfo).c_str(), F_OK) == 0)
      failure_ = "cannot read " + home_ + RunInfo;
    else if (contains(line, "): unable to running command") || contains(line, "): Error creating std") ||
             contains(line, "): Error calling fork"))
      failure_ = "cannot run ps";
    else if (contains(line, "): Error from readdir: ") ||
             contains(line, "): Unable to determine file/directory for path: "))
      failure_ = "cannot read " + home_ + "registry";
  }

  /// What is no regular file is none for the installer by design; that it could not be read is no failure.
  void lookAtVersionFile(std::string_view line) {
    static constexpr std::string_view before = "): Could not read ";
    line.remove_prefix(line.find(before) + before.size());
    const std::string path(line.substr(0, line.rfind(": ")));
    if (mayBeRegularFile(path))
      failure_ = "cannot read " + path;
  }

  std::string home_;
  std::string failure_;
  bool hasReadVersionFile_ = false;
  LogSink before_;
};

/// The names of the registry's version files, as the installer chooses them.
std::vector<std::string> versionFilesOf(const std::string &registry) {
  static constexpr std::string_view end = ".ver";
  std::vector<std::string> names;
  const bool exists = listDirectory(registry, [&](const std::string &name) {
    const bool isNamedSo =
        name.size() > end.size() && name.compare(name.size() - end.size(), end.size(), end) == 0;
    if (isNamedSo && !contains(name, "vpw.ver") && mayBeRegularFile(registry + "/" + name))
      names.push_back(name);
  });
  if (!exists)
    throw JudgementError("cannot read " + registry + ": " + strerror(ENOENT));
  return names;
}

/// A `ps` that is missing, or another make of it, would make every instance look stopped.
void requirePs() {
  const std::string own = std::to_string(getpid());
  CommandResult ps;
  if (!runCommand({"ps", "-p", own}, ps) || ps.rc != 0 || !contains(ps.out, own))
    throw JudgementError("cannot tell which instances run: ps -p does not find a process that runs");
}

InstalledComponent describe(const ORVComponent &component) {
  InstalledComponent described{component.getName(), component.getDescriptiveName(),
                               component.getType(), component.getVersion()->getDottedVersionString(),
                               component.getArch(), {}};
  for (const std::string &instance : component.getActiveInstances())
    described.instances.push_back({instance, component.getPid(instance), component.getOwner(instance)});
  return described;
}

/// Whether a directory of tmp is the one into which a patch is unpacked: it bears the product's code, which a
/// patch's name may also hold without the "k" that every installed product has.
bool isPatchDirectory(const std::string &tmp, const std::string &name) {
  if (!PatchFileName(name + "_unix_vema_fp.tar").isValid())
    return false;
  return name.front() == 'k' || name.front() == 'K' || access((tmp + name + "/patch.ini").c_str(), F_OK) == 0;
}

} // namespace

Home::Home(const std::string &path) : path_(path) {
  if (path_.empty() || path_.back() != '/')
    path_ += '/';
  if (access(path_.c_str(), F_OK) != 0)
    throw JudgementError(NLS::getFormattedString("ERROR_ORV_HOME", path_.c_str()));
  Util::setEnvironment("QUILLHOME", path_);
}

std::vector<InstalledComponent> Home::components() const {
  const std::vector<std::string> versionFiles = versionFilesOf(at("registry"));
  requirePs();
  std::vector<InstalledComponent> components;
  const FailureWatch watch(path_);
  const ORVComponentRegistry registry;
  watch.check(versionFiles);
  for (const ORVComponent *component : *registry.getInstalledComponents())
    components.push_back(describe(*component));
  std::sort(
      components.begin(), components.end(), [](const InstalledComponent &a, const InstalledComponent &b) {
        return std::tie(a.code, a.type, a.platform, a.level) < std::tie(b.code, b.type, b.platform, b.level);
      });
  return components;
}

std::vector<std::string> Home::leftovers() const {
  const std::string tmp = at("tmp/");
  if (access(tmp.c_str(), F_OK) != 0 && errno == ENOENT)
    return {};
  std::vector<std::string> found;
  listDirectory(tmp, [&](const std::string &name) {
    if (isDirectory(tmp + name) && isPatchDirectory(tmp, name))
      found.push_back("tmp/" + name);
  });
  std::sort(found.begin(), found.end());
  return found;
}

const char *kindName(ORVComponent::Type type) {
  switch (type) {
  case ORVComponent::TYPE_VEMS:
    return "monitoring-server";
  case ORVComponent::TYPE_VEPS:
    return "portal-server";
  case ORVComponent::TYPE_VEPD:
    return "desktop-client";
  case ORVComponent::TYPE_CLI:
    return "cli";
  default:
    return "agent";
  }
}
