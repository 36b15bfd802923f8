// What a removal must not leave behind: a link that stays in the temporary directory would lead the next
// archive, which is extracted over it, to wherever the last one wanted.
#pragma once

#include <string>

/// Removes the symbolic links of a tree, or `path` itself where it is one, without following any. All else
/// stays, and nothing is said.
void removeSymbolicLinks(const std::string &path);
