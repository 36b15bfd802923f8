// The one failure path: format the catalogue text, log it, fill the record, return false.
//
// The line that detects a failure reads
//     return FAILURE(err, PatchError::CannotRemoveDirectory, "ERROR_PP_RM_DIR", tempDir.c_str());
// Deviations (a text that is not logged, a code without a text) are spelled out where they are.
#pragma once

#include <string>

#include "logger.h"

/// Sets code and text of the record, unless it is null.
void fillRecord(PatchError *err, int code, const std::string &text);

/// Logs the text of `key` at error level under `component`, fills the record (which may be null) and returns
/// false. Called through FAILURE, which passes the source line.
bool reportFailure(int line, const char *component, PatchError *err, int code, const char *key, ...);

#define FAILURE(err, code, ...) reportFailure(__LINE__, LOG_COMPONENT, (err), (code), __VA_ARGS__)
