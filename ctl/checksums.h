// SHA-256 checksums of patch files, and the list SHA256SUMS of a folder of patches.
//
// They are computed by sha256sum: a library for it would tie the program to one release of one distribution.
#pragma once

#include <string>

/// The checksum of a file in lower-case hexadecimal digits. JudgementError when it cannot be computed.
std::string sha256OfFile(const std::string &path);

/// The checksum that a list has for a file name, in lower case; empty when the list does not name the file,
/// or does not exist. JudgementError when it cannot be read.
std::string listedChecksum(const std::string &list, const std::string &fileName);

/// The text of a list with this checksum for the file name, in place of an older one.
std::string checksumListWith(const std::string &list, const std::string &fileName, const std::string &digest);
