// SHA-256 checksums of patch files, and the list SHA256SUMS of a folder of patches.
//
// They are computed by sha256sum: a library for it would tie the program to one release of one distribution.
#pragma once

#include <string>

/// The checksum of a file in lower-case hexadecimal digits. JudgementError when it cannot be computed.
std::string sha256OfFile(const std::string &path);

/// The checksum that a list has for a file name, in lower case; empty when the list cannot be read or does
/// not name the file.
std::string listedChecksum(const std::string &list, const std::string &fileName);
