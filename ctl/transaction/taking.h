// Taking patches to a place where others cannot change them between the check and the installation.
#pragma once

#include <string>

/// Copies a patch file, or the patch files of a directory, with the list of checksums and its signature,
/// below `folder`. The copies keep their names, and a directory its own, so that the installer says the same
/// of them. Returns the path to install. JudgementError when something cannot be read, RefusalError when it
/// cannot be copied.
std::string takePatches(const std::string &path, const std::string &folder);

/// Removes the copies.
void removePatches(const std::string &folder);
