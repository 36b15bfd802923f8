// The archive of a patch, made from a source tree: the same bytes from the same tree, for any place, user and
// time zone.
#pragma once

#include <cstdint>
#include <optional>
#include <string>

/// Writes the archive: patch.ini, then the commands with what lies beside them, then updated_files, each
/// sorted by bytes. Names that begin with "." at the top of the tree stay out. Owner and group are 0 without
/// names, modes 0755 or 0644, times at most `latest`; a directory bears the time of the newest file. Links
/// and special files are written as what they are. JudgementError when something cannot be read or written.
void writePatchArchive(const std::string &tree, const std::string &archive,
                       std::optional<std::int64_t> latest);
