// A patch.ini: the sections that are read from it, and the descriptor that they make.
#include <map>
#include <memory>

#include "fuzz.h"
#include "inifile.h"
#include "patchdescriptor.h"

namespace {

using Entries = std::map<std::string, std::string>;
using Sections = std::map<std::string, Entries>;

/// What the text says; `stray` tells whether an entry stands before the first section.
Sections expectedSections(const std::string &content, bool &stray) {
  Sections sections;
  Entries *current = nullptr;
  stray = false;
  for (const std::string &raw : fuzz::lines(content)) {
    const std::string line = fuzz::trimmed(raw);
    if (line.empty() || line[0] == '#')
      continue;
    if (line[0] == '[') {
      current = &sections[line.size() < 2 ? "" : fuzz::trimmed(line.substr(1, line.size() - 2))];
      current->clear();
    } else if (current == nullptr) {
      stray = true;
    } else {
      const std::size_t equals = line.find('=');
      const std::string value = equals == std::string::npos ? "" : line.substr(equals + 1);
      (*current)[fuzz::trimmed(line.substr(0, equals))] = fuzz::trimmed(value);
    }
  }
  return sections;
}

Sections sectionsOf(const IniFile &ini) {
  Sections sections;
  REQUIRE(fuzz::isStrictlyAscending(ini.getSectionNames()));
  for (const std::string &name : ini.getSectionNames()) {
    const Section *const section = ini.getSection(name);
    REQUIRE(section != nullptr && section->getName() == name);
    REQUIRE(fuzz::isStrictlyAscending(section->getEntryNames()));
    sections[name];
    for (const std::string &key : section->getEntryNames())
      REQUIRE(section->getEntryValue(key, sections[name][key]));
    std::string untouched = "untouched";
    REQUIRE(!section->getEntryValue("\n", untouched) && untouched == "untouched");
  }
  REQUIRE(ini.getSection("\n") == nullptr);
  return sections;
}

std::string textOf(const Sections &sections) {
  std::string text;
  for (const auto &section : sections) {
    text += "[" + section.first + "]\n";
    for (const auto &entry : section.second)
      text += entry.first + "=" + entry.second + "\n";
  }
  return text;
}

void checkSections(const fuzz::TextFile &file, const Sections &expected, bool stray) {
  PatchError error;
  const std::unique_ptr<IniFile> ini(IniFile::parseFile(file.path(), &error));
  REQUIRE(ini != nullptr);
  REQUIRE(error.code == (stray ? PatchError::PropertyBeforeSection : PatchError::None));
  REQUIRE(sectionsOf(*ini) == expected);
  REQUIRE(sectionsOf(IniFile(*ini)) == expected);

  file.write(textOf(expected));
  const std::unique_ptr<IniFile> again(IniFile::parseFile(file.path(), nullptr));
  REQUIRE(again != nullptr && sectionsOf(*again) == expected);
}

bool has(const Entries &entries, const std::string &key) {
  return entries.count(key) == 1;
}

std::vector<std::string> namesOf(const Sections &sections, const std::string &name) {
  std::vector<std::string> names;
  if (sections.count(name) == 1)
    for (const auto &entry : sections.at(name))
      names.push_back(entry.first);
  return names;
}

void checkInfo(const PatchDescriptor &descriptor, const Entries &info) {
  REQUIRE(descriptor.getProductCode() == fuzz::productCode(info.at("productCode")));
  REQUIRE(descriptor.getPatchName() == info.at("patchName"));
  REQUIRE(descriptor.getPatchDescriptiveName() == info.at("patchDescriptiveName"));
  const Version &level = *descriptor.getVersion();
  REQUIRE(level.getVV() == info.at("productVer").substr(0, 2));
  REQUIRE(level.getRR() == info.at("productRel").substr(0, 2));
  REQUIRE(level.getMM() == info.at("productMod").substr(0, 2));
  REQUIRE(level.getFF() == info.at("productLvl").substr(0, 2));
  REQUIRE(descriptor.getProductEXE() == (has(info, "productEXE") ? info.at("productEXE") : ""));
  const std::string arch = has(info, "productBinArch") ? info.at("productBinArch") : "";
  REQUIRE(descriptor.getArch() == fuzz::pieces(arch, ", "));
}

void checkLists(const PatchDescriptor &descriptor, const Sections &sections) {
  REQUIRE(descriptor.getPrePatchCommands() == namesOf(sections, "PrePatchCommands"));
  REQUIRE(descriptor.getPreCommands() == namesOf(sections, "PreCommands"));
  REQUIRE(descriptor.getPostCommands() == namesOf(sections, "PostCommands"));
  std::vector<std::string> dependents;
  for (const std::string &name : namesOf(sections, "Dependents"))
    dependents.push_back(fuzz::productCode(name));
  REQUIRE(descriptor.getDependents() == dependents);

  Entries required;
  for (const std::string &name : namesOf(sections, "PreReqs"))
    required[fuzz::productCode(name)] = sections.at("PreReqs").at(name);
  REQUIRE(fuzz::isStrictlyAscending(descriptor.getPrereqs()));
  REQUIRE(descriptor.getPrereqs().size() == required.size());
  for (const auto &[code, level] : required) {
    Version version;
    REQUIRE(descriptor.getPrereqVersion(code, version));
    REQUIRE(version.getVersionString() == Version(level).getVersionString());
  }
  Version untouched("99999999");
  REQUIRE(!descriptor.getPrereqVersion("\n", untouched) && untouched.getVersionString() == "99999999");
}

/// The key that the record names: the last one that is missing, in the order in which they are looked up.
std::string missingKey(const Entries &info) {
  std::string missing;
  for (const char *key : {"productCode", "patchName", "patchDescriptiveName", "productVer", "productRel",
                          "productMod", "productLvl"})
    if (!has(info, key))
      missing = key;
  if (missing.empty())
    return "";
  for (const char *key : {"productBinArch", "productEXE"})
    if (!has(info, key))
      missing = key;
  return missing;
}

void checkDescriptor(const fuzz::TextFile &file, const Sections &sections, bool stray) {
  PatchError error;
  const std::unique_ptr<PatchDescriptor> descriptor(PatchDescriptor::parseFile(file.path(), &error));
  const auto info = sections.find("ProductInfo");
  if (info == sections.end()) {
    REQUIRE(descriptor == nullptr);
    REQUIRE(error.code == PatchError::MissingSection &&
            error.text == "Missing required section: ProductInfo");
    return;
  }
  const std::string missing = missingKey(info->second);
  if (!missing.empty()) {
    REQUIRE(descriptor == nullptr);
    REQUIRE(error.code == PatchError::MissingProperty);
    REQUIRE(error.text == "Missing required property: " + missing);
    return;
  }
  REQUIRE(descriptor != nullptr);
  // A missing optional key clears the record, that of an entry before the first section too.
  const bool cleared = !has(info->second, "productBinArch") || !has(info->second, "productEXE");
  REQUIRE(error.code == (stray && !cleared ? PatchError::PropertyBeforeSection : PatchError::None));
  for (const PatchDescriptor &one : {PatchDescriptor(*descriptor), *descriptor}) {
    checkInfo(one, info->second);
    checkLists(one, sections);
  }
}

} // namespace

void check(const std::string &input) {
  static const fuzz::TextFile file;
  bool stray = false;
  const Sections sections = expectedSections(input, stray);
  file.write(input);
  checkDescriptor(file, sections, stray);
  checkSections(file, sections, stray);
}
