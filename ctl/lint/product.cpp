// The name of the file, the product that it is for, and the values of the descriptor.
#include <algorithm>
#include <cctype>

#include "dcfpackageprocessor.h"
#include "lint/rules.h"
#include "lint/subject.h"
#include "memorylog.h"
#include "productkind.h"
#include "utilities.h"

namespace {

constexpr std::size_t HistoryNameWidth = 20;

/// The installer looks for the product of the descriptor.
std::string productOf(const Patch &patch) {
  return patch.descriptor != nullptr ? patch.descriptor->getProductCode()
                                     : Util::toLower(patch.name.getProduct());
}

/// Whether a prerequisite can be found by a patch of this kind at all: it is looked for under the patch's own
/// kind, but the command-line component always under its own, and two products always as agents.
bool canBeFound(const std::string &prereq, const std::string &target) {
  if (prereq == "kzt" || prereq == "khv" || prereq == "kbn")
    return true;
  if (target == "vecm")
    return false;
  return fixedKindOf(prereq).value_or(target) == target;
}

bool isDigits(const std::string &text) {
  return std::all_of(text.begin(), text.end(), [](unsigned char c) { return std::isdigit(c) != 0; });
}

/// What the installer's log says when it reads this level, if it does not understand it; otherwise, whether
/// the level is one of letters.
std::string faultOfLevel(const std::string &text) {
  const MemoryLog log;
  const Version level(text);
  for (const char *const start : {"Missing VVRRMMFF", "Unrecognized VVRRMMFF"})
    if (!log.last(start).empty())
      return log.last(start);
  return isDigits(level.getVersionString())
             ? ""
             : "the level " + level.getDottedVersionString() + " has other characters than digits";
}

/// A value without what looks like a comment behind it, which a rule of its own tells.
std::string withoutComment(const std::string &value) {
  std::string text = value.substr(0, std::min(value.find(" #"), value.find(" ;")));
  Util::trimString(text);
  return text;
}

} // namespace

void nameGrammar(const Subject &subject, Finder &found) {
  if (subject.patch.name.isValid())
    return;
  const MemoryLog log;
  const PatchFileName name(subject.patch.file);
  found("", log.messages().empty() ? "invalid patch file name" : log.messages().back());
}

void nameProductDiffers(const Subject &subject, Finder &found) {
  const Patch &patch = subject.patch;
  if (!patch.name.isValid() || patch.descriptor == nullptr ||
      patch.name.getProduct() == patch.descriptor->getProductCode())
    return;
  found("patch.ini", "the archive is unpacked for \"" + patch.name.getProduct() +
                         "\", commands and files are looked for under \"" +
                         patch.descriptor->getProductCode() + "\"");
}

/// In a directory, patches for other systems are passed over as they should be.
void familyNotTaken(const Subject &subject, Finder &found) {
  const PatchFileName &name = subject.patch.name;
  if (!subject.isInDirectory && name.isValid() && name.getPlatform() != "unix" &&
      name.getPlatform() != DCFPackageProcessor::getPlatform())
    found("", "the platform \"" + name.getFullPlatform() + "\" is not installed here");
}

void supportPatch(const Subject &subject, Finder &found) {
  const std::string &target = subject.patch.name.getTarget();
  const std::string product = productOf(subject.patch);
  if (subject.patch.name.isValid() && target != "vecm" && kindOf(product) != target)
    found("", "\"" + product + "\" is never installed under the kind \"" + target + "\"");
}

void vecmProduct(const Subject &subject, Finder &found) {
  const std::string product = productOf(subject.patch);
  if (subject.patch.name.isValid() && subject.patch.name.getTarget() == "vecm" && product != "kzt")
    found("", R"(the command-line component is "kzt", not ")" + product + "\"");
}

void prereqKind(const Subject &subject, Finder &found) {
  const Patch &patch = subject.patch;
  if (!patch.name.isValid() || patch.descriptor == nullptr)
    return;
  for (const std::string &prereq : patch.descriptor->getPrereqs())
    if (prereq != patch.descriptor->getProductCode() && !canBeFound(prereq, patch.name.getTarget()))
      found("patch.ini", "\"" + prereq + "\" is looked for under the kind \"" + patch.name.getTarget() +
                             "\", where it cannot be");
}

void prereqLevel(const Subject &subject, Finder &found) {
  const IniSection *const prereqs = subject.ini.section("PreReqs");
  if (prereqs == nullptr)
    return;
  for (const IniEntry &entry : prereqs->entries) {
    const std::string fault = faultOfLevel(withoutComment(entry.value));
    if (!fault.empty())
      found(atLine(entry.line), fault);
  }
}

void levelDigits(const Subject &subject, Finder &found) {
  const IniSection *const info = subject.ini.section("ProductInfo");
  if (info == nullptr)
    return;
  for (const IniEntry &entry : info->entries) {
    const bool isLevel = entry.key == "productVer" || entry.key == "productRel" ||
                         entry.key == "productMod" || entry.key == "productLvl";
    const std::string value = withoutComment(entry.value);
    if (isLevel && (value.size() != 2 || !isDigits(value)))
      found(atLine(entry.line), entry.key + " is \"" + entry.value + "\", not two digits");
  }
}

void allIsHidden(const Subject &subject, Finder &found) {
  if (subject.patch.descriptor == nullptr)
    return;
  const std::vector<std::string> codes = subject.patch.descriptor->getDependents();
  if (std::find(codes.begin(), codes.end(), "all") != codes.end() && codes.front() != "all")
    found("patch.ini", "\"" + codes.front() + R"(" sorts before "all", which then is the code of a product)");
}

void productExeUnused(const Subject &subject, Finder &found) {
  if (subject.patch.descriptor != nullptr && !subject.patch.descriptor->getProductEXE().empty())
    found("patch.ini", "productEXE is \"" + subject.patch.descriptor->getProductEXE() + "\"");
}

void historyColumns(const Subject &subject, Finder &found) {
  if (subject.patch.descriptor == nullptr)
    return;
  const std::string name = subject.patch.descriptor->getPatchName();
  if (name.size() > HistoryNameWidth)
    found("patch.ini", "patchName has " + std::to_string(name.size()) + " characters, the column " +
                           std::to_string(HistoryNameWidth));
  else if (name.find('|') != std::string::npos)
    found("patch.ini", "patchName has a \"|\", which separates the columns");
}
