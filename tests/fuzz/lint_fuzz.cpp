// lint as a whole. The first line of the input is the name of the patch; the rest is its archive, or, when
// the name begins with "=", its descriptor, which then gets an archive of its own.
#include "fuzz.h"

#include <algorithm>
#include <array>
#include <cstdio>
#include <cstdlib>
#include <map>

#include <nlohmann/json.hpp>
#include <unistd.h>

#include "inifile.h"
#include "judgement.h"
#include "lint/initext.h"
#include "lint/lint.h"
#include "memorylog.h"
#include "patchfilename.h"

namespace {

constexpr std::size_t BlockSize = 512;

void putOctal(std::string &header, std::size_t at, std::size_t width, std::size_t value) {
  std::array<char, 16> text = {};
  snprintf(text.data(), text.size(), "%0*zo", static_cast<int>(width - 1), value);
  header.replace(at, width - 1, text.data());
}

/// An archive with the one member patch.ini.
std::string archiveOf(const std::string &descriptor) {
  std::string header(BlockSize, '\0');
  header.replace(0, 9, "patch.ini");
  putOctal(header, 100, 8, 0644);
  putOctal(header, 108, 8, 0);
  putOctal(header, 116, 8, 0);
  putOctal(header, 124, 12, descriptor.size());
  putOctal(header, 136, 12, 0);
  header.replace(148, 8, 8, ' ');
  header[156] = '0';
  header.replace(257, 8,
                 std::string("ustar\0"
                             "00",
                             8));
  std::size_t sum = 0;
  for (const char c : header)
    sum += static_cast<unsigned char>(c);
  putOctal(header, 148, 7, sum);
  const std::size_t padding = (BlockSize - descriptor.size() % BlockSize) % BlockSize;
  return header + descriptor + std::string(padding + 2 * BlockSize, '\0');
}

/// A folder for the one file that is judged, which is a link to a file in memory.
class Stage {
public:
  Stage() {
    REQUIRE(mkdtemp(folder_.data()) != nullptr);
    REQUIRE(setenv("TMPDIR", folder_.c_str(), 1) == 0);
  }
  Stage(const Stage &) = delete;
  Stage &operator=(const Stage &) = delete;
  ~Stage() { rmdir(folder_.c_str()); }

  FindingList lintAs(const std::string &name, const std::string &content) const {
    file_.write(content);
    const std::string path = folder_ + "/" + name;
    REQUIRE(symlink(file_.path().c_str(), path.c_str()) == 0);
    FindingList findings;
    try {
      findings = lint(path);
    } catch (const JudgementError &) {
      findings.clear(); // an archive that claims to be larger than the disk
    }
    REQUIRE(unlink(path.c_str()) == 0);
    return findings;
  }

private:
  std::string folder_ = "/tmp/orvpatch-fuzz.XXXXXX";
  fuzz::TextFile file_;
};

bool isName(const std::string &name) {
  return !name.empty() && name.size() < 200 && name != "." && name != ".." &&
         name.find_first_of(std::string("/\0", 2)) == std::string::npos && name != "SHA256SUMS" &&
         name.compare(0, 12, "orvpatchctl.") != 0;
}

void checkFindings(const FindingList &findings) {
  std::map<std::string, std::size_t> counts;
  for (const Finding &finding : findings) {
    REQUIRE(!finding.text.empty() && !finding.remedy.empty());
    REQUIRE(++counts[finding.rule] <= 21);
    REQUIRE(std::any_of(lintRules().begin(), lintRules().end(),
                        [&finding](const LintRule &rule) { return finding.rule == rule.rule.name; }));
  }
  REQUIRE(!toJson(findings).dump().empty());
}

bool has(const FindingList &findings, const std::string &rule) {
  return std::any_of(findings.begin(), findings.end(),
                     [&rule](const Finding &finding) { return finding.rule == rule; });
}

/// What lint reads of a descriptor is what the installer's parser keeps.
void checkText(const std::string &descriptor) {
  static const fuzz::TextFile file;
  file.write(descriptor);
  const std::unique_ptr<IniFile> parsed(IniFile::parseFile(file.path(), nullptr));
  REQUIRE(parsed != nullptr);
  const IniText text = readIniText(descriptor);
  const std::vector<const IniSection *> sections = text.effectiveSections();
  REQUIRE(sections.size() == parsed->getSectionNames().size());
  for (const IniSection *section : sections) {
    const Section *const kept = parsed->getSection(section->name);
    REQUIRE(kept != nullptr);
    std::map<std::string, std::string> entries;
    for (const IniEntry &entry : section->entries)
      entries[entry.key] = entry.value;
    REQUIRE(kept->getEntryNames().size() == entries.size());
    for (const auto &[key, value] : entries) {
      std::string keptValue;
      REQUIRE(kept->getEntryValue(key, keptValue) && keptValue == value);
    }
  }
}

} // namespace

void check(const std::string &input) {
  static const Stage stage;
  const MemoryLog log;
  std::string content = input;
  std::string name = fuzz::takeLine(content);
  const bool isDescriptor = fuzz::startsWith(name, "=");
  if (isDescriptor) {
    name.erase(0, 1);
    checkText(content);
    content = archiveOf(content);
  }
  if (!isName(name))
    name = "kox_lpp266_vema_fp0001.tar";
  const FindingList findings = stage.lintAs(name, content);
  checkFindings(findings);
  if (isDescriptor) {
    REQUIRE(has(findings, "name-grammar") == !PatchFileName(name).isValid());
    REQUIRE(!has(findings, "no-descriptor") && !has(findings, "incomplete-archive"));
    REQUIRE(has(findings, "no-updated-files"));
  }
}
