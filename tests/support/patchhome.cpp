#include "patchhome.h"

#include <cstdlib>
#include <filesystem>

#include "patchfilename.h"

namespace fs = std::filesystem;

std::string patchIni(const std::string &productCode, const std::string &level, const std::string &sections) {
  return "[ProductInfo]\nproductCode = " + productCode + "\npatchName = " + productCode +
         " fix pack\npatchDescriptiveName = Fix pack of " + productCode +
         "\nproductVer = " + level.substr(0, 2) + "\nproductRel = " + level.substr(2, 2) +
         "\nproductMod = " + level.substr(4, 2) + "\nproductLvl = " + level.substr(6, 2) + "\n" + sections;
}

std::string bareSection(const std::string &name, const std::vector<std::string> &lines) {
  std::string text = "[" + name + "]\n";
  for (const std::string &line : lines)
    text += line + "\n";
  return text;
}

Member command(const std::string &name, const std::string &word, const std::string &shell) {
  return {name, "#!/bin/sh\necho '" + word + "' >>\"$QUILLHOME/journal\"\n" + shell + "\n", 0755};
}

std::string PatchHome::makePatch(const std::string &fileName, const std::string &ini,
                                 const std::vector<Member> &members) const {
  const std::string staging = "staging/" + fileName + "/";
  write(staging + "patch.ini", ini);
  for (const Member &member : members) {
    if (member.path.back() == '/')
      makeDirectory(staging + member.path);
    else
      write(staging + member.path, member.content, member.mode);
  }
  makeDirectory("patches");
  const std::string pack = "cd '" + home() + staging + "' && tar -cf '" + patchPath(fileName) + "' *";
  EXPECT_EQ(std::system(pack.c_str()), 0) << pack;
  return patchPath(fileName);
}

PatchHome::Processor PatchHome::processorFor(const std::string &fileName) const {
  return Processor(PatchProcessor::createProcessor(patchPath(fileName), home(), nullptr));
}

PatchHome::Processor PatchHome::loaded(const std::string &fileName, const std::string &ini) {
  write("tmp/" + PatchFileName(fileName).getProduct() + "/patch.ini", ini);
  Processor processor = processorFor(fileName);
  EXPECT_TRUE(processor->parsePatchDescriptor(nullptr));
  logLines();
  return processor;
}

LogLine pp(const std::string &message) {
  return trace("patchprocessor", message);
}
LogLines pps(const std::vector<std::string> &messages) {
  return traces("patchprocessor", messages);
}
LogLine ppInfo(const std::string &message) {
  return info("patchprocessor", message);
}
LogLine ppError(const std::string &message) {
  return error("patchprocessor", message);
}
