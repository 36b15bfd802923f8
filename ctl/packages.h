// The patches that a path means for one home: those that apply, in the installer's order.
#pragma once

#include <string>
#include <vector>

#include "home.h"
#include "patch.h"

/// Reads the patches of a file or a directory that the installer would take on this home. JudgementError when
/// none applies, when one cannot be read, or when one has no valid descriptor.
std::vector<Patch> applicablePatches(const Home &home, const std::string &path);

/// The version file that records a patch's level, as a path.
std::string versionFileOf(const Home &home, const Patch &patch);
