// The removal of links that an incomplete removal has left: the next archive is extracted over the temporary
// directory and would be written through them.
#pragma once

#include <string>

/// Removes the symbolic links of a tree, or `path` itself if it is one, without following any. All else
/// stays, and nothing is logged.
void removeSymbolicLinks(const std::string &path);
