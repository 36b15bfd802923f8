// The instances that a patch stops before its files are moved, and starts again afterwards.
#include "patchprocessor/patchprocessor.h"

#include <algorithm>
#include <cstdio>

#include "logger.h"
#include "orvcomponentregistry.h"
#include "target.h"
#include "utilities.h"

#define LOG_COMPONENT "patchprocessor"

namespace {

using Instances = std::vector<std::string>;

/// Whether an instance is never stopped: two helpers of the universal agent run for all its other instances.
bool isLeftRunning(const std::string &code, const std::string &instance) {
  if (code != "kwn")
    return false;
  if (instance.find("kwnsnetd_") == std::string::npos && instance.find("kwnstrap_") == std::string::npos)
    return false;
  LOG_TRACE("Found kwn instance of %s, skipping.", instance.c_str());
  return true;
}

/// For a list that includes the patch's own product, and so is never empty.
bool meansAll(const std::vector<std::string> &codes) {
  return codes.front() == "all";
}

/// The component of a listed product; null when it is not installed or has no running instance.
ORVComponent *runningComponent(const std::string &code) {
  ORVComponent *const component = getComponent(code);
  if (component == nullptr)
    LOG_TRACE("Dependent product not found: %s", code.c_str());
  else if (component->getActiveInstances().empty())
    LOG_TRACE("No running instances of %s found", code.c_str());
  else
    return component;
  return nullptr;
}

void traceProduct(const ORVComponent &component) {
  LOG_TRACE("Processing instances for product: %s: %s", component.getName().c_str(),
            component.getDescriptiveName().c_str());
}

/// Stops the instances of one component when all agents are stopped; false at the first failure.
bool stopAgent(ORVComponent &component, Instances &stopped, PatchError *err) {
  const std::string name = component.getName();
  for (const std::string &instance : component.getActiveInstances()) {
    if (isLeftRunning(name, instance))
      continue;
    if (!component.stopInstance(instance, err))
      return false;
    LOG_TRACE("Stopped active instance %s for product: %s, ", instance.c_str(), name.c_str());
    stopped.push_back(instance);
  }
  return true;
}

/// The same for a listed product.
bool stopListedAgent(ORVComponent &component, const std::string &code, Instances &stopped, PatchError *err) {
  for (const std::string &instance : component.getActiveInstances()) {
    LOG_TRACE("Attempting to stop instance [%s]", instance.c_str());
    if (isLeftRunning(code, instance))
      continue;
    if (!component.stopInstance(instance, err))
      return false;
    LOG_TRACE("Adding instance [%s] to the list of stopped agents", instance.c_str());
    stopped.push_back(instance);
  }
  return true;
}

bool startAll(ORVComponent &component, const Instances &instances, PatchError *err) {
  for (const std::string &instance : instances) {
    LOG_TRACE("Attempting to start instance [%s]", instance.c_str());
    if (!component.startInstance(instance, err)) {
      LOG_TRACE("start failed, exiting method prematurely");
      return false;
    }
  }
  return true;
}

void printInstances(const ORVComponent &component, const Instances &instances) {
  const std::string product = component.getDescriptiveName();
  for (const std::string &instance : instances) {
    if (instance.empty())
      printf("    %s\n", product.c_str());
    else
      printf("    %s instance of %s\n", instance.c_str(), product.c_str());
  }
}

} // namespace

bool PatchProcessor::hasDependents() const {
  const Target *const target = findTarget(patchFileName().getTarget());
  const std::string product = descriptor_->getProductCode();
  if ((target != nullptr && target->stopsDependents) || product == "kqa" || product == "kpt")
    return true;
  LOG_TRACE("This patch is not target for a vema or vecm, no dependents will be stopped");
  return false;
}

bool PatchProcessor::buildDependentsList(PatchError *) {
  LOG_TRACE("PatchProcessor::buildDependentsList() %s", "entry");
  if (!hasDependents())
    return true;
  std::vector<std::string> codes = descriptor_->getDependents();
  // KEEP(report-own-code-twice): unlike stopDependents, the report adds the patch's own product even when it
  // is listed already; the second look-up replaces the first.
  codes.push_back(descriptor_->getProductCode());
  if (meansAll(codes))
    collectAll();
  else
    collectListed(codes);
  LOG_TRACE("PatchProcessor::buildDependentsList = %d", true);
  return true;
}

