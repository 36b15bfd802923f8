#include "dependents.h"

#include <algorithm>

#include "target.h"

namespace {

bool stopsInstances(const Patch &patch) {
  const Target *const target = findTarget(patch.name.getTarget());
  const std::string product = patch.descriptor->getProductCode();
  return (target != nullptr && target->stopsDependents) || product == "kqa" || product == "kpt";
}

} // namespace

std::vector<DependentInstance> dependentInstances(const Patch &patch,
                                                  const std::vector<InstalledComponent> &components) {
  std::vector<DependentInstance> found;
  if (!stopsInstances(patch))
    return found;
  std::vector<std::string> codes = patch.descriptor->getDependents();
  codes.push_back(patch.descriptor->getProductCode());
  const bool all = codes.front() == "all";
  for (const InstalledComponent &component : components) {
    const bool isMeant = all ? component.type == ORVComponent::TYPE_AGENT
                             : component.type == controlKind(component.code) &&
                                   std::find(codes.begin(), codes.end(), component.code) != codes.end();
    for (const RunningInstance &instance : component.instances)
      if (isMeant && !isLeftRunning(component.code, instance.name))
        found.push_back({component.code, instance});
  }
  return found;
}

ORVComponent::Type controlKind(const std::string &code) {
  if (code == "kqa")
    return ORVComponent::TYPE_VEMS;
  return code == "kpt" ? ORVComponent::TYPE_VEPS : ORVComponent::TYPE_AGENT;
}

bool isLeftRunning(const std::string &code, const std::string &instance) {
  return code == "kwn" &&
         (instance.find("kwnsnetd_") != std::string::npos || instance.find("kwnstrap_") != std::string::npos);
}
