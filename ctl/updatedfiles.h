// The tree updated_files of an archive: which members stand for which paths of a home.
#pragma once

#include <cstddef>
#include <map>
#include <string>
#include <vector>

#include "patcharchive.h"

/// The path of a member relative to the home; empty when the member is not below updated_files.
std::string updatedFilePath(const std::string &memberName);

/// Each path below updated_files with the index of the last member of that name, which is the one that an
/// extraction leaves.
std::map<std::string, std::size_t> updatedFiles(const std::vector<Member> &members);