void PatchProcessor::collectAll() {
  LOG_TRACE("Processing ALL active instances");
  for (const ORVComponent *component : *ORVComponentRegistry::getInstance()->getInstalledComponents()) {
    traceProduct(*component);
    const std::string name = component->getName();
    const std::string product = component->getDescriptiveName();
    if (component->getType() != ORVComponent::TYPE_AGENT) {
      LOG_TRACE("Non-stoppable component, will not be added to the list of agents to be stopped: %s",
                product.c_str());
      continue;
    }
    Instances running;
    for (const std::string &instance : component->getActiveInstances()) {
      if (isLeftRunning(name, instance))
        continue;
      LOG_TRACE("Found active instance %s for product: %s.", instance.c_str(), name.c_str());
      running.push_back(instance);
    }
    if (running.empty())
      LOG_TRACE("No running instances for: %s", name.c_str());
    else
      dependents_[name] = running;
  }
}

void PatchProcessor::collectListed(const std::vector<std::string> &codes) {
  for (const std::string &code : codes) {
    const ORVComponent *const component = runningComponent(code);
    if (component == nullptr)
      continue;
    Instances running;
    for (const std::string &instance : component->getActiveInstances())
      if (!isLeftRunning(code, instance))
        running.push_back(instance);
    dependents_[code] = running;
  }
}

bool PatchProcessor::printDependentsList(PatchError *err) {
  LOG_TRACE("PatchProcessor::printDependentsList() %s", "entry");
  static_cast<void>(buildDependentsList(err)); // always true
  if (dependents_.empty()) {
    printf("%s\n\n", NLS::getString("PP_NO_RUNNING_INST").c_str());
  } else {
    printf("%s\n", NLS::getString("PP_LIST_AGENT_INST").c_str());
    for (const auto &[code, instances] : dependents_)
      if (const ORVComponent *const component = getComponent(code))
        printInstances(*component, instances);
    printf("\n");
  }
  LOG_TRACE("PatchProcessor::printDependentsList = %d", true);
  return true;
}

bool PatchProcessor::stopDependents(PatchError *err) {
  LOG_TRACE("PatchProcessor::stopDependents() %s", "entry");
  if (!hasDependents())
    return true;
  std::vector<std::string> codes = descriptor_->getDependents();
  const std::string product = descriptor_->getProductCode();
  if (std::find(codes.begin(), codes.end(), product) == codes.end())
    codes.push_back(product);
  const bool all = meansAll(codes);
  const bool result = all ? stopAll(err) : stopListed(codes, err);
  if (!result)
    LOG_TRACE("stop failed, exiting method prematurely");
  // KEEP(stop-result-line): a failure among listed products, unlike one among all agents, leaves no result
  // line.
  if (result || all)
    LOG_TRACE("PatchProcessor::stopDependents() = %d", result);
  return result;
}

bool PatchProcessor::stopAll(PatchError *err) {
  LOG_TRACE("Stopping ALL active instances");
  for (ORVComponent *component : *ORVComponentRegistry::getInstance()->getInstalledComponents()) {
    traceProduct(*component);
    const std::string name = component->getName();
    const std::string product = component->getDescriptiveName();
    if (component->getType() != ORVComponent::TYPE_AGENT) {
      LOG_TRACE("Non-stoppable component, will not be added to the list of stopped agents: %s",
                product.c_str());
      continue;
    }
    Instances stopped;
    if (!stopAgent(*component, stopped, err))
      return false;
    if (stopped.empty())
      LOG_TRACE("No running instances for: %s", name.c_str());
    else
      dependents_[name] = stopped;
  }
  return true;
}

bool PatchProcessor::stopListed(const std::vector<std::string> &codes, PatchError *err) {
  for (const std::string &code : codes) {
    ORVComponent *const component = runningComponent(code);
    if (component == nullptr)
      continue;
    Instances stopped;
    if (!stopListedAgent(*component, code, stopped, err))
      return false;
    if (stopped.empty())
      LOG_TRACE("No instances to stop for agent type: %s", code.c_str());
    else
      LOG_TRACE("Stopped %d instance(s) of %s", static_cast<int>(stopped.size()), code.c_str());
    dependents_[code] = stopped;
  }
  return true;
}

bool PatchProcessor::startDependents(PatchError *err) {
  LOG_TRACE("PatchProcessor::startDependents() %s", "entry");
  const bool result = startInstances(err);
  LOG_TRACE("PatchProcessor::startDependents() = %d", result);
  return result;
}

bool PatchProcessor::startInstances(PatchError *err) {
  for (const auto &[code, instances] : dependents_) {
    ORVComponent *const component = getComponent(code);
    if (component == nullptr)
      LOG_TRACE("Could not find product in registry: %s", code.c_str());
    else if (code == glbOsAgentPC)
      continue; // startOSAgentIfNeeded restarts it
    else if (instances.empty())
      LOG_TRACE("There are no instances of agent type: %s, that need to be started.", code.c_str());
    else if (!startAll(*component, instances, err))
      return false;
  }
  return true;
}
