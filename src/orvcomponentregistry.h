// The one list of installed components, built on first use from the version files in registry/ of the home
// and from the run information, and never rebuilt during a run.
#pragma once

#include <functional>
#include <string>
#include <vector>

#include "orvcomponent.h"
#include "ownedlist.h"

class ORVComponentRegistry {
public:
  /// The single instance, made and filled on the first call. It lives to the end of the
  /// process unless it is deleted; the next call then builds a new one.
  static ORVComponentRegistry *getInstance();

  ORVComponentRegistry();
  ORVComponentRegistry(const ORVComponentRegistry &) = delete;
  ORVComponentRegistry &operator=(const ORVComponentRegistry &) = delete;
  virtual ~ORVComponentRegistry();

  /// In the order in which the directory lists the version files; owned by the registry.
  const std::vector<ORVComponent *> *getInstalledComponents() const { return components_.items(); }

  /// The first component with this name ("k" form) and type; null when there is none.
  ORVComponent *getInstalledComponent(const std::string &name, ORVComponent::Type type) const;
  /// The first with this name, type and architecture.
  ORVComponent *getInstalledComponentByArch(const std::string &name, ORVComponent::Type type,
                                            const std::string &arch) const;

  /// Adds a component for every qualifying version file.
  void buildComponents();
  /// Adds the component of one version file, unless the file is unreadable or has no VRMF.
  void buildComponent(const std::string &path, const std::string &cinfo);

private:
  ORVComponent *findFirst(const std::function<bool(const ORVComponent &)> &matches) const;

  static ORVComponentRegistry *_inst;

  std::string home_;
  OwnedList<ORVComponent> components_;
};

/// The installed component that is started and stopped under a product code, a server or an agent; null when
/// the product is not installed.
ORVComponent *getComponent(const std::string &code);

/// Text of config/.ConfigData/RunInfo under `home`; empty when it cannot be read.
std::string getCInfo_Running(std::string home);
