#include "target.h"

#include <algorithm>

#include "utilities.h"

namespace {

bool monitoringServer(const std::string &) {
  return Util::isVEMSInstalled();
}

bool portalServer(const std::string &platform) {
  return Util::isVEPSInstalled(platform);
}

bool desktopClient(const std::string &platform) {
  return Util::isVEPDInstalled(platform);
}

template <class Matches>
const Target *findFirst(Matches matches) {
  const auto found = std::find_if(targets.begin(), targets.end(), matches);
  return found == targets.end() ? nullptr : &*found;
}

} // namespace

constexpr std::array<Target, 5> targets = {{
    {"vecm", ORVComponent::TYPE_CLI, "VECM", true, "zt", nullptr, nullptr},
    {"vems", ORVComponent::TYPE_VEMS, "VEMS", false, "qa", "vms.ver", monitoringServer},
    {"veps", ORVComponent::TYPE_VEPS, "VEPS", false, "pt", "vps.ver", portalServer},
    // KEEP(vepd-veps-words): a missing support for the desktop client is traced as one for the portal server.
    {"vepd", ORVComponent::TYPE_VEPD, "VEPS", false, "dk", "vpd.ver", desktopClient},
    {"vema", ORVComponent::TYPE_AGENT, "VEMA", true, nullptr, nullptr, nullptr},
}};

const Target *findTarget(const std::string &name) {
  return findFirst([&name](const Target &target) { return target.name == name; });
}

ORVComponent::Type targetKind(const std::string &name) {
  const Target *const target = findTarget(name);
  return target == nullptr ? ORVComponent::TYPE_AGENT : target->kind;
}

std::size_t targetOrder(const std::string &name) {
  const Target *const target = findTarget(name);
  return target == nullptr ? targets.size() : static_cast<std::size_t>(target - targets.data());
}

std::string versionFileName(const Target *target, const std::string &code, const std::string &platform) {
  const bool isSupport = target != nullptr && target->fileEnd != nullptr && code != target->ownCode;
  return isSupport ? code + target->fileEnd : code + platform + ".ver";
}

ORVComponent::Type versionFileKind(const std::string &path) {
  const std::string code = path.substr(path.rfind('/') + 1, 2);
  const Target *const own = findFirst(
      [&code](const Target &target) { return target.ownCode != nullptr && code == target.ownCode; });
  const Target *const supported = findFirst([&path](const Target &target) {
    return target.fileEnd != nullptr && path.find(target.fileEnd) != std::string::npos;
  });
  // A server's own files are the server's, whatever their names end in; those of the command line are not.
  if (own != nullptr && (own->fileEnd != nullptr || supported == nullptr))
    return own->kind;
  return supported == nullptr ? ORVComponent::TYPE_AGENT : supported->kind;
}
