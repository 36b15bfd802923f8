// The name of a patch file: which names are valid, and what they are split into.
#include "fuzz.h"
#include "patchfilename.h"

namespace {

/// Family of a platform; empty when it belongs to none.
std::string familyOf(const std::string &platform) {
  for (const char *prefix : {"li", "ls", "lx", "lpp", "aix", "hp", "sol"})
    if (fuzz::startsWith(platform, prefix))
      return prefix;
  return fuzz::startsWith(platform, "winnt") || fuzz::startsWith(platform, "unix") ? platform : "";
}

bool isTarget(const std::string &text) {
  return text.size() == 4 && fuzz::startsWith(text, "ve") &&
         fuzz::contains("ma ms ps pd cm", text.substr(2)) && !fuzz::contains(text, " ");
}

void checkFields(const PatchFileName &name, const std::vector<std::string> &parts) {
  const bool product = parts.size() == 4 && parts[0].size() == 3;
  const bool platform = product && !familyOf(parts[1]).empty();
  const bool target = platform && isTarget(parts[2]);
  const bool fixPack = target && fuzz::contains(parts[3], ".");
  REQUIRE(name.isValid() == fixPack);
  // What stands behind the first fault stays empty.
  REQUIRE(name.getProduct() == (product ? parts[0] : ""));
  REQUIRE(name.getFullPlatform() == (product ? parts[1] : ""));
  REQUIRE(name.getPlatform() == (platform ? familyOf(parts[1]) : product ? parts[1] : ""));
  REQUIRE(name.getTarget() == (platform ? parts[2] : ""));
  REQUIRE(name.getFixPackName() == (fixPack ? parts[3].substr(0, parts[3].find('.')) : ""));
}

void checkRules(const PatchFileName &name) {
  REQUIRE(fuzz::startsWith(name.getFullPlatform(), name.getPlatform()));
  for (const std::string &part : {name.getProduct(), name.getPlatform(), name.getFullPlatform(),
                                  name.getTarget(), name.getFixPackName()})
    REQUIRE(!fuzz::contains(part, "_"));
  if (!name.isValid())
    return;
  REQUIRE(!fuzz::contains(name.getFixPackName(), "."));
  const std::string rebuilt = name.getProduct() + "_" + name.getFullPlatform() + "_" + name.getTarget() +
                              "_" + name.getFixPackName() + ".";
  const PatchFileName again(rebuilt);
  REQUIRE(again.isValid());
  REQUIRE(again.getPlatform() == name.getPlatform() && again.getFixPackName() == name.getFixPackName());
}

} // namespace

void check(const std::string &input) {
  const PatchFileName name(input);
  const std::vector<std::string> parts = fuzz::pieces(input, "_");
  checkFields(name, parts);
  checkRules(name);
  const PatchFileName copy = name;
  checkFields(copy, parts);
}
