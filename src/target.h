// What the target of a patch means: the third part of its file name, which tells for which kind of component
// it is.
//
// One table, in the order in which the patches of a directory are applied. Who reads a patch's name, looks
// for its version file, or sorts patches asks here, so that a target means the same everywhere.
#pragma once

#include <array>
#include <string>

#include "orvcomponent.h"

struct Target {
  const char *name; ///< in the patch's file name
  ORVComponent::Type kind;
  const char *logName;  ///< in the trace of a missing version file
  bool stopsDependents; ///< whichever product the patch is for
  const char *ownCode;  ///< product code of the one component of the kind, without "k"; null for agents
  const char *fileEnd;  ///< of the version file of another product's support for a server; null for others
  bool (*isServerInstalled)(const std::string &platform); ///< null where none is required
};

extern const std::array<Target, 5> targets;

/// The target of this name, compared exactly; null when there is none.
const Target *findTarget(const std::string &name);

/// The kind of component of a target; that of an agent for an unknown name.
ORVComponent::Type targetKind(const std::string &name);

/// Place of a target in the order of application; an unknown one comes last.
std::size_t targetOrder(const std::string &name);

/// Name of the version file that a patch for `target`, which may be null, belongs to. `code` is the
/// product's, in lower case and without "k".
std::string versionFileName(const Target *target, const std::string &code, const std::string &platform);

/// The kind of component that a version file describes.
ORVComponent::Type versionFileKind(const std::string &path);
