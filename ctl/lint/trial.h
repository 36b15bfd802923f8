// What tar, run as the installer runs it, says of an archive.
#pragma once

#include "child.h"
#include "patch.h"

/// Extracts the archive in a folder that goes again, without the content of plain archives: there tar can
/// only fail while it reads. JudgementError when tar cannot be run, or when the file system has no room for
/// the content.
ChildResult tryTar(const Patch &patch);
