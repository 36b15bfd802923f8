// Files in memory alone.
#pragma once

/// A new file without a name, closed on exec; -1 with the reason in errno.
int memoryFile(const char *label);
