// show: the patch as the installer will read it.
#include <cstdio>

#include <CLI/CLI.hpp>
#include <nlohmann/json.hpp>

#include "commands/command.h"
#include "commands/commands.h"
#include "file.h"
#include "patch.h"
#include "text.h"

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

Json files(const Patch &patch) {
  static const std::string root = "updated_files/";
  Json list = Json::array();
  for (const Member &member : patch.members) {
    const std::string path = relativePath(member.name);
    if (member.type == Member::Type::File && path.compare(0, root.size(), root) == 0)
      list.push_back({{"path", jsonText(path.substr(root.size()))},
                      {"size", member.size},
                      {"mode", octalMode(member.mode)}});
  }
  return list;
}

Json describe(const Patch &patch) {
  if (patch.descriptor == nullptr)
    throw JudgementError(patch.file + ": " +
                         (patch.hasDescriptor ? patch.descriptorError.text : "no member patch.ini"));
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

void show(const std::string &path, Invocation &invocation) {
  Json patches = Json::array();
  for (const std::string &file : patchFiles(path))
    patches.push_back(describe(readPatch(file)));
  const bool isOne = patches.size() == 1 && !File(path).isDirectory();
  if (invocation.output.json)
    printDocument(isOne ? patches.front() : patches);
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
