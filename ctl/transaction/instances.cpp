#include "transaction/instances.h"

#include <algorithm>

#include "dependents.h"
#include "orvcomponentregistry.h"
#include "transaction/plan.h"

namespace {

bool contains(const std::vector<std::string> &list, const std::string &text) {
  return std::find(list.begin(), list.end(), text) != list.end();
}

} // namespace

bool stopInstances(const Home &home, const std::vector<std::string> &products,
                   std::vector<std::string> &messages) {
  const ORVComponentRegistry registry;
  bool allStopped = true;
  for (const RecordedInstance &instance : runningInstances(home)) {
    if (!contains(products, instance.product) || isLeftRunning(instance.product, instance.name))
      continue;
    ORVComponent *const component =
        registry.getInstalledComponent(instance.product, controlKind(instance.product));
    PatchError error;
    if (component != nullptr && component->stopInstance(instance.name, &error))
      continue;
    allStopped = false;
    messages.push_back(nameOf(instance) + ": not stopped: " + error.text);
  }
  return allStopped;
}

void startMissing(const Home &home, const std::vector<RecordedInstance> &wanted,
                  std::vector<std::string> &messages) {
  const std::vector<RecordedInstance> running = runningInstances(home);
  const ORVComponentRegistry registry;
  for (const RecordedInstance &instance : wanted) {
    if (isAmong(running, instance))
      continue;
    ORVComponent *const component =
        registry.getInstalledComponent(instance.product, controlKind(instance.product));
    PatchError error;
    if (component != nullptr) {
      component->setOwner(instance.name, instance.user);
      if (component->startInstance(instance.name, &error))
        continue;
    }
    messages.push_back(nameOf(instance) + ": not started: " + error.text);
  }
}
