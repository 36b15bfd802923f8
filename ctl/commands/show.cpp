// show: the patch as the installer will read it.
#include <cstdio>
#include <map>

#include <CLI/CLI.hpp>
#include <nlohmann/json.hpp>

#include "commands/command.h"
#include "commands/commands.h"
#include "look.h"
#include "patch.h"
#include "text.h"
#include "updatedfiles.h"

namespace {

using Json = nlohmann::ordered_json;

Json textList(const std::vector<std::string> &texts) {
  Json list = Json::array();
  for (const std::string &text : texts)
    list.push_back(jsonText(text));
  return list;
}

Json prerequisites(const PatchDescriptor &descriptor) {
  Json list = Json::array();
  for (const std::string &code : descriptor.getPrereqs()) {
    Version level;
    static_cast<void>(descriptor.getPrereqVersion(code, level));
    list.push_back({{"product", jsonText(code)}, {"level", jsonText(level.getDottedVersionString())}});
  }
  return list;
}

/// "all" counts only as the first of the sorted list, and then nothing else does.
Json dependents(const PatchDescriptor &descriptor) {
  const std::vector<std::string> codes = descriptor.getDependents();
  if (!codes.empty() && codes.front() == "all")
    return Json::array({"all"});
  return textList(codes);
}

/// Everything below updated_files but directories: all of it is moved into the home.
Json files(const Patch &patch) {
  Json list = Json::array();
  for (const auto &[path, index] : updatedFiles(patch.members)) {
    const Member &member = patch.members[index];
    if (member.type != Member::Type::Directory)
      list.push_back({{"path", jsonText(path)}, {"size", member.size}, {"mode", octalMode(member.mode)}});
  }
  return list;
}

Json describe(const Patch &patch) {
  const PatchDescriptor &descriptor = *patch.descriptor;
  return {{"file", jsonText(patch.file)},
          {"product", jsonText(descriptor.getProductCode())},
          {"platform", jsonText(patch.name.getFullPlatform())},
          {"target", jsonText(patch.name.getTarget())},
          {"fixpack", jsonText(patch.name.getFixPackName())},
          {"name", jsonText(descriptor.getPatchName())},
          {"description", jsonText(descriptor.getPatchDescriptiveName())},
          {"level", jsonText(descriptor.getVersion()->getDottedVersionString())},
          {"prerequisites", prerequisites(descriptor)},
          {"dependents", dependents(descriptor)},
          {"commands",
           {{"prePatch", textList(descriptor.getPrePatchCommands())},
            {"pre", textList(descriptor.getPreCommands())},
            {"post", textList(descriptor.getPostCommands())}}},
          {"files", files(patch)}};
}

void printLine(const char *label, const std::string &text) {
  printf("  %-14s  %s\n", label, text.empty() ? "none" : terminalText(text).c_str());
}

/// One line for each, the label on the first.
void printList(const char *label, const std::vector<std::string> &texts) {
  if (texts.empty())
    printLine(label, "");
  for (const std::string &text : texts) {
    printLine(label, text);
    label = "";
  }
}

std::vector<std::string> prerequisiteTexts(const PatchDescriptor &descriptor) {
  std::vector<std::string> texts;
  for (const std::string &code : descriptor.getPrereqs()) {
    Version level;
    static_cast<void>(descriptor.getPrereqVersion(code, level));
    texts.push_back(code + " from " + level.getDottedVersionString());
  }
  return texts;
}

const char *kindWords(const std::string &target) {
  static const std::map<std::string, const char *> words = {{"vema", "agent"},
                                                            {"vems", "monitoring server"},
                                                            {"veps", "portal server"},
                                                            {"vepd", "portal desktop client"},
                                                            {"vecm", "command-line component"}};
  const auto found = words.find(target);
  return found == words.end() ? "no kind" : found->second;
}

void printFiles(const Patch &patch) {
  std::size_t count = 0;
  std::int64_t size = 0;
  for (const auto &[path, index] : updatedFiles(patch.members)) {
    const Member &member = patch.members[index];
    if (member.type == Member::Type::Directory)
      continue;
    ++count;
    size += member.size;
  }
  printLine("Files", count == 0 ? "" : std::to_string(count) + ", " + std::to_string(size) + " bytes");
  for (const auto &[path, index] : updatedFiles(patch.members)) {
    const Member &member = patch.members[index];
    if (member.type != Member::Type::Directory)
      printf("    %s  %12lld  %s\n", octalMode(member.mode).c_str(), static_cast<long long>(member.size),
             terminalText(path).c_str());
  }
}

void print(const Patch &patch) {
  const PatchDescriptor &descriptor = *patch.descriptor;
  const std::vector<std::string> dependents = descriptor.getDependents();
  const bool isForAll = !dependents.empty() && dependents.front() == "all";
  printf("%s\n", terminalText(patch.file).c_str());
  printLine("Product", descriptor.getProductCode() + " on " + patch.name.getFullPlatform());
  printLine("Kind", patch.name.getTarget() + ", " + kindWords(patch.name.getTarget()));
  printLine("Name", descriptor.getPatchName());
  printLine("Description", descriptor.getPatchDescriptiveName());
  printLine("Level", descriptor.getVersion()->getDottedVersionString());
  printList("Prerequisites", prerequisiteTexts(descriptor));
  printList("Dependents", isForAll ? std::vector<std::string>{"all agents"} : dependents);
  printList("Before stops", descriptor.getPrePatchCommands());
  printList("Before files", descriptor.getPreCommands());
  printList("Before starts", descriptor.getPostCommands());
  printFiles(patch);
}

/// The patch, which has a descriptor that the installer accepts.
Patch readValidPatch(const std::string &file) {
  Patch patch = readPatch(file);
  if (patch.descriptor == nullptr)
    throw JudgementError(patch.file + ": " +
                         (patch.hasDescriptor ? patch.descriptorError.text : "no member patch.ini"));
  return patch;
}

void printAll(const std::vector<Patch> &patches) {
  for (const Patch &patch : patches) {
    if (&patch != &patches.front())
      printf("\n");
    print(patch);
  }
}

void show(const std::string &path, Invocation &invocation) {
  std::vector<Patch> patches;
  for (const std::string &file : patchFiles(path))
    patches.push_back(readValidPatch(file));
  if (!invocation.output.json) {
    printAll(patches);
    return;
  }
  Json list = Json::array();
  for (const Patch &patch : patches)
    list.push_back(describe(patch));
  printDocument(isDirectory(path) ? list : list.front());
}

} // namespace

void addShow(CLI::App &application, Invocation &invocation) {
  CLI::App *const command =
      addCommand(application, invocation, "show", "Print a patch as the installer will read it");
  const auto path = std::make_shared<std::string>();
  command->add_option("patch", *path, "A patch file, or a directory of them")
      ->required()
      ->option_text("PATCH");
  command->callback([path, &invocation] { show(*path, invocation); });
}
