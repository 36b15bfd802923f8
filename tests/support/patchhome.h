// A home with patches for it: descriptors, real archives, and processors ready for one operation.
#pragma once

#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "fakehome.h"
#include "patchprocessor/patchprocessor.h"

/// Text of a patch.ini for a product and a level of eight digits; `sections` stands behind ProductInfo.
std::string patchIni(const std::string &productCode, const std::string &level = "06200001",
                     const std::string &sections = "");
/// A section of bare lines.
std::string bareSection(const std::string &name, const std::vector<std::string> &lines);

/// A member of a patch archive; a path that ends in "/" is a directory.
struct Member {
  std::string path;
  std::string content;
  unsigned mode = 0644;
};

/// A command of a patch: notes `word` in the journal, then does what `shell` says.
Member command(const std::string &name, const std::string &word, const std::string &shell = "");

/// Fixture: patches lie in patches/ of the home.
class PatchHome : public FakeHome {
public:
  using Processor = std::unique_ptr<PatchProcessor>;

  /// Path of a patch file, whether it is there or not.
  std::string patchPath(const std::string &fileName) const { return home() + "patches/" + fileName; }
  /// Makes the archive with tar; returns its path.
  std::string makePatch(const std::string &fileName, const std::string &ini,
                        const std::vector<Member> &members = {}) const;

  /// A processor for a patch file that need not be there; nothing is loaded.
  Processor processorFor(const std::string &fileName) const;
  /// The same with its descriptor loaded from `ini`, extracted by hand; the log is read up to here.
  Processor loaded(const std::string &fileName, const std::string &ini);

  /// What the processors logged since the log was read last.
  LogLines ownLines() { return logLinesOf("patchprocessor"); }
  /// A failure of the patch processor; see FakeHome::expectFailure.
  LogLines expectOwnFailure(const Record &expected, const std::function<bool(PatchError *)> &operation) {
    return expectFailure("patchprocessor", expected, operation);
  }
};

/// Log lines of the patch processor.
LogLine pp(const std::string &message);
LogLines pps(const std::vector<std::string> &messages);
LogLine ppInfo(const std::string &message);
LogLine ppError(const std::string &message);
