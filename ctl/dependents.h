// The running instances that a patch stops and starts again.
#pragma once

#include <string>
#include <vector>

#include "home.h"
#include "patch.h"

struct DependentInstance {
  std::string code; ///< product code, "kyn"
  RunningInstance instance;
};

/// Those of the products that the patch names and of its own; of all agents for "all". The two helpers of the
/// universal agent that the installer leaves running are not among them.
std::vector<DependentInstance> dependentInstances(const Patch &patch,
                                                  const std::vector<InstalledComponent> &components);

/// The kind under which the installer looks a product up whose instances it stops or starts.
ORVComponent::Type controlKind(const std::string &code);

/// Whether the installer leaves an instance alone: two helpers of the universal agent serve its other
/// instances.
bool isLeftRunning(const std::string &code, const std::string &instance);
