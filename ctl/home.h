// The product's home as the installer sees it: what is installed in it, and what of that runs.
//
// All of it is asked of the installer's units. Where these pass over what they cannot read, and would so take
// an installed component or a running instance for none, this unit throws instead.
#pragma once

#include <string>
#include <vector>

#include "orvcomponent.h"

struct RunningInstance {
  std::string name; ///< empty for the default instance
  std::string pid;  ///< as the run information holds it
  std::string user; ///< whom the installer takes for its owner; empty when it cannot find out
};

struct InstalledComponent {
  std::string code; ///< "kyn"
  std::string name; ///< its description in the version file
  ORVComponent::Type type = ORVComponent::TYPE_AGENT;
  std::string level;    ///< "06.10.00.02"
  std::string platform; ///< "lpp266"; "vms", "vps" or "vpd" for a server's support of a product
  std::vector<RunningInstance> instances;
};

class Home {
public:
  /// Checks the home as the installer does and makes it that of the installer's units. JudgementError when
  /// it does not exist.
  explicit Home(const std::string &path);

  const std::string &path() const { return path_; } ///< ends in "/"
  std::string at(const std::string &relative) const { return path_ + relative; }

  /// Reads registry and run information anew. By code, kind and platform. JudgementError when a part of them
  /// cannot be read, or when `ps` does not tell which processes run.
  std::vector<InstalledComponent> components() const;

  /// The temporary directories of patches that are there, relative to the home, sorted: "tmp/kyn".
  std::vector<std::string> leftovers() const;

private:
  std::string path_;
};

/// "agent", "monitoring-server", "portal-server", "desktop-client" or "cli".
const char *kindName(ORVComponent::Type type);
