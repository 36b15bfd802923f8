// The message catalogue and the error record.
//
// Every text for users is looked up here by its key. Scripts of operators read these texts, so they keep
// every byte of their first publication, misspellings included. The error record carries a failure from the
// operation that detects it up to the driver, whose exit status is the record's code.
#pragma once

#include <cstdarg>
#include <cstdint>
#include <string>

/// True once the first look-up has filled the catalogue.
extern bool glbInitialized;

/// Namespace-like class of the catalogue look-ups. The keys are C strings because the last named parameter
/// before an ellipsis may not be a reference.
class NLS {
public:
  /// The template stored under `key`, or "!key!" when there is none: a look-up never fails.
  static std::string getString(const char *key);

  /// The template under `key` filled with the arguments that its conversions ask for; cut at 1023 characters.
  static std::string getFormattedString(const char *key, ...);

  /// The same for an argument list.
  static std::string getFormattedStringV(const char *key, va_list arguments);
};

/// A failure: a code, 0 for none, and the text for the user. Passed by pointer through every
/// operation that can fail; the pointer may be null.
struct PatchError {
  /// The codes of the whole tool; the code of a failed run is its exit status.
  enum Code : std::int32_t {
    ScriptFailed = -1, ///< replaced by the code of the command list
    None = 0,
    CannotExtract = 3,
    PropertyBeforeSection = 4,
    CannotReadFile = 5,
    MissingSection = 6,
    MissingProperty = 7,
    MissingProduct = 9,
    WrongPrereqVersion = 10,
    BacklevelPatch = 11,
    CannotStartAgent = 12,
    CannotStartInstance = 13,
    CannotStopAgent = 14,
    CannotStopInstance = 15,
    CannotStartServer = 16,
    CannotStopServer = 18,
    ServerInstanceFailed = 19,
    CannotSwitchUser = 20,
    PreScriptFailed = 21,
    PrePatchScriptFailed = 22,
    PostScriptFailed = 23,
    CannotChangeDirectory = 24,
    CannotMoveFile = 25,
    CannotMakeDirectory = 26,
    CannotRemoveDirectory = 27,
    CannotUpdateVersion = 28,
    PathNotFound = 30,
    NoFiles = 31,
    NoApplicablePatch = 32,
    NotApplicable = 34,
    MonitoringServerRunning = 35,
    PortalServerRunning = 36,
    ConsoleRunning = 37
  };

  std::int32_t code = None;
  std::string text;
};
